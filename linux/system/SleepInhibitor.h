#pragma once
// Keeping the device awake while it records, and the movies safe when it sleeps all the same.

#include <chrono>
#include <functional>
#include <memory>
#include <string>

namespace lumacast {

/// Asks the login manager (org.freedesktop.login1 on the system bus) for two locks while the daemon is busy:
///  - "sleep" in the mode "delay": the device waits a few seconds until what was recorded is safe. It is not kept from
///    sleeping: who closes the lid or presses the button means it.
///  - "idle" in the mode "block": a device that nobody touches is not put to sleep in the middle of a recording, which
///    may run without anybody touching it.
/// Shutting down needs no lock: the daemon is told to end, and given the time to close its movies.
///
/// Everything happens on a thread of its own, which is made with the first busy moment and sleeps when the daemon is
/// idle: then it holds no lock and no connection. Without a bus, or a login manager on it, there is nothing but another
/// try every now and then while the daemon is busy.
class SleepInhibitor final {
public:
    struct Options {
        /// Of the bus; empty for the system's ($DBUS_SYSTEM_BUS_ADDRESS, else its well-known place).
        std::string busAddress;
        /// Called on the inhibitor's thread when the device is about to sleep while the daemon is busy; the device
        /// waits until it returns, and no longer than its own limit (five seconds by default).
        std::function<void()> beforeSleep;
        /// Until a bus that isn't there is tried again: at first, and twice as long each time, up to ten times as long.
        std::chrono::milliseconds retry{3000};
    };

    explicit SleepInhibitor(Options options);
    /// Waits for a beforeSleep that runs, and for nothing else.
    ~SleepInhibitor();
    SleepInhibitor(const SleepInhibitor&) = delete;
    SleepInhibitor& operator=(const SleepInhibitor&) = delete;

    /// Whether there is something to keep the device awake for. From any lane; waits for nothing.
    void setBusy(bool busy);

private:
    class Lane;
    const std::unique_ptr<Lane> lane_;
};

}  // namespace lumacast
