#pragma once
// The event loop of one thread: tasks, descriptors and timers. In the daemon it is the request lane.

#include <atomic>
#include <chrono>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <unordered_map>
#include <utility>
#include <vector>

#include "linux/ipc/Fd.h"
#include "platform/Scheduler.h"

namespace lumacast {

/// A main queue that also waits for descriptors and timers, made of epoll and an eventfd. Everything runs on the thread
/// that calls run(). One turn of the loop runs a bounded number of tasks, then gives each ready descriptor one call, so
/// neither a flood of tasks nor one of messages keeps the other waiting. Must outlive its watches and timers.
class Reactor final : public MainLoop {
public:
    /// What a watch's task answers: whether it has work left that it wants to go on with in the next turn, although its
    /// descriptor may have nothing new.
    enum class Again : bool { No, Yes };
    /// Told of a descriptor's readiness (EPOLL* bits; 0 when it is called because it asked to be called again). Should
    /// do a bounded amount of work: readiness is level-triggered, what is left is reported again.
    using WatchTask = std::function<Again(std::uint32_t events)>;

    /// A watched descriptor; destroying it ends the watch. Destroy it before the descriptor is closed. On the reactor's
    /// thread the task is not called again after that; elsewhere a call in progress may be ending.
    class Watch {
    public:
        Watch(Reactor& reactor, int descriptor, std::uint64_t id)
            : reactor_(reactor), descriptor_(descriptor), id_(id) {}
        Watch(const Watch&) = delete;
        Watch& operator=(const Watch&) = delete;
        ~Watch();
        /// Changes what is waited for (EPOLL* bits). Callable from any lane.
        void setEvents(std::uint32_t events);

    private:
        Reactor& reactor_;
        const int descriptor_;
        const std::uint64_t id_;
    };

    explicit Reactor(std::string label = "main");
    Reactor(const Reactor&) = delete;
    Reactor& operator=(const Reactor&) = delete;
    /// Drops tasks that have not run. Not while run() runs.
    ~Reactor() override;

    const std::string& label() const override { return label_; }
    void async(Task task) override;
    void sync(const Task& task) override;
    bool isCurrent() const override;
    void run() override;
    void requestStop() override;

    /// Watches a descriptor for `events` (EPOLL* bits). Callable from any lane. Null when the kernel refuses.
    [[nodiscard]] std::unique_ptr<Watch> watch(int descriptor, std::uint32_t events, WatchTask task);

    /// Runs `task` once on this reactor after `delay`, unless the timer is destroyed before. Callable from any lane.
    [[nodiscard]] std::unique_ptr<Timer> after(std::chrono::nanoseconds delay, Task task);

private:
    using Instant = std::chrono::steady_clock::time_point;
    using TimerKey = std::pair<Instant, std::uint64_t>;
    class PendingTimer;

    void runTasks();
    /// Between two watches, so that many ready descriptors don't keep the tasks waiting.
    void runTasksIfDue();
    void runTimers();
    void runWatch(std::uint64_t id, std::uint32_t events);
    /// Says how long epoll may sleep, in milliseconds; -1 for as long as it takes. Notes that the loop is about to
    /// sleep.
    int timeUntilNextTurn(bool workLeft);
    void wakeLocked();

    const std::string label_;
    const Fd epoll_;
    const Fd wake_;
    std::atomic<std::thread::id> thread_{};
    std::atomic<bool> stop_{false};

    std::mutex mutex_;
    std::deque<Task> tasks_;
    std::map<TimerKey, Task> timers_;
    std::unordered_map<std::uint64_t, std::shared_ptr<WatchTask>> watches_;
    std::uint64_t nextID_ = 1;
    bool sleeping_ = false;

    // The loop's own.
    std::vector<std::uint64_t> again_;
    Instant tasksDue_;
};

}  // namespace lumacast
