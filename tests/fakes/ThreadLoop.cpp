#include "tests/fakes/ThreadLoop.h"

#include <utility>

namespace lumacast {

void ThreadLoop::async(Task task) {
    const std::lock_guard lock(mutex_);
    tasks_.push_back(std::move(task));
    wake_.notify_one();
}

void ThreadLoop::sync(const Task& task) {
    if (isCurrent()) {
        task();
        return;
    }
    std::mutex mutex;
    std::condition_variable done;
    bool isDone = false;
    async([&] {
        task();
        const std::lock_guard lock(mutex);
        isDone = true;
        done.notify_one();
    });
    std::unique_lock lock(mutex);
    done.wait(lock, [&] { return isDone; });
}

void ThreadLoop::run() {
    runner_ = std::this_thread::get_id();
    std::unique_lock lock(mutex_);
    while (!stopping_) {
        if (tasks_.empty()) {
            wake_.wait(lock);
            continue;
        }
        Task task = std::move(tasks_.front());
        tasks_.pop_front();
        lock.unlock();
        task();
        task = nullptr;
        lock.lock();
    }
    stopping_ = false;
    runner_ = std::thread::id();
}

void ThreadLoop::requestStop() {
    const std::lock_guard lock(mutex_);
    stopping_ = true;
    wake_.notify_all();
}

}  // namespace lumacast
