#include "linux/media/CompletionLane.h"

#include <pthread.h>

#include <utility>

namespace lumacast::media {

CompletionLane::CompletionLane() : thread_([this] { run(); }) {}

CompletionLane::~CompletionLane() {
    {
        const std::lock_guard lock(mutex_);
        stopping_ = true;
        changed_.notify_all();
    }
    thread_.join();
}

void CompletionLane::post(std::function<void()> completion) {
    const std::lock_guard lock(mutex_);
    waiting_.push_back(std::move(completion));
    changed_.notify_all();
}

void CompletionLane::run() {
    pthread_setname_np(pthread_self(), "lc-told");
    std::unique_lock lock(mutex_);
    for (;;) {
        changed_.wait(lock, [this] { return stopping_ || !waiting_.empty(); });
        if (waiting_.empty()) return;
        auto completion = std::move(waiting_.front());
        waiting_.pop_front();
        lock.unlock();
        if (completion) completion();
        completion = nullptr;  // without the lock: it may hold the last reference to a writer
        lock.lock();
    }
}

}  // namespace lumacast::media
