#pragma once
#include <sys/types.h>

#include <chrono>
#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "linux/display/Wake.h"
#include "linux/display/X11Connection.h"

namespace lumacast {

/// Looks at the display for a dialog's window: since when it has been on the screen, and whether somebody has destroyed
/// it. On a thread of its own, because a display server that hangs keeps whoever asks it. Thread-safe.
class DialogWatch final : public std::enable_shared_from_this<DialogWatch> {
public:
    using Time = std::chrono::steady_clock::time_point;

    /// `changed` is called on the thread when something below has changed; it must not wait. Null when there is no
    /// thread to be had.
    static std::shared_ptr<DialogWatch> start(const std::string& display, std::function<void()> changed);
    /// Ends the thread, also when it waits for the server.
    void stop();

    /// Waits for the display; false when there is none on this machine that tells whose windows are whose.
    bool waitForDisplay(std::chrono::milliseconds patience);
    /// Forgets what it has seen, and looks for the windows of this process from now on.
    void follow(pid_t pid);

    /// When a window of the process was first seen on the screen; none as long as it wasn't.
    std::optional<Time> seen() const;
    /// Whether the window that was seen has been destroyed, or the display has gone.
    bool lost() const;

private:
    enum class Display { Opening, Open, Gone };
    explicit DialogWatch(std::function<void()> changed) : changed_(std::move(changed)) {}
    void run(const std::string& display);
    void watch(x11::X11Connection& connection);
    xcb_window_t find(x11::X11Connection& connection, pid_t pid) const;
    void sleep(x11::X11Connection* connection, int milliseconds) const;
    void set(Display display);
    void sawWindow(pid_t pid);
    void lostWindow(pid_t pid);

    const std::function<void()> changed_;
    const x11::Wake wake_;
    x11::Interrupt interrupt_;
    mutable std::mutex mutex_;  // guards the rest
    std::condition_variable opened_;
    Display display_ = Display::Opening;
    bool stopped_ = false;
    pid_t pid_ = 0;
    std::optional<Time> seen_;
    bool destroyed_ = false;
};

}  // namespace lumacast
