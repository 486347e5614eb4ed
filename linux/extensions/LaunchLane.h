#pragma once
#include <sys/types.h>

#include <condition_variable>
#include <deque>
#include <functional>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "linux/ipc/Fd.h"

namespace lumacast {

/// What a program is started with. Its standard input is empty; nothing else of this process is passed on.
struct Start {
    std::vector<std::string> arguments;    ///< the first is its path
    std::vector<std::string> environment;  ///< all of it, "NAME=value"
    int output = -1;                       ///< its standard output and error
    std::vector<int> descriptors;          ///< its descriptors from 3 on
};

struct Started {
    pid_t pid = 0;  ///< 0: it was not started
    Fd process;     ///< its pidfd
    int error = 0;
};

/// The thread that starts the processes of extensions. Those that want to end with this process end with the thread
/// that has started them, so it lives as long as they may. A program is started by the launcher, which is on a disk
/// that answers; what else it runs does not hold up this thread.
class LaunchLane final {
public:
    LaunchLane();
    LaunchLane(const LaunchLane&) = delete;
    LaunchLane& operator=(const LaunchLane&) = delete;
    /// Drops what was not started; ends what asked to end with its parent.
    ~LaunchLane();

    /// Starts a program and calls `started` on this lane's thread. `start`'s descriptors stay the caller's and must be
    /// open until then.
    void start(Start start, std::function<void(Started)> started);

private:
    void run();

    std::mutex mutex_;
    std::condition_variable wake_;
    std::deque<std::function<void()>> tasks_;
    bool isOver_ = false;
    std::thread thread_;
};

}  // namespace lumacast
