#include "tests/fakes/SimScheduler.h"

#include <algorithm>
#include <climits>
#include <stdexcept>
#include <utility>

namespace lumacast {

namespace {

/// More steps than any test makes without time passing.
constexpr std::uint64_t kEndlessSteps = 10'000'000;

class SimSemaphore final : public Semaphore {
public:
    SimSemaphore(std::shared_ptr<SimCore> core, std::string name, int count, int maximum)
        : core_(std::move(core)), name_(std::move(name)), maximum_(maximum),
          state_(std::make_shared<State>(State{count, {}})) {}

    void signal() override {
        core_->current();
        const std::shared_ptr<SimCore> core = core_;
        if (state_->waiters.empty()) {
            state_->count = std::min(state_->count, maximum_ - 1) + 1;
        } else {
            const auto index = static_cast<std::ptrdiff_t>(core->random().below(state_->waiters.size()));
            SimContext* waiter = state_->waiters[static_cast<std::size_t>(index)];
            state_->waiters.erase(state_->waiters.begin() + index);
            core->makeReady(*waiter);
        }
        core->schedulingPoint();  // whoever was let through may destroy this semaphore
    }

    void wait() override { waitAtMost(std::nullopt); }
    bool waitFor(std::chrono::nanoseconds limit) override { return waitAtMost(limit); }

private:
    /// Outlives the semaphore while somebody waits.
    struct State {
        int count;
        std::vector<SimContext*> waiters;
    };

    bool waitAtMost(std::optional<std::chrono::nanoseconds> limit) {
        const std::shared_ptr<SimCore> core = core_;
        const std::shared_ptr<State> state = state_;
        core->schedulingPoint();
        if (state->count > 0) {
            --state->count;
            return true;
        }
        if (limit && limit->count() <= 0) return false;
        SimContext* self = &core->current();
        if (!core->hasEnded()) state->waiters.push_back(self);
        return core->wait(limit ? name_ + ", with a time limit" : name_, limit,
                          [state, self] { std::erase(state->waiters, self); });
    }

    const std::shared_ptr<SimCore> core_;
    const std::string name_;
    const int maximum_;
    const std::shared_ptr<State> state_;
};

class SimOwnerlessLock final : public OwnerlessLock {
public:
    explicit SimOwnerlessLock(std::shared_ptr<SimCore> core) : semaphore_(std::move(core), "lock", 1, 1) {}
    void lock() override { semaphore_.wait(); }
    void unlock() override { semaphore_.signal(); }

private:
    SimSemaphore semaphore_;
};

class SimTimer final : public Timer {
public:
    explicit SimTimer(std::shared_ptr<SimTimerState> state) : state_(std::move(state)) {}
    ~SimTimer() override {
        state_->stopped = true;
        const Task dropped = std::exchange(state_->task, nullptr);
    }

private:
    const std::shared_ptr<SimTimerState> state_;
};

}  // namespace

class SimScheduler::Queue final : public SerialQueue {
public:
    Queue(std::shared_ptr<SimCore> core, std::string label)
        : core_(std::move(core)), state_(core_->makeQueue(std::move(label))) {}

    const std::string& label() const override { return state_->label; }
    void async(Task task) override { core_->submit(state_, std::move(task)); }
    void sync(const Task& task) override {
        // The queue may be released from its own work.
        const std::shared_ptr<SimCore> core = core_;
        const std::shared_ptr<SimQueueState> state = state_;
        core->sync(state, task);
    }
    bool isCurrent() const override { return state_->holder == &core_->current(); }

private:
    const std::shared_ptr<SimCore> core_;
    const std::shared_ptr<SimQueueState> state_;
};

class SimScheduler::Global final : public GlobalQueue {
public:
    Global(SimCore& core, QueuePriority priority) : core_(core), priority_(priority) {}
    void async(Task task) override { core_.submitGlobal(priority_, std::move(task)); }

private:
    SimCore& core_;
    const QueuePriority priority_;
};

SimScheduler::SimScheduler(std::uint64_t seed)
    : core_(std::make_shared<SimCore>(seed)),
      mainQueue_(std::make_shared<Queue>(core_, "main")),
      defaultQueue_(std::make_unique<Global>(*core_, QueuePriority::Default)),
      backgroundQueue_(std::make_unique<Global>(*core_, QueuePriority::Background)) {}

SimScheduler::~SimScheduler() { endWorld(); }

std::shared_ptr<SerialQueue> SimScheduler::serialQueue(std::string label) {
    return std::make_shared<Queue>(core_, std::move(label));
}

GlobalQueue& SimScheduler::globalQueue(QueuePriority priority) {
    return priority == QueuePriority::Background ? *backgroundQueue_ : *defaultQueue_;
}

SerialQueue& SimScheduler::mainQueue() { return *mainQueue_; }

std::unique_ptr<Semaphore> SimScheduler::semaphore(int initialCount) {
    return std::make_unique<SimSemaphore>(core_, "semaphore", initialCount, INT_MAX);
}

std::unique_ptr<OwnerlessLock> SimScheduler::ownerlessLock() { return std::make_unique<SimOwnerlessLock>(core_); }

std::unique_ptr<Timer> SimScheduler::timer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds interval,
                                           Task task) {
    auto state = std::make_shared<SimTimerState>();
    state->queue = std::move(queue);
    state->interval = std::max<std::int64_t>(interval.count(), 1);
    state->task = std::move(task);
    core_->startTimer(state);
    return std::make_unique<SimTimer>(std::move(state));
}

bool SimScheduler::step() { return core_->run(1, nullptr) == 1; }

std::uint64_t SimScheduler::runUntilIdle() {
    const std::uint64_t steps = core_->run(kEndlessSteps, nullptr);
    if (steps >= kEndlessSteps) throw std::runtime_error("the simulation makes steps without end");
    return steps;
}

void SimScheduler::advance(std::chrono::nanoseconds duration) {
    const std::int64_t end = core_->now() + duration.count();
    runUntilIdle();
    for (auto next = core_->nextDeadline(); next && *next <= end; next = core_->nextDeadline()) {
        core_->moveTimeTo(*next);
        runUntilIdle();
    }
    core_->moveTimeTo(end);
    runUntilIdle();
}

bool SimScheduler::runUntil(const std::function<bool()>& condition, std::chrono::nanoseconds limit) {
    const std::int64_t end = core_->now() + std::min(limit.count(), INT64_MAX - core_->now());
    for (;;) {
        if (core_->run(kEndlessSteps, &condition) >= kEndlessSteps)
            throw std::runtime_error("the simulation makes steps without end");
        if (condition()) return true;
        const auto next = core_->nextDeadline();
        if (!next || *next > end) {
            if (limit != std::chrono::nanoseconds::max()) core_->moveTimeTo(end);
            return condition();
        }
        core_->moveTimeTo(*next);
    }
}

void SimScheduler::runMainLoop() {
    runUntil([this] { return stopRequested_; }, std::chrono::nanoseconds::max());
    stopRequested_ = false;
}

}  // namespace lumacast
