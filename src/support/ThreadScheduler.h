#pragma once
// The scheduler made of real threads.

#include <memory>

#include "platform/Scheduler.h"
#include "support/ThreadSchedulerPool.h"
#include "support/ThreadSchedulerTimers.h"

namespace lumacast {

/// Serial and global queues share one growing pool of worker threads, timers one thread; the main queue is the port's.
///
/// Lifetime: outlives whoever uses it. Its end runs what was submitted to its queues (not to the main queue) and joins
/// its threads, so it must not come on one of its own lanes, nor while a task waits for something that never comes.
/// Queues, semaphores and locks may be released later; work given to such a queue is dropped.
class ThreadScheduler final : public Scheduler {
public:
    /// `mainLoop` is the process's main queue; never null.
    explicit ThreadScheduler(std::shared_ptr<MainLoop> mainLoop, ThreadPoolLimits limits = {});
    ~ThreadScheduler() override;

    std::shared_ptr<SerialQueue> serialQueue(std::string label) override;
    GlobalQueue& globalQueue(QueuePriority priority) override;
    SerialQueue& mainQueue() override { return *mainLoop_; }
    void runMainLoop() override { mainLoop_->run(); }
    std::unique_ptr<Semaphore> semaphore(int initialCount) override;
    std::unique_ptr<OwnerlessLock> ownerlessLock() override;
    std::unique_ptr<Timer> timer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds interval,
                                 Task task) override;

    /// For tests and status reports: the worker threads there are now.
    std::size_t workerCount() const { return pool_->workerCount(); }

private:
    class Queue final : public GlobalQueue {
    public:
        Queue(ThreadPool& pool, QueuePriority priority) : pool_(pool), priority_(priority) {}
        void async(Task task) override;

    private:
        ThreadPool& pool_;
        const QueuePriority priority_;
    };

    const std::shared_ptr<MainLoop> mainLoop_;
    const std::shared_ptr<ThreadPool> pool_;
    Queue defaultQueue_;
    Queue backgroundQueue_;
    std::unique_ptr<ThreadTimers> timers_;
};

}  // namespace lumacast
