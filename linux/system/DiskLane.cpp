#include "linux/system/DiskLane.h"

#include <algorithm>
#include <condition_variable>
#include <deque>
#include <mutex>

#include "linux/system/Threads.h"

namespace lumacast {

namespace {

constexpr std::chrono::seconds kFarewell{2};

}  // namespace

struct DiskLane::Job {
    std::function<void()> work;
    bool done = false;
};

struct DiskLane::State {
    explicit State(std::size_t maximum) : maximumThreads(maximum) {}

    const std::size_t maximumThreads;
    std::mutex mutex;
    std::condition_variable workCame;
    std::condition_variable somethingEnded;
    std::deque<std::shared_ptr<Job>> waiting;
    std::size_t threads = 0;
    std::size_t idle = 0;
    bool stopping = false;
};

DiskLane::DiskLane(std::size_t maximumThreads) : state_(std::make_shared<State>(maximumThreads)) {}

DiskLane::~DiskLane() {
    std::unique_lock lock(state_->mutex);
    state_->stopping = true;
    state_->waiting.clear();
    state_->workCame.notify_all();
    state_->somethingEnded.wait_for(lock, kFarewell, [&] { return state_->threads == 0; });
}

std::size_t DiskLane::threadCount() const {
    const std::lock_guard lock(state_->mutex);
    return state_->threads;
}

bool DiskLane::perform(std::chrono::nanoseconds patience, std::function<void()> work) {
    const auto deadline = std::chrono::steady_clock::now() + patience;
    const auto job = std::make_shared<Job>();
    job->work = std::move(work);

    std::unique_lock lock(state_->mutex);
    state_->waiting.push_back(job);
    if (state_->idle < state_->waiting.size() && state_->threads < state_->maximumThreads) {
        // Without a new thread the question waits for one of those there are, as long as its patience lasts.
        if (startDetachedThread([state = state_] { DiskLane::work(state); })) ++state_->threads;
    }
    state_->workCame.notify_one();
    if (state_->somethingEnded.wait_until(lock, deadline, [&] { return job->done; })) return true;
    std::erase(state_->waiting, job);  // a question that was not begun is never asked
    return false;
}

void DiskLane::work(const std::shared_ptr<State>& state) {
    std::unique_lock lock(state->mutex);
    while (true) {
        ++state->idle;
        state->workCame.wait(lock, [&] { return state->stopping || !state->waiting.empty(); });
        --state->idle;
        if (state->stopping) break;
        const std::shared_ptr<Job> job = std::move(state->waiting.front());
        state->waiting.pop_front();
        lock.unlock();
        job->work();
        job->work = nullptr;  // what it owns ends here, on this thread
        lock.lock();
        job->done = true;
        state->somethingEnded.notify_all();
    }
    --state->threads;
    state->somethingEnded.notify_all();
}

}  // namespace lumacast
