#include "tests/unit/linux_services/StandInLoginManager.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <cerrno>

#include "linux/admin/UnixSocket.h"
#include "tests/unit/linux_services/Until.h"

namespace lumacast {

namespace {

constexpr char kName[] = "org.freedesktop.login1", kPath[] = "/org/freedesktop/login1",
               kInterface[] = "org.freedesktop.login1.Manager";

bool isOpen(const Fd& end) {
    pollfd polled{end.get(), 0, 0};
    return ::poll(&polled, 1, 0) == 0;  // a hang-up is told without being asked for
}

}  // namespace

PrivateBus::PrivateBus(State state) {
    scratch_.write("bus.conf",
                   "<!DOCTYPE busconfig PUBLIC \"-//freedesktop//DTD D-Bus Bus Configuration 1.0//EN\"\n"
                   " \"http://www.freedesktop.org/standards/dbus/1.0/busconfig.dtd\">\n"
                   "<busconfig><type>system</type><listen>" +
                       address() +
                       "</listen><auth>EXTERNAL</auth><policy context=\"default\"><allow send_destination=\"*\"/>"
                       "<allow receive_sender=\"*\"/><allow own=\"*\"/><allow user=\"*\"/></policy></busconfig>\n");
    if (state == State::Runs) start();
}

void PrivateBus::start() {
    std::filesystem::remove(scratch_.path("bus"));
    daemon_ = std::make_unique<test::ChildProcess>(
        std::vector<std::string>{"dbus-daemon", "--nofork", "--config-file=" + scratch_.path("bus.conf")});
    EXPECT_TRUE(until([this] { return static_cast<bool>(connectTo(scratch_.path("bus"))); })) << "no dbus-daemon";
}

StandInLoginManager::StandInLoginManager(const std::string& busAddress)
    : wake_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
    static constexpr sd_bus_vtable kTable[] = {
        SD_BUS_VTABLE_START(0),
        SD_BUS_METHOD("Inhibit", "ssss", "h", StandInLoginManager::inhibit, SD_BUS_VTABLE_UNPRIVILEGED),
        SD_BUS_SIGNAL("PrepareForSleep", "b", 0),
        SD_BUS_VTABLE_END,
    };
    const bool isThere = sd_bus_new(&bus_) >= 0 && sd_bus_set_address(bus_, busAddress.c_str()) >= 0 &&
                         sd_bus_set_bus_client(bus_, 1) >= 0 && sd_bus_negotiate_fds(bus_, 1) >= 0 &&
                         sd_bus_start(bus_) >= 0 &&
                         sd_bus_add_object_vtable(bus_, nullptr, kPath, kInterface, kTable, this) >= 0 &&
                         sd_bus_request_name(bus_, kName, 0) >= 0;
    EXPECT_TRUE(isThere);
    if (isThere) thread_ = std::thread([this] { run(); });
}

StandInLoginManager::~StandInLoginManager() {
    {
        const std::lock_guard lock(mutex_);
        quit_ = true;
    }
    ::eventfd_write(wake_.get(), 1);
    if (thread_.joinable()) thread_.join();
    sd_bus_close_unref(bus_);
}

std::vector<StandInLoginManager::Lock> StandInLoginManager::locks() const {
    const std::lock_guard lock(mutex_);
    std::vector<Lock> all;
    for (const Given& given : given_) {
        all.push_back(given.lock);
        all.back().held = isOpen(given.end);
    }
    return all;
}

std::size_t StandInLoginManager::held(const std::string& what, const std::string& mode) const {
    std::size_t count = 0;
    for (const Lock& lock : locks()) count += lock.what == what && lock.mode == mode && lock.held ? 1 : 0;
    return count;
}

void StandInLoginManager::prepareForSleep(bool begins) {
    const std::size_t before = announced_;
    {
        const std::lock_guard lock(mutex_);
        announcements_.push_back(begins);
    }
    ::eventfd_write(wake_.get(), 1);
    EXPECT_TRUE(until([&] { return announced_ > before; }));
}

int StandInLoginManager::inhibit(sd_bus_message* message, void* userdata, sd_bus_error*) {
    auto& self = *static_cast<StandInLoginManager*>(userdata);
    const char *what = nullptr, *who = nullptr, *why = nullptr, *mode = nullptr;
    int ends[2] = {-1, -1};
    if (sd_bus_message_read(message, "ssss", &what, &who, &why, &mode) < 0) return -EINVAL;
    if (::pipe2(ends, O_CLOEXEC) != 0) return -errno;
    const Fd theirs(ends[1]);
    {
        const std::lock_guard lock(self.mutex_);
        self.given_.push_back({{what, who, why, mode, true}, Fd(ends[0])});
    }
    return sd_bus_reply_method_return(message, "h", theirs.get());
}

void StandInLoginManager::run() {
    while (true) {
        {
            const std::lock_guard lock(mutex_);
            if (quit_) return;
            for (const bool begins : announcements_)
                sd_bus_emit_signal(bus_, kPath, kInterface, "PrepareForSleep", "b", static_cast<int>(begins));
            if (!announcements_.empty() && sd_bus_flush(bus_) >= 0) announced_ += announcements_.size();
            announcements_.clear();
        }
        int result = 1;
        while (result > 0) result = sd_bus_process(bus_, nullptr);
        if (result < 0) return;  // the bus has gone
        pollfd waited[] = {{sd_bus_get_fd(bus_), static_cast<short>(sd_bus_get_events(bus_)), 0},
                           {wake_.get(), POLLIN, 0}};
        ::poll(waited, 2, -1);
        eventfd_t count = 0;
        if (waited[1].revents != 0) ::eventfd_read(wake_.get(), &count);
    }
}

}  // namespace lumacast
