#include "linux/audio/ServerWatch.h"

#include <sys/inotify.h>
#include <unistd.h>

#include <array>
#include <cstdlib>
#include <cstring>
#include <string_view>

namespace lumacast::sound {

namespace {

std::string variable(const char* name) {
    const char* const value = std::getenv(name);  // nobody changes the environment of this process
    return value ? value : "";
}

/// As the library finds it, for what a user has without configuring anything.
std::string socketOf(const std::string& server) {
    const std::string named = server.empty() ? variable("PULSE_SERVER") : server;
    constexpr std::string_view kUnix = "unix:";
    if (named.starts_with('/')) return named;
    if (named.starts_with(kUnix)) return named.substr(kUnix.size());
    if (!named.empty()) return "";
    if (const std::string folder = variable("PULSE_RUNTIME_PATH"); !folder.empty()) return folder + "/native";
    const std::string folder = variable("XDG_RUNTIME_DIR");
    return folder.empty() ? "" : folder + "/pulse/native";
}

}  // namespace

ServerWatch::ServerWatch(const std::string& server) : socket_(socketOf(server)) {
    if (!socket_.starts_with('/')) return;
    events_.reset(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
    if (events_) arm();
}

/// The socket's folder, or the one in which that will be made.
void ServerWatch::arm() {
    constexpr std::uint32_t kComes = IN_CREATE | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
    std::string path = socket_;
    watched_ = -1;
    for (int above = 0; above < 2 && watched_ < 0; ++above) {
        const std::size_t slash = path.rfind('/');
        wanted_ = path.substr(slash + 1);
        path.resize(slash);
        watched_ = ::inotify_add_watch(events_.get(), path.empty() ? "/" : path.c_str(), kComes);
    }
}

void ServerWatch::rest() {
    if (watched_ >= 0) ::inotify_rm_watch(events_.get(), watched_);
    watched_ = -1;
}

void ServerWatch::resume() {
    if (!events_) return;
    readEvents();
    arm();
}

bool ServerWatch::take() {
    if (!readEvents()) return false;
    // The folder may have come, or gone.
    const int before = watched_;
    arm();
    if (before != watched_ && before >= 0) ::inotify_rm_watch(events_.get(), before);
    return true;
}

bool ServerWatch::readEvents() {
    alignas(inotify_event) std::array<char, 4096> buffer{};
    bool isOfInterest = false;
    ssize_t length = 0;
    while ((length = ::read(events_.get(), buffer.data(), buffer.size())) > 0) {
        for (const char* at = buffer.data(); at < buffer.data() + length;) {
            inotify_event event{};
            std::memcpy(&event, at, sizeof event);
            const std::string_view name = event.len > 0 ? at + sizeof event : "";
            const bool isOurDoing = (event.mask & IN_IGNORED) != 0;  // or the end of what was told before
            isOfInterest |= !isOurDoing && (name.empty() || name == wanted_);
            at += sizeof event + event.len;
        }
    }
    return isOfInterest;
}

bool ServerWatch::waitsForServer() const { return watched_ >= 0 && ::access(socket_.c_str(), F_OK) != 0; }

}  // namespace lumacast::sound
