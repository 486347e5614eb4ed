#pragma once
// A system bus of the test's own, and a login manager on it.

#include <systemd/sd-bus.h>

#include <atomic>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "linux/ipc/Fd.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast {

/// A dbus-daemon on a socket of its own. It may die and come back at the same address.
class PrivateBus final {
public:
    enum class State { Runs, NotYet };
    explicit PrivateBus(State state = State::Runs);
    std::string address() const { return "unix:path=" + scratch_.path("bus"); }
    void start();
    void die() { daemon_.reset(); }
    /// It answers nobody until it goes on.
    void hang() const { daemon_->send(SIGSTOP); }
    void goOn() const { daemon_->send(SIGCONT); }

private:
    ScratchDirectory scratch_;
    std::unique_ptr<test::ChildProcess> daemon_;
};

/// What org.freedesktop.login1 does about inhibitors: gives locks, and says when the device sleeps and wakes.
class StandInLoginManager final {
public:
    struct Lock {
        std::string what, who, why, mode;
        bool held = true;  ///< the other end is open
    };

    explicit StandInLoginManager(const std::string& busAddress);
    ~StandInLoginManager();
    StandInLoginManager(const StandInLoginManager&) = delete;
    StandInLoginManager& operator=(const StandInLoginManager&) = delete;

    /// All that were given, the oldest first.
    std::vector<Lock> locks() const;
    /// How many of a kind are held now.
    std::size_t held(const std::string& what, const std::string& mode) const;
    /// Says that the device is about to sleep, or has woken up; the bus has it when this returns.
    void prepareForSleep(bool begins);

private:
    struct Given {
        Lock lock;
        Fd end;  ///< ours: at its end when nobody holds the other
    };
    static int inhibit(sd_bus_message* message, void* self, sd_bus_error* error);
    void run();

    sd_bus* bus_ = nullptr;
    mutable std::mutex mutex_;  // guards the next three
    std::vector<Given> given_;
    std::vector<bool> announcements_;
    std::atomic<std::size_t> announced_ = 0;
    bool quit_ = false;
    const Fd wake_;
    std::thread thread_;
};

}  // namespace lumacast
