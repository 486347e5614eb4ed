#pragma once
// The login manager's locks over one connection to the bus.

#include <systemd/sd-bus.h>

#include <array>
#include <functional>
#include <memory>
#include <string>

#include "linux/ipc/Fd.h"

namespace lumacast {

struct BusCloser {
    // Without writing what waits: nobody is waited for.
    void operator()(sd_bus* bus) const { sd_bus_close_unref(bus); }
};

/// One connection to the bus, with the locks that were taken over it. Belongs to one thread, which polls descriptor()
/// for events() and then calls process(); nothing waits.
class LoginLocks final {
public:
    /// `beforeSleep` is called by process().
    explicit LoginLocks(std::function<void()> beforeSleep) : beforeSleep_(std::move(beforeSleep)) {}
    LoginLocks(const LoginLocks&) = delete;
    LoginLocks& operator=(const LoginLocks&) = delete;

    /// Begins to connect and asks for both locks. False when there is no such bus.
    bool connect(const std::string& address);
    /// Handles what has come. False when the connection has gone; locks that were taken are kept, for the login manager
    /// may still be there.
    bool process();
    /// The connection goes, and both locks.
    void letGo();
    /// The connection alone.
    void disconnect();

    bool isConnected() const { return bus_ != nullptr; }
    int descriptor() const { return sd_bus_get_fd(bus_.get()); }
    int events() const { return sd_bus_get_events(bus_.get()); }
    /// Milliseconds until process() has something to do without an event; -1 for never.
    int timeout() const;

private:
    struct Lock {
        LoginLocks* owner = nullptr;
        const char* what = nullptr;
        const char* mode = nullptr;
        Fd held;
    };

    void ask(Lock& lock);
    void askForBoth();
    void sleepComes(bool begins);
    static int answered(sd_bus_message* message, void* lock, sd_bus_error*);
    static int sleepSignalled(sd_bus_message* message, void* self, sd_bus_error*);
    static int ownerChanged(sd_bus_message* message, void* self, sd_bus_error*);

    const std::function<void()> beforeSleep_;
    std::unique_ptr<sd_bus, BusCloser> bus_;
    Lock sleep_{this, "sleep", "delay", {}};
    Lock idle_{this, "idle", "block", {}};
    bool asleep_ = false;  ///< between the two signals
};

}  // namespace lumacast
