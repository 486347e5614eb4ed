#include "linux/admin/UnixSocket.h"

#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

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

FileDescriptor streamSocket() {
    return FileDescriptor(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
}

}  // namespace

FileDescriptor listenAt(const std::string& path) {
    const auto address = addressOf(path);
    FileDescriptor socket = streamSocket();
    if (!address || !socket) return {};
    struct stat status = {};
    if (::lstat(path.c_str(), &status) == 0) {
        if (!S_ISSOCK(status.st_mode) || connectTo(path)) return {};
        ::unlink(path.c_str());
    }
    ::fchmod(socket.get(), 0600);  // before bind: the socket's file is made with these permissions
    if (::bind(socket.get(), reinterpret_cast<const sockaddr*>(&*address), sizeof *address) != 0) return {};
    if (::listen(socket.get(), kBacklog) != 0) return {};
    return socket;
}

FileDescriptor connectTo(const std::string& path) {
    const auto address = addressOf(path);
    FileDescriptor socket = streamSocket();
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
