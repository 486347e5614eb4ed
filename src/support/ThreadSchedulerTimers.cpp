#include "support/ThreadSchedulerTimers.h"

#include <algorithm>
#include <atomic>
#include <utility>
#include <vector>

namespace lumacast {

using TimePoint = std::chrono::steady_clock::time_point;

/// One timer. Shared by its handle, the table and the ticks on their way.
struct ThreadTimers::Entry {
    std::shared_ptr<SerialQueue> queue;
    std::chrono::nanoseconds interval;
    Task task;
    std::atomic<bool> stopped = false;
    std::atomic<bool> tickWaits = false;
};

struct ThreadTimers::State {
    std::mutex mutex;
    std::condition_variable wake;
    std::multimap<TimePoint, std::shared_ptr<Entry>> due;
    bool stopping = false;

    void run();
    void remove(const std::shared_ptr<Entry>& entry);
    std::vector<std::shared_ptr<Entry>> takeDue(TimePoint now);
};

class ThreadTimers::Handle final : public Timer {
public:
    Handle(std::shared_ptr<State> state, std::shared_ptr<Entry> entry)
        : state_(std::move(state)), entry_(std::move(entry)) {}
    ~Handle() override {
        entry_->stopped = true;
        state_->remove(entry_);
    }

private:
    const std::shared_ptr<State> state_;
    const std::shared_ptr<Entry> entry_;
};

namespace {

/// The next tick after `now` in the phase that `last` stands in.
TimePoint nextTick(TimePoint last, std::chrono::nanoseconds interval, TimePoint now) {
    const TimePoint next = last + interval;
    return next > now ? next : next + (now - next) / interval * interval + interval;
}

}  // namespace

void ThreadTimers::State::remove(const std::shared_ptr<Entry>& entry) {
    const std::lock_guard lock(mutex);
    const auto found = std::find_if(due.begin(), due.end(), [&](const auto& item) { return item.second == entry; });
    if (found != due.end()) due.erase(found);
}

std::vector<std::shared_ptr<ThreadTimers::Entry>> ThreadTimers::State::takeDue(TimePoint now) {
    std::vector<std::shared_ptr<Entry>> taken;
    while (!due.empty() && due.begin()->first <= now) {
        auto node = due.extract(due.begin());
        taken.push_back(node.mapped());
        node.key() = nextTick(node.key(), node.mapped()->interval, now);
        due.insert(std::move(node));
    }
    return taken;
}

void ThreadTimers::State::run() {
    std::unique_lock lock(mutex);
    while (!stopping) {
        if (due.empty()) {
            wake.wait(lock);
            continue;
        }
        const TimePoint next = due.begin()->first;
        if (std::chrono::steady_clock::now() < next) {
            wake.wait_until(lock, next);
            continue;
        }
        std::vector<std::shared_ptr<Entry>> ticks = takeDue(std::chrono::steady_clock::now());
        lock.unlock();
        for (const std::shared_ptr<Entry>& entry : ticks) {
            if (entry->stopped || entry->tickWaits.exchange(true)) continue;
            entry->queue->async([entry] {
                entry->tickWaits = false;
                if (!entry->stopped) entry->task();
            });
        }
        ticks.clear();  // may be the last hold of a timer that was stopped meanwhile: not under the lock
        lock.lock();
    }
}

ThreadTimers::ThreadTimers() : state_(std::make_shared<State>()) {}

ThreadTimers::~ThreadTimers() {
    decltype(State::due) dropped;
    {
        const std::lock_guard lock(state_->mutex);
        state_->stopping = true;
        dropped.swap(state_->due);
    }
    state_->wake.notify_all();
    if (thread_.joinable()) thread_.join();
}

std::unique_ptr<Timer> ThreadTimers::start(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds interval,
                                           Task task) {
    std::call_once(threadMade_, [this] { thread_ = std::thread([state = state_] { state->run(); }); });
    auto entry = std::make_shared<Entry>();
    entry->queue = std::move(queue);
    entry->interval = std::max(interval, std::chrono::nanoseconds(1));
    entry->task = std::move(task);
    {
        const std::lock_guard lock(state_->mutex);
        if (!state_->stopping) state_->due.emplace(std::chrono::steady_clock::now() + entry->interval, entry);
    }
    state_->wake.notify_one();
    return std::make_unique<Handle>(state_, std::move(entry));
}

}  // namespace lumacast
