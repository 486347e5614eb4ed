#pragma once
// The worker threads behind the thread scheduler.

#include <condition_variable>
#include <deque>
#include <list>
#include <memory>
#include <mutex>
#include <thread>
#include <unordered_set>

#include "platform/Scheduler.h"

namespace lumacast {

/// How many threads the pool may have, and how long an idle one stays.
struct ThreadPoolLimits {
    std::size_t runnable = 32;  ///< workers that are not known to wait for something
    std::size_t total = 1024;   ///< all workers, waiting ones included
    std::chrono::milliseconds idleTime{5000};
};

/// Runs jobs on threads that are made when a job finds no idle one and end after a while without work. A worker that
/// waits through the scheduler says so and does not count against the bound of runnable ones: its place is taken by
/// another worker as long as jobs wait. Thread-safe.
class ThreadPool final {
public:
    explicit ThreadPool(ThreadPoolLimits limits);
    ~ThreadPool();

    /// Runs what was submitted, then joins the workers; what is submitted later is dropped. Never on a worker. Answers
    /// when every job has ended: a job that waits for ever keeps it.
    void finish();

    /// What a worker runs, once for each time that it is submitted.
    class Job {
    public:
        virtual ~Job() = default;
        virtual void run() = 0;
    };
    void submit(QueuePriority priority, std::shared_ptr<Job> job);

    /// Around every wait of a lane. A caller that is no worker of this pool is left alone.
    class Waiting {
    public:
        explicit Waiting(ThreadPool& pool) : pool_(pool), isWorker_(pool.beginWaiting()) {}
        ~Waiting() {
            if (isWorker_) pool_.endWaiting();
        }
        Waiting(const Waiting&) = delete;
        Waiting& operator=(const Waiting&) = delete;

    private:
        ThreadPool& pool_;
        const bool isWorker_;
    };

    /// For tests and status reports: the workers there are now.
    std::size_t workerCount() const;

private:
    bool beginWaiting();
    void endWaiting();
    bool hasJob() const { return !jobs_.empty() || !backgroundJobs_.empty(); }
    std::shared_ptr<Job> takeJob();
    void growIfNeeded();
    void work(std::list<std::thread>::iterator self);

    const ThreadPoolLimits limits_;
    mutable std::mutex mutex_;
    std::condition_variable wake_;
    std::deque<std::shared_ptr<Job>> jobs_;
    std::deque<std::shared_ptr<Job>> backgroundJobs_;
    std::list<std::thread> workers_;
    std::list<std::thread> ended_;  ///< to be joined by whoever comes next
    std::unordered_set<std::thread::id> workerIds_;
    std::size_t idle_ = 0;
    std::size_t waiting_ = 0;
    bool stopping_ = false;
    bool finished_ = false;
};

}  // namespace lumacast
