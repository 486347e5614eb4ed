#include "support/ThreadSchedulerPool.h"

#include <system_error>
#include <utility>

namespace lumacast {

ThreadPool::ThreadPool(ThreadPoolLimits limits) : limits_(limits) {}

ThreadPool::~ThreadPool() { finish(); }

void ThreadPool::finish() {
    std::list<std::thread> threads;
    for (;;) {
        {
            const std::lock_guard lock(mutex_);
            stopping_ = true;
            threads.splice(threads.end(), ended_);
            threads.splice(threads.end(), workers_);
            if (threads.empty()) finished_ = true;  // nobody is left who could submit
        }
        if (threads.empty()) return;
        wake_.notify_all();
        for (std::thread& thread : threads) thread.join();
        threads.clear();
    }
}

void ThreadPool::submit(QueuePriority priority, std::shared_ptr<Job> job) {
    std::list<std::thread> ended;
    {
        const std::lock_guard lock(mutex_);
        if (finished_) return;
        (priority == QueuePriority::Background ? backgroundJobs_ : jobs_).push_back(std::move(job));
        ended.splice(ended.end(), ended_);
        growIfNeeded();
    }
    wake_.notify_one();
    for (std::thread& thread : ended) thread.join();
}

std::size_t ThreadPool::workerCount() const {
    const std::lock_guard lock(mutex_);
    return workerIds_.size();
}

bool ThreadPool::beginWaiting() {
    const std::lock_guard lock(mutex_);
    if (!workerIds_.contains(std::this_thread::get_id())) return false;
    ++waiting_;
    growIfNeeded();
    return true;
}

void ThreadPool::endWaiting() {
    const std::lock_guard lock(mutex_);
    --waiting_;
}

std::shared_ptr<ThreadPool::Job> ThreadPool::takeJob() {
    auto& from = jobs_.empty() ? backgroundJobs_ : jobs_;
    auto job = std::move(from.front());
    from.pop_front();
    return job;
}

void ThreadPool::growIfNeeded() {
    // An idle worker that was woken for one job counts as idle until it runs: so compare with the number of jobs.
    if (jobs_.size() + backgroundJobs_.size() <= idle_) return;
    if (workerIds_.size() - waiting_ >= limits_.runnable || workerIds_.size() >= limits_.total) return;
    const auto place = workers_.emplace(workers_.end());
    try {
        *place = std::thread([this, place] { work(place); });
        workerIds_.insert(place->get_id());
    } catch (const std::system_error&) {
        workers_.erase(place);  // no thread to be had: the job waits for one of the others
    }
}

void ThreadPool::work(std::list<std::thread>::iterator self) {
    std::unique_lock lock(mutex_);
    for (;;) {
        if (!hasJob()) {
            if (stopping_) break;
            ++idle_;
            const bool woken = wake_.wait_for(lock, limits_.idleTime, [&] { return hasJob() || stopping_; });
            --idle_;
            if (!woken) break;
            continue;
        }
        auto job = takeJob();
        lock.unlock();
        job->run();
        job.reset();
        lock.lock();
    }
    workerIds_.erase(std::this_thread::get_id());
    if (!stopping_) ended_.splice(ended_.end(), workers_, self);
}

}  // namespace lumacast
