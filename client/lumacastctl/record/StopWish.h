#pragma once
// How a user says that a recording is enough: with a key, or with a signal.

#include <signal.h>
#include <termios.h>

#include <chrono>
#include <optional>

#include "linux/ipc/Fd.h"

namespace lumacast::ctl {

/// From its making to its end SIGINT, SIGTERM, SIGHUP and SIGQUIT are wishes, and so are q, Enter and the space bar where standard input is
/// a terminal; both are as they were afterwards, and wishes that nobody asked for are forgotten. One at a time.
class StopWish final {
public:
    StopWish();
    ~StopWish();
    StopWish(const StopWish&) = delete;
    StopWish& operator=(const StopWish&) = delete;

    /// Whether one has come, waiting for it at most that long. Once one has, always true, at once.
    bool came(std::chrono::milliseconds limit);

private:
    Fd signals_;
    sigset_t mask_{};  ///< as it was
    std::optional<termios> terminal_;  ///< as it was
    bool inputIsOpen_ = true;
    bool came_ = false;
};

}  // namespace lumacast::ctl
