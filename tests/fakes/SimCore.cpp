#include "tests/fakes/SimCore.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <stdexcept>
#include <utility>

namespace lumacast {

namespace {

/// Real time without a single step after which the driver gives up: a task then waits for something outside of the
/// simulation, or holds a leaf lock over a call that lets another task go on.
constexpr auto kHangLimit = std::chrono::seconds(60);

enum TraceKind : std::uint64_t { kResumed = 1, kQueueTurn, kGlobalJob, kTimePassed, kNote };

template <class T>
T takeAt(std::vector<T>& items, std::size_t index) {
    T item = std::move(items[index]);
    items.erase(items.begin() + static_cast<std::ptrdiff_t>(index));
    return item;
}

}  // namespace

SimCore::SimCore(std::uint64_t seed) : random_(seed), trace_(seed) {
    driver_.threadId = std::this_thread::get_id();
    driver_.lane = "the test";
    current_ = &driver_;
}

SimCore::~SimCore() { endWorld(); }

SimContext& SimCore::current() {
    SimContext* context = current_;
    if (context->threadId != std::this_thread::get_id()) {
        std::fprintf(stderr, "The simulation was entered by a thread that is none of its own.\n");
        std::abort();
    }
    return *context;
}

void SimCore::note(std::uint64_t event) {
    trace_ ^= event;
    trace_ = SimRandom::splitmix(trace_);
}

// Work

std::shared_ptr<SimQueueState> SimCore::makeQueue(std::string label) {
    auto queue = std::make_shared<SimQueueState>();
    queue->label = std::move(label);
    queue->number = ++queuesMade_;
    return queue;
}

void SimCore::list(const std::shared_ptr<SimQueueState>& queue) {
    if (queue->listed || queue->holder || queue->work.empty()) return;
    queue->listed = true;
    runnableQueues_.push_back(queue);
}

void SimCore::submit(const std::shared_ptr<SimQueueState>& queue, Task task) {
    current();
    if (ended_) return;
    queue->work.emplace_back(std::move(task));
    list(queue);
    schedulingPoint();
}

void SimCore::submitGlobal(QueuePriority priority, Task task) {
    current();
    if (ended_) return;
    globalJobs_.push_back({std::move(task), priority});
    schedulingPoint();
}

void SimCore::handOn(const std::shared_ptr<SimQueueState>& queue) {
    queue->holder = nullptr;
    list(queue);
}

void SimCore::sync(const std::shared_ptr<SimQueueState>& queue, const Task& task) {
    SimContext& self = current();
    if (queue->holder == &self || ended_) {
        task();
        return;
    }
    schedulingPoint();
    if (queue->holder || !queue->work.empty()) {
        queue->work.emplace_back(&self);
        list(queue);
        self.waitsForQueue = true;
        wait("queue " + queue->label + (queue->holder ? " held by " + queue->holder->lane : std::string()), {}, [&] {
            std::erase_if(queue->work, [&](const auto& item) {
                SimContext* const* waiter = std::get_if<SimContext*>(&item);
                return waiter && *waiter == &self;
            });
        });
    } else {
        queue->holder = &self;
    }
    struct Turn {
        SimCore& core;
        const std::shared_ptr<SimQueueState>& queue;
        ~Turn() { core.handOn(queue); }
    } const turn{*this, queue};
    task();
}

// Waiting

bool SimCore::wait(std::string what, std::optional<std::chrono::nanoseconds> limit, std::function<void()> forget) {
    SimContext& self = current();
    if (ended_) {
        if (&self != &driver_ && std::uncaught_exceptions() == 0) throw SimTaskUnwound{};
        return false;
    }
    self.waitsFor = std::move(what);
    self.forgetWait = std::move(forget);
    if (limit) self.deadline = addDeadline(std::max<std::int64_t>(limit->count(), 0), &self);
    waiting_.push_back(&self);
    if (&self == &driver_) driverWaits_ = true;
    switchAway(self);
    if (&self == &driver_) driverWaits_ = false;
    if (&self == &driver_ && std::exchange(deadlocked_, false)) {
        std::string report = "the test waits for what never comes:";
        for (const SimBlockedTask& task : blockedTasks())
            report += " [" + task.lane + " waits for " + task.waitsFor + "]";
        throw std::runtime_error(report);
    }
    if (std::exchange(self.mustUnwind, false)) throw SimTaskUnwound{};
    return self.granted;
}

void SimCore::endWait(SimContext& context, bool granted) {
    std::erase(waiting_, &context);
    if (context.deadline) deadlines_.erase(*std::exchange(context.deadline, std::nullopt));
    if (!granted && context.forgetWait) context.forgetWait();
    context.forgetWait = nullptr;
    context.waitsFor.clear();
    context.waitsForQueue = false;
    context.granted = granted;
}

void SimCore::makeReady(SimContext& context) {
    endWait(context, true);
    ready_.push_back(&context);
}

void SimCore::schedulingPoint() {
    SimContext& self = current();
    if (&self == &driver_ || ended_ || inEngine_ || yieldOneIn_ == 0 || !random_.chance(1, yieldOneIn_)) return;
    ready_.push_back(&self);
    switchAway(self);
}

std::vector<SimBlockedTask> SimCore::blockedTasks() const {
    std::vector<SimBlockedTask> tasks;
    for (const SimContext* context : waiting_) tasks.push_back({context->lane, context->waitsFor});
    return tasks;
}

// Time

SimCore::DeadlineKey SimCore::addDeadline(std::int64_t after, Deadline deadline) {
    const DeadlineKey key{now_ + std::min(after, INT64_MAX - now_), ++deadlinesMade_};
    deadlines_.emplace(key, std::move(deadline));
    return key;
}

void SimCore::startTimer(const std::shared_ptr<SimTimerState>& timer) {
    if (!ended_) addDeadline(timer->interval, timer);
}

std::optional<std::int64_t> SimCore::nextDeadline() const {
    // Timers that were stopped stay on the table until their time; they don't count.
    for (const auto& [key, deadline] : deadlines_) {
        const auto* timer = std::get_if<std::shared_ptr<SimTimerState>>(&deadline);
        if (!timer || !(*timer)->stopped) return key.first;
    }
    return std::nullopt;
}

void SimCore::moveTimeTo(std::int64_t time) {
    now_ = time;
    note(kTimePassed);
    note(static_cast<std::uint64_t>(time));
    while (!deadlines_.empty() && deadlines_.begin()->first.first <= now_) fire(deadlines_.begin()->second);
}

void SimCore::fire(Deadline deadline) {
    if (SimContext** context = std::get_if<SimContext*>(&deadline)) {
        endWait(**context, false);
        ready_.push_back(*context);
        return;
    }
    deadlines_.erase(deadlines_.begin());
    const auto timer = std::get<std::shared_ptr<SimTimerState>>(deadline);
    if (timer->stopped) return;
    addDeadline(timer->interval, timer);
    if (std::exchange(timer->tickWaits, true)) return;
    inEngine_ = true;
    timer->queue->async([timer] {
        timer->tickWaits = false;
        // A copy: the task may destroy its timer.
        if (const Task task = timer->task) task();
    });
    inEngine_ = false;
}

// The baton

SimContext* SimCore::chooseNext(SimContext* fresh) {
    if (ended_) return &driver_;
    for (;;) {
        if (!driverWaits_ && (stepsLeft_ == 0 || (enough_ && (*enough_)()))) return &driver_;
        if (canGoOn()) return pick(fresh);
        if (!driverWaits_) return &driver_;
        const std::optional<std::int64_t> next = nextDeadline();
        if (!next) {
            deadlocked_ = true;
            endWait(driver_, false);
            return &driver_;
        }
        moveTimeTo(*next);
    }
}

SimContext* SimCore::pick(SimContext* fresh) {
    ++stepsMade_;
    if (stepsLeft_ > 0) --stepsLeft_;
    std::uint64_t index = random_.below(ready_.size() + runnableQueues_.size() + globalJobs_.size());
    if (index < ready_.size()) {
        SimContext* context = takeAt(ready_, index);
        note(kResumed);
        note(context->number);
        return context;
    }
    index -= ready_.size();
    if (index < runnableQueues_.size()) return startQueueTurn(index, fresh);
    return startGlobalJob(index - runnableQueues_.size(), fresh);
}

SimContext* SimCore::startQueueTurn(std::size_t index, SimContext* fresh) {
    const std::shared_ptr<SimQueueState> queue = takeAt(runnableQueues_, index);
    queue->listed = false;
    note(kQueueTurn);
    note(queue->number);
    auto next = std::move(queue->work.front());
    queue->work.pop_front();
    if (SimContext** waiter = std::get_if<SimContext*>(&next)) {
        queue->holder = *waiter;
        endWait(**waiter, true);
        return *waiter;
    }
    SimContext* context = load(fresh, queue->label, {});
    queue->holder = context;
    context->job = [this, queue, task = std::move(std::get<Task>(next))]() mutable {
        struct Turn {
            SimCore& core;
            const std::shared_ptr<SimQueueState>& queue;
            Task& task;
            ~Turn() {
                task = nullptr;  // its captures end on their queue
                core.handOn(queue);
            }
        } const turn{*this, queue, task};
        task();
    };
    return context;
}

SimContext* SimCore::startGlobalJob(std::size_t index, SimContext* fresh) {
    GlobalJob job = takeAt(globalJobs_, index);
    note(kGlobalJob);
    return load(fresh, job.priority == QueuePriority::Background ? "global background" : "global", std::move(job.task));
}

SimContext* SimCore::load(SimContext* fresh, std::string lane, std::function<void()> job) {
    if (!fresh && idle_.empty()) {
        SimContext& made = *contexts_.emplace_back(std::make_unique<SimContext>());
        // The thread reads nothing of the engine before it is handed the baton.
        made.thread = std::thread([this, &made] { runContext(made); });
        made.threadId = made.thread.get_id();
        fresh = &made;
    } else if (!fresh) {
        fresh = idle_.back();
        idle_.pop_back();
    }
    fresh->number = ++tasksStarted_;
    fresh->lane = std::move(lane);
    fresh->busy = true;
    fresh->job = std::move(job);
    return fresh;
}

void SimCore::handTo(SimContext& context) {
    current_ = &context;
    const std::lock_guard lock(context.mutex);
    context.hasBaton = true;
    context.wake.notify_one();
}

void SimCore::awaitBaton(SimContext& self) {
    std::unique_lock lock(self.mutex);
    if (&self != &driver_) {
        self.wake.wait(lock, [&] { return self.hasBaton; });
    } else {
        std::uint64_t seen = stepsMade_;
        while (!self.wake.wait_for(lock, kHangLimit, [&] { return self.hasBaton; })) {
            if (stepsMade_ == seen) {
                std::fprintf(stderr, "The simulation hangs in a task of \"%s\".\n", current_.load()->lane.c_str());
                std::abort();
            }
            seen = stepsMade_;
        }
    }
    self.hasBaton = false;
}

void SimCore::switchAway(SimContext& self) {
    SimContext* next = chooseNext(nullptr);
    if (next == &self) return;
    handTo(*next);
    awaitBaton(self);
}

void SimCore::runContext(SimContext& self) {
    awaitBaton(self);
    while (self.busy) {
        {
            const std::function<void()> job = std::exchange(self.job, nullptr);
            try {
                job();
            } catch (const SimTaskUnwound&) {
            }
        }
        self.busy = false;
        // The next task goes on right here; only a context that waited needs its own stack.
        SimContext* next = chooseNext(&self);
        if (next == &self) continue;
        idle_.push_back(&self);
        handTo(*next);
        awaitBaton(self);
    }
    handTo(driver_);
}

std::uint64_t SimCore::run(std::uint64_t steps, const std::function<bool()>* enough) {
    if (&current() != &driver_ || ended_) return 0;
    const std::uint64_t before = stepsMade_;
    stepsLeft_ = steps;
    enough_ = enough;
    SimContext* next = chooseNext(nullptr);
    if (next != &driver_) {
        handTo(*next);
        awaitBaton(driver_);
    }
    enough_ = nullptr;
    return stepsMade_ - before;
}

// The end

void SimCore::dropWork() {
    // What is dropped may own queues and submit in its destructors (which does nothing any more).
    const auto queues = std::exchange(runnableQueues_, {});
    for (const auto& queue : queues) {
        queue->listed = false;
        const auto work = std::exchange(queue->work, {});
    }
    const auto jobs = std::exchange(globalJobs_, {});
    const auto deadlines = std::exchange(deadlines_, {});
}

void SimCore::unwind(SimContext& context) {
    // A wait for a queue ends as if the turn had come, as its holder is unwound too: code that waits for a queue in a
    // destructor must not be thrown out of it. So does a context that could have gone on.
    const bool goesOn = context.waitsFor.empty() || context.waitsForQueue;
    context.mustUnwind = !goesOn;
    if (!context.waitsFor.empty()) endWait(context, goesOn);
    std::erase(ready_, &context);
    handTo(context);
    awaitBaton(driver_);
}

void SimCore::endWorld() {
    if (ended_) return;
    current();
    ended_ = true;
    for (const auto& context : contexts_) context->deadline.reset();
    dropWork();
    const auto next = [this](bool forQueue) -> SimContext* {
        for (const auto& context : contexts_)
            if (context->busy && context->waitsForQueue == forQueue) return context.get();
        return nullptr;
    };
    while (SimContext* context = next(false)) unwind(*context);
    while (SimContext* context = next(true)) unwind(*context);
    for (const auto& context : contexts_) {
        handTo(*context);
        awaitBaton(driver_);
        context->thread.join();
    }
    current_ = &driver_;
    contexts_.clear();
    idle_.clear();
    dropWork();
}

}  // namespace lumacast
