#pragma once
// The timers of the thread scheduler.

#include <chrono>
#include <condition_variable>
#include <map>
#include <memory>
#include <mutex>
#include <thread>

#include "platform/Scheduler.h"

namespace lumacast {

/// One thread for all timers, made with the first one. Timers keep their phase; a tick that finds the one before still
/// waiting on its queue is left out. Thread-safe; outlives its timers' handles or is outlived by them.
class ThreadTimers final {
public:
    ThreadTimers();
    /// Stops all timers and joins the thread. Never on a lane that a timer's queue runs on.
    ~ThreadTimers();

    std::unique_ptr<Timer> start(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds interval, Task task);

private:
    struct Entry;
    struct State;
    class Handle;

    const std::shared_ptr<State> state_;
    std::once_flag threadMade_;
    std::thread thread_;
};

}  // namespace lumacast
