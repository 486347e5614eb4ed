#include "linux/media/EncodingQueue.h"

#include <pthread.h>

#include <algorithm>
#include <utility>

#include "linux/system/LowPriority.h"

namespace lumacast::media {

EncodingQueue::EncodingQueue(std::shared_ptr<MovieFiles> files, EncodingPriority priority)
    : files_(std::move(files)), priority_(priority), thread_([this] { run(); }) {}

EncodingQueue::~EncodingQueue() {
    {
        const std::lock_guard lock(mutex_);
        stopping_ = true;
        for (const auto& job : waiting_) job->cancel();
        if (running_) running_->cancel();
        changed_.notify_all();
    }
    thread_.join();
}

void EncodingQueue::add(std::shared_ptr<LinuxMovieExport> job) {
    const std::lock_guard lock(mutex_);
    waiting_.push_back(std::move(job));
    changed_.notify_all();
}

std::shared_ptr<LinuxMovieExport> EncodingQueue::forgetAll() {
    std::deque<std::shared_ptr<LinuxMovieExport>> forgotten;  // ends without the lock
    const std::lock_guard lock(mutex_);
    forgotten.swap(waiting_);
    return running_;
}

bool EncodingQueue::remove(const std::shared_ptr<LinuxMovieExport>& job) {
    const std::lock_guard lock(mutex_);
    return std::erase(waiting_, job) > 0;
}

void EncodingQueue::run() {
    pthread_setname_np(pthread_self(), "lc-mixing");
    bool isLow = false;
    std::unique_lock lock(mutex_);
    for (;;) {
        changed_.wait(lock, [this] { return stopping_ || !waiting_.empty(); });
        if (waiting_.empty()) return;
        // Not before there is something to do: on a busy machine the end of the process would wait for it.
        if (priority_ == EncodingPriority::Low && !std::exchange(isLow, true)) runAtLowPriority();
        running_ = std::move(waiting_.front());
        waiting_.pop_front();
        auto job = running_;
        lock.unlock();
        job->run(*files_);
        job.reset();
        lock.lock();
        auto last = std::exchange(running_, nullptr);
        lock.unlock();
        last.reset();  // without the lock: it may hold the last reference to anything
        lock.lock();
    }
}

}  // namespace lumacast::media
