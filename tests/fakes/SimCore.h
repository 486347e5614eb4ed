#pragma once
// The engine of the simulation: contexts that pass a baton, the seeded choice of who goes on, and virtual time.

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <variant>
#include <vector>

#include "platform/Scheduler.h"
#include "tests/fakes/SimRandom.h"

namespace lumacast {

/// Thrown out of a wait that will never end, when the world ends, so that the task's stack is unwound. Not a
/// std::exception: nothing that catches errors should catch it.
struct SimTaskUnwound {};

/// A task that waits, for reports.
struct SimBlockedTask {
    std::string lane;      ///< the label of the queue whose task it is
    std::string waitsFor;  ///< e.g. "semaphore", "lock", "queue writer held by main"
};

/// One stack: the test's own thread (the driver), or a pooled thread that runs one task at a time. Only the holder of
/// the baton runs; all of the simulation's state belongs to it.
struct SimContext {
    std::thread thread;  ///< none for the driver
    std::mutex mutex;
    std::condition_variable wake;
    bool hasBaton = false;

    std::thread::id threadId;
    std::uint64_t number = 0;  ///< of the task, for the trace
    std::string lane;
    bool busy = false;          ///< has a task; a thread that is handed the baton without one ends
    std::function<void()> job;  ///< the task, until it begins
    std::string waitsFor;       ///< not empty while it waits
    bool waitsForQueue = false;
    bool granted = false;  ///< what ended the wait: the thing waited for (true) or the time limit
    bool mustUnwind = false;
    std::function<void()> forgetWait;  ///< takes the context off the list of the thing it waits for
    std::optional<std::pair<std::int64_t, std::uint64_t>> deadline;  ///< its key among the deadlines
};

/// A serial queue's work. Shared by the queue's handle and the engine.
struct SimQueueState {
    std::string label;
    std::uint64_t number = 0;
    std::deque<std::variant<Task, SimContext*>> work;  ///< tasks, and contexts that wait for their turn
    SimContext* holder = nullptr;
    bool listed = false;  ///< among the queues that can go on
};

/// A running timer. Shared by its handle and the engine.
struct SimTimerState {
    std::shared_ptr<SerialQueue> queue;
    std::int64_t interval = 1;
    Task task;
    bool stopped = false;
    bool tickWaits = false;
};

class SimCore final {
public:
    explicit SimCore(std::uint64_t seed);
    ~SimCore();
    SimCore(const SimCore&) = delete;
    SimCore& operator=(const SimCore&) = delete;

    // What queues, semaphores, locks and timers are made of. Called by the holder of the baton.

    /// The context that runs. Aborts with a message when the calling thread is none of the simulation's.
    SimContext& current();
    std::shared_ptr<SimQueueState> makeQueue(std::string label);
    void submit(const std::shared_ptr<SimQueueState>& queue, Task task);
    void submitGlobal(QueuePriority priority, Task task);
    void sync(const std::shared_ptr<SimQueueState>& queue, const Task& task);
    /// Waits until makeReady, or until `limit` has passed; answers whether it was made ready. `forget` is called when
    /// something else ended the wait. In an ended world it does not wait: a task is thrown out, a destructor goes on.
    bool wait(std::string what, std::optional<std::chrono::nanoseconds> limit, std::function<void()> forget);
    void makeReady(SimContext& context);
    /// Now and then lets another context go on first.
    void schedulingPoint();
    void startTimer(const std::shared_ptr<SimTimerState>& timer);
    SimRandom& random() { return random_; }
    /// Whether the world has ended: nothing waits any more, nothing is submitted any more.
    bool hasEnded() const { return ended_; }

    // What drives the simulation. Called by the driver, outside of any task.

    /// Runs until nothing can go on, at most `steps` steps, or until `enough` answers true. Answers the steps made.
    std::uint64_t run(std::uint64_t steps, const std::function<bool()>* enough);
    bool canGoOn() const { return !ready_.empty() || !runnableQueues_.empty() || !globalJobs_.empty(); }
    std::optional<std::int64_t> nextDeadline() const;
    /// Moves time to `time` and lets what was due by then go on.
    void moveTimeTo(std::int64_t time);
    std::int64_t now() const { return now_; }
    std::uint64_t traceHash() const { return trace_; }
    void note(std::uint64_t event);
    std::vector<SimBlockedTask> blockedTasks() const;
    void endWorld();

    /// One in this many scheduling points lets another go first; 0 for never.
    void setYieldOneIn(std::uint64_t points) { yieldOneIn_ = points; }

private:
    struct GlobalJob {
        Task task;
        QueuePriority priority;
    };
    using DeadlineKey = std::pair<std::int64_t, std::uint64_t>;  ///< time, and a number that tells equal times apart
    using Deadline = std::variant<SimContext*, std::shared_ptr<SimTimerState>>;

    SimContext* chooseNext(SimContext* fresh);
    SimContext* pick(SimContext* fresh);
    SimContext* startQueueTurn(std::size_t index, SimContext* fresh);
    SimContext* startGlobalJob(std::size_t index, SimContext* fresh);
    SimContext* load(SimContext* fresh, std::string lane, std::function<void()> job);
    void list(const std::shared_ptr<SimQueueState>& queue);
    void handOn(const std::shared_ptr<SimQueueState>& queue);
    void switchAway(SimContext& self);
    void handTo(SimContext& context);
    void awaitBaton(SimContext& self);
    void runContext(SimContext& self);
    DeadlineKey addDeadline(std::int64_t after, Deadline deadline);
    void fire(Deadline deadline);
    void endWait(SimContext& context, bool granted);
    void unwind(SimContext& context);
    void dropWork();

    SimRandom random_;
    std::int64_t now_ = 0;
    std::uint64_t trace_;
    std::atomic<std::uint64_t> stepsMade_ = 0;
    std::uint64_t stepsLeft_ = 0;
    const std::function<bool()>* enough_ = nullptr;
    std::uint64_t yieldOneIn_ = 8;
    std::uint64_t queuesMade_ = 0;
    std::uint64_t tasksStarted_ = 0;
    std::uint64_t deadlinesMade_ = 0;
    bool ended_ = false;
    bool driverWaits_ = false;
    bool inEngine_ = false;  ///< no scheduling points: the running context has already given up its turn
    bool deadlocked_ = false;

    SimContext driver_;
    std::atomic<SimContext*> current_;
    std::vector<std::unique_ptr<SimContext>> contexts_;
    std::vector<SimContext*> idle_;
    std::vector<SimContext*> waiting_;
    std::vector<SimContext*> ready_;
    std::vector<std::shared_ptr<SimQueueState>> runnableQueues_;
    std::vector<GlobalJob> globalJobs_;
    std::map<DeadlineKey, Deadline> deadlines_;
};

}  // namespace lumacast
