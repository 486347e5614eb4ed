#include "linux/system/LoginLocks.h"

#include <fcntl.h>
#include <time.h>

#include <algorithm>
#include <cstdint>

namespace lumacast {

namespace {

constexpr char kManager[] = "org.freedesktop.login1";
constexpr char kManagerPath[] = "/org/freedesktop/login1";
constexpr char kManagerInterface[] = "org.freedesktop.login1.Manager";
constexpr char kWho[] = "lumacastd", kWhy[] = "The screen is being recorded";

int millisecondsUntil(std::uint64_t monotonicMicroseconds) {
    timespec now{};
    ::clock_gettime(CLOCK_MONOTONIC, &now);
    const auto passed =
        static_cast<std::uint64_t>(now.tv_sec) * 1'000'000 + static_cast<std::uint64_t>(now.tv_nsec) / 1000;
    if (monotonicMicroseconds <= passed) return 0;
    return static_cast<int>(std::min<std::uint64_t>((monotonicMicroseconds - passed) / 1000 + 1, 1'000'000));
}

}  // namespace

bool LoginLocks::connect(const std::string& address) {
    disconnect();
    sd_bus* made = nullptr;
    if (address.empty()) {
        if (sd_bus_open_system(&made) < 0) return false;
        bus_.reset(made);
    } else {
        if (sd_bus_new(&made) < 0) return false;
        bus_.reset(made);
        if (sd_bus_set_address(made, address.c_str()) < 0 || sd_bus_set_bus_client(made, 1) < 0 ||
            sd_bus_start(made) < 0) {
            disconnect();
            return false;
        }
    }
    asleep_ = false;
    // Where a match can't be had there are locks still; and a connection that is none is noticed by process().
    (void)sd_bus_match_signal_async(made, nullptr, kManager, kManagerPath, kManagerInterface, "PrepareForSleep",
                                    sleepSignalled, nullptr, this);
    (void)sd_bus_add_match_async(made, nullptr,
                                 "type='signal',sender='org.freedesktop.DBus',path='/org/freedesktop/DBus',"
                                 "interface='org.freedesktop.DBus',member='NameOwnerChanged',"
                                 "arg0='org.freedesktop.login1'",
                                 ownerChanged, nullptr, this);
    askForBoth();
    return true;
}

bool LoginLocks::process() {
    int result = 1;
    while (result > 0) result = sd_bus_process(bus_.get(), nullptr);
    return result == 0;
}

void LoginLocks::disconnect() {
    bus_.reset();
}

void LoginLocks::letGo() {
    disconnect();
    sleep_.held.reset();
    idle_.held.reset();
}

int LoginLocks::timeout() const {
    std::uint64_t until = UINT64_MAX;
    if (sd_bus_get_timeout(bus_.get(), &until) < 0 || until == UINT64_MAX) return -1;
    return millisecondsUntil(until);
}

void LoginLocks::askForBoth() {
    ask(sleep_);
    ask(idle_);
}

void LoginLocks::ask(Lock& lock) {
    (void)sd_bus_call_method_async(bus_.get(), nullptr, kManager, kManagerPath, kManagerInterface, "Inhibit", answered,
                                   &lock, "ssss", lock.what, kWho, kWhy, lock.mode);
}

int LoginLocks::answered(sd_bus_message* message, void* userdata, sd_bus_error*) {
    Lock& lock = *static_cast<Lock*>(userdata);
    int given = -1;
    if (sd_bus_message_is_method_error(message, nullptr) || sd_bus_message_read(message, "h", &given) < 0) return 0;
    // The device does not wait for a lock that comes when its movies are safe already.
    if (lock.owner->asleep_ && &lock == &lock.owner->sleep_) return 0;
    lock.held.reset(::fcntl(given, F_DUPFD_CLOEXEC, 3));  // the message closes its own
    return 0;
}

int LoginLocks::sleepSignalled(sd_bus_message* message, void* userdata, sd_bus_error*) {
    int begins = 0;
    if (sd_bus_message_read(message, "b", &begins) >= 0) static_cast<LoginLocks*>(userdata)->sleepComes(begins != 0);
    return 0;
}

void LoginLocks::sleepComes(bool begins) {
    asleep_ = begins;
    if (!begins) return ask(sleep_);
    if (beforeSleep_) beforeSleep_();
    sleep_.held.reset();
}

int LoginLocks::ownerChanged(sd_bus_message* message, void* userdata, sd_bus_error*) {
    const char *name = nullptr, *before = nullptr, *now = nullptr;
    if (sd_bus_message_read(message, "sss", &name, &before, &now) < 0 || *now == '\0') return 0;
    LoginLocks& self = *static_cast<LoginLocks*>(userdata);
    self.asleep_ = false;
    self.askForBoth();
    return 0;
}

}  // namespace lumacast
