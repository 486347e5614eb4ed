#include "support/ThreadScheduler.h"

#include <algorithm>
#include <condition_variable>
#include <mutex>
#include <utility>

#include "support/ThreadSchedulerQueue.h"

namespace lumacast {

namespace {

class TaskJob final : public ThreadPool::Job {
public:
    explicit TaskJob(Task task) : task_(std::move(task)) {}
    void run() override { task_(); }

private:
    const Task task_;
};

/// Longer than any process lives, and far from the end of the clock's range.
constexpr std::chrono::nanoseconds kLongestWait = std::chrono::hours(24 * 365 * 10);

class ThreadSemaphore final : public Semaphore {
public:
    ThreadSemaphore(int initialCount, std::shared_ptr<ThreadPool> pool)
        : pool_(std::move(pool)), count_(initialCount) {}

    void signal() override {
        // Told under the lock, so that a waiter may destroy the semaphore as soon as it was let through.
        const std::lock_guard lock(mutex_);
        ++count_;
        wake_.notify_one();
    }

    void wait() override {
        std::unique_lock lock(mutex_);
        if (count_ <= 0) {
            const ThreadPool::Waiting waiting(*pool_);
            wake_.wait(lock, [&] { return count_ > 0; });
        }
        --count_;
    }

    bool waitFor(std::chrono::nanoseconds limit) override {
        std::unique_lock lock(mutex_);
        if (count_ <= 0) {
            const ThreadPool::Waiting waiting(*pool_);
            if (!wake_.wait_for(lock, std::min(limit, kLongestWait), [&] { return count_ > 0; })) return false;
        }
        --count_;
        return true;
    }

private:
    const std::shared_ptr<ThreadPool> pool_;
    std::mutex mutex_;
    std::condition_variable wake_;
    int count_;
};

class ThreadOwnerlessLock final : public OwnerlessLock {
public:
    explicit ThreadOwnerlessLock(std::shared_ptr<ThreadPool> pool) : pool_(std::move(pool)) {}

    void lock() override {
        std::unique_lock lock(mutex_);
        if (held_) {
            const ThreadPool::Waiting waiting(*pool_);
            wake_.wait(lock, [&] { return !held_; });
        }
        held_ = true;
    }

    void unlock() override {
        const std::lock_guard lock(mutex_);
        held_ = false;
        wake_.notify_one();
    }

private:
    const std::shared_ptr<ThreadPool> pool_;
    std::mutex mutex_;
    std::condition_variable wake_;
    bool held_ = false;
};

}  // namespace

ThreadScheduler::ThreadScheduler(std::shared_ptr<MainLoop> mainLoop, ThreadPoolLimits limits)
    : mainLoop_(std::move(mainLoop)),
      pool_(std::make_shared<ThreadPool>(limits)),
      defaultQueue_(*pool_, QueuePriority::Default),
      backgroundQueue_(*pool_, QueuePriority::Background),
      timers_(std::make_unique<ThreadTimers>()) {}

ThreadScheduler::~ThreadScheduler() {
    timers_.reset();
    pool_->finish();
}

void ThreadScheduler::Queue::async(Task task) { pool_.submit(priority_, std::make_shared<TaskJob>(std::move(task))); }

std::shared_ptr<SerialQueue> ThreadScheduler::serialQueue(std::string label) {
    return std::make_shared<ThreadSerialQueue>(std::move(label), pool_);
}

GlobalQueue& ThreadScheduler::globalQueue(QueuePriority priority) {
    return priority == QueuePriority::Background ? backgroundQueue_ : defaultQueue_;
}

std::unique_ptr<Semaphore> ThreadScheduler::semaphore(int initialCount) {
    return std::make_unique<ThreadSemaphore>(initialCount, pool_);
}

std::unique_ptr<OwnerlessLock> ThreadScheduler::ownerlessLock() {
    return std::make_unique<ThreadOwnerlessLock>(pool_);
}

std::unique_ptr<Timer> ThreadScheduler::timer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds interval,
                                              Task task) {
    return timers_->start(std::move(queue), interval, std::move(task));
}

}  // namespace lumacast
