#pragma once
// The simulation's scheduler: one task at a time, in a seeded order, in virtual time.

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "base/Date.h"
#include "platform/Scheduler.h"
#include "tests/fakes/SimCore.h"

namespace lumacast {

/// Runs one task at a time, each on a stack of its own, and chooses who goes on with a seeded generator: a queue's next
/// task, a task of a global queue, or a task whose wait has ended. Every call of the role is a point where another task
/// may be chosen. Time stands while anything can go on. The same seed replays exactly; traceHash() shows that it did.
///
/// Used by the test's own thread (the driver), which runs outside of any task: it drives the simulation with the calls
/// below, and may itself use queues, semaphores and locks; when it has to wait, the simulation goes on (and time moves)
/// until its wait ends. A wait of the driver that can never end throws std::runtime_error naming who waits for what.
///
/// No leaf lock may be held over a call of this role: the next task to take it would hang, which ends the process with
/// the name of the lane after a minute.
class SimScheduler final : public Scheduler {
public:
    explicit SimScheduler(std::uint64_t seed);
    /// Ends the world.
    ~SimScheduler() override;

    std::shared_ptr<SerialQueue> serialQueue(std::string label) override;
    GlobalQueue& globalQueue(QueuePriority priority) override;
    SerialQueue& mainQueue() override;
    /// Driver only: runs, moving time, until requestStop, or until nothing is left that could happen.
    void runMainLoop() override;
    std::unique_ptr<Semaphore> semaphore(int initialCount) override;
    std::unique_ptr<OwnerlessLock> ownerlessLock() override;
    std::unique_ptr<Timer> timer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds interval,
                                 Task task) override;

    /// The main queue for whoever wants to hold it, e.g. as a timer's queue.
    std::shared_ptr<SerialQueue> sharedMainQueue() const { return mainQueue_; }

    /// Lets one task go on until it ends or waits; false when none can.
    bool step();
    /// Runs until nothing can go on at this time; answers the steps made. Throws std::runtime_error after ten million.
    std::uint64_t runUntilIdle();
    /// Moves time by `duration`, stopping at each moment something is due, and runs what can go on, before and after.
    void advance(std::chrono::nanoseconds duration);
    /// Runs, moving time by at most `limit`, until `condition` holds; whether it does.
    bool runUntil(const std::function<bool()>& condition, std::chrono::nanoseconds limit);
    /// Lets runMainLoop return. Callable from tasks.
    void requestStop() { stopRequested_ = true; }

    /// Virtual time: zero at first.
    HostTime now() const { return {core_->now()}; }
    /// Changes with every choice that was made and all time that passed.
    std::uint64_t traceHash() const { return core_->traceHash(); }
    /// Makes an event of the test part of the trace.
    void note(std::uint64_t event) { core_->note(event); }
    /// A generator of its own for the test, seeded by this one.
    SimRandom fork() { return SimRandom(core_->random().next()); }

    /// Who waits, and for what.
    std::vector<SimBlockedTask> blockedTasks() const { return core_->blockedTasks(); }
    /// One scheduling point in this many lets another task go first (8 at first); 0 for never.
    void setYieldOneIn(std::uint64_t points) { core_->setYieldOneIn(points); }

    /// Driver only. Ends the world while what the tasks use is still there: what was submitted is dropped, tasks that
    /// wait are unwound (SimTaskUnwound is thrown out of their semaphore and lock waits; waits for a queue end as if
    /// its turn had come). Afterwards nothing is submitted, nothing waits, and sync runs inline.
    void endWorld() { core_->endWorld(); }

private:
    class Queue;
    class Global;

    const std::shared_ptr<SimCore> core_;
    const std::shared_ptr<SerialQueue> mainQueue_;
    const std::unique_ptr<GlobalQueue> defaultQueue_;
    const std::unique_ptr<GlobalQueue> backgroundQueue_;
    bool stopRequested_ = false;
};

}  // namespace lumacast
