#pragma once
// Queues, timers, semaphores and locks: every wait of the system goes through this role, so that the whole daemon also
// runs one task at a time, in a chosen order, in virtual time.

#include <chrono>
#include <functional>
#include <memory>
#include <string>

namespace lumacast {

using Task = std::function<void()>;

/// A serial task queue: tasks run in order, one at a time. Held by shared_ptr; it may be released from its own work,
/// and work that was submitted before still runs.
class SerialQueue {
public:
    virtual ~SerialQueue() = default;
    virtual const std::string& label() const = 0;
    /// Submits; returns at once. Callable from any lane.
    virtual void async(Task task) = 0;
    /// Runs `task` on the queue, after what was submitted before, and returns when it is done. On the queue itself (in
    /// a task of it, at any depth) it runs inline. Never call it for the main queue from a lane the main queue waits
    /// for.
    virtual void sync(const Task& task) = 0;
    /// Whether the caller runs in a task of this queue.
    virtual bool isCurrent() const = 0;
};

/// The process's main queue as the platform makes it: a serial queue whose tasks run in run(), on the thread that calls
/// it, together with whatever else the platform waits for there.
class MainLoop : public SerialQueue {
public:
    /// Runs tasks until requestStop.
    virtual void run() = 0;
    /// Lets run() return after the task in progress. Callable from any lane and from a signal's own thread.
    virtual void requestStop() = 0;
};

/// The priorities of the global queues, whose tasks run concurrently with each other, in no promised order.
enum class QueuePriority { Default, Background };

class GlobalQueue {
public:
    virtual ~GlobalQueue() = default;
    virtual void async(Task task) = 0;
};

/// A counting semaphore.
class Semaphore {
public:
    virtual ~Semaphore() = default;
    virtual void signal() = 0;
    /// Waits without limit.
    virtual void wait() = 0;
    /// Waits at most `limit`; whether it was signalled.
    [[nodiscard]] virtual bool waitFor(std::chrono::nanoseconds limit) = 0;
};

/// A non-recursive lock without an owner: it may be released by another lane, may be destroyed while held, and taking
/// it twice blocks.
class OwnerlessLock {
public:
    virtual ~OwnerlessLock() = default;
    virtual void lock() = 0;
    virtual void unlock() = 0;
};

/// A running timer; destroying it stops it. Its task may be running at that moment and is not waited for.
class Timer {
public:
    virtual ~Timer() = default;
};

class Scheduler {
public:
    virtual ~Scheduler() = default;

    /// A new serial queue. The label is for people.
    virtual std::shared_ptr<SerialQueue> serialQueue(std::string label) = 0;
    virtual GlobalQueue& globalQueue(QueuePriority priority) = 0;
    /// The process's main queue: the request lane. Its tasks run in runMainLoop().
    virtual SerialQueue& mainQueue() = 0;
    /// Runs the main queue until the process ends or the queue is told to stop; answers only then.
    virtual void runMainLoop() = 0;

    virtual std::unique_ptr<Semaphore> semaphore(int initialCount) = 0;
    virtual std::unique_ptr<OwnerlessLock> ownerlessLock() = 0;
    /// Runs `task` on `queue` every `interval`, first after one interval, until the timer is destroyed.
    virtual std::unique_ptr<Timer> timer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds interval,
                                         Task task) = 0;
};

}  // namespace lumacast
