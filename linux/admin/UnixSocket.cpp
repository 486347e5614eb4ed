#include "linux/admin/UnixSocket.h"

#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <utility>

namespace lumacast {

namespace {

constexpr int kBacklog = 16;

std::optional<sockaddr_un> addressOf(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.empty() || path.size() >= sizeof address.sun_path) return std::nullopt;
    std::copy(path.begin(), path.end(), address.sun_path);
    return address;
}

Fd streamSocket() {
    return Fd(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
}

}  // namespace

Fd listenAt(const std::string& path) {
    std::string reason;
    return listenAt(path, reason);
}

Fd listenAt(const std::string& path, std::string& reason) {
    const auto refuse = [&](std::string why) {
        reason = std::move(why);
        return Fd();
    };
    const auto address = addressOf(path);
    if (!address) return refuse("its path is too long");
    Fd socket = streamSocket();
    if (!socket) return refuse("no socket can be made");
    struct stat status = {};
    if (::lstat(path.c_str(), &status) == 0) {
        if (!S_ISSOCK(status.st_mode)) return refuse("something else lies at its path");
        if (connectTo(path) || errno == EAGAIN) return refuse("another process serves it");
        ::unlink(path.c_str());
    }
    ::fchmod(socket.get(), 0600);  // before bind: the socket's file is made with these permissions
    if (::bind(socket.get(), reinterpret_cast<const sockaddr*>(&*address), sizeof *address) != 0)
        return refuse("its socket can't be bound: error " + std::to_string(errno));
    if (::listen(socket.get(), kBacklog) != 0) return refuse("its socket can't listen: error " + std::to_string(errno));
    return socket;
}

Fd connectTo(const std::string& path) {
    const auto address = addressOf(path);
    Fd socket = streamSocket();
    if (!address || !socket) return {};
    if (::connect(socket.get(), reinterpret_cast<const sockaddr*>(&*address), sizeof *address) == 0) return socket;
    const int error = errno;
    socket.reset();
    errno = error;
    return {};
}

std::optional<uid_t> peerUser(int socket) {
    ucred credentials{};
    socklen_t length = sizeof credentials;
    if (::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &length) != 0) return std::nullopt;
    return credentials.uid;
}

}  // namespace lumacast
