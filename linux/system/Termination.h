#pragma once
#include <chrono>
#include <functional>
#include <thread>

#include "linux/ipc/Fd.h"

namespace lumacast {

/// Blocks SIGTERM and SIGINT in the thread that calls it and so in every thread it starts afterwards: call it before any
/// other thread is started. A signal that comes before somebody waits for it stays pending. Who starts another program
/// must give it an empty signal mask.
void blockTerminationSignals();

/// Ends the process on SIGTERM or SIGINT: calls `onTerminate` on a thread of its own, waits for it at most `limit`, and
/// leaves with status 0, without running destructors (every other lane may be in the middle of its work). It waits for
/// no lane itself. `onTerminate` is called at most once; later signals change nothing.
///
/// Blocks the signals itself too; where other threads run already, blockTerminationSignals must have been called before
/// them. Construct it when what `onTerminate` touches is there.
class Termination final {
public:
    /// What is called at once and then again and again while `onTerminate` works; must not wait.
    struct Beat {
        std::function<void()> call;
        std::chrono::milliseconds every;
    };

    explicit Termination(std::function<void()> onTerminate, std::chrono::milliseconds limit = std::chrono::seconds(8),
                         Beat beat = {});
    /// Ends the waiting. The signals stay blocked: a signal that came meanwhile must not kill a process that is ending.
    ~Termination();
    Termination(const Termination&) = delete;
    Termination& operator=(const Termination&) = delete;

    /// Whether the signals can be waited for; false only when the system has no descriptors left.
    bool isWatching() const { return thread_.joinable(); }

private:
    void wait(const std::function<void()>& onTerminate, std::chrono::milliseconds limit, const Beat& beat) const;

    Fd signals_;
    Fd end_;
    std::thread thread_;
};

}  // namespace lumacast
