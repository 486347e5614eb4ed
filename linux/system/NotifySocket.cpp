#include "linux/system/NotifySocket.h"

#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <cstddef>

namespace lumacast {

NotifySocket::NotifySocket(const std::string& address) : address_(address) {
    const bool usable = (address.starts_with('/') || (address.starts_with('@') && address.size() > 1)) &&
                        address.size() < sizeof(sockaddr_un::sun_path);
    if (usable) socket_.reset(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
}

bool NotifySocket::send(std::string_view lines) const {
    if (!socket_) return false;
    sockaddr_un to{};
    to.sun_family = AF_UNIX;
    std::copy(address_.begin(), address_.end(), to.sun_path);
    if (address_.front() == '@') to.sun_path[0] = '\0';
    const auto length = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + address_.size());
    const ssize_t sent = ::sendto(socket_.get(), lines.data(), lines.size(), MSG_DONTWAIT | MSG_NOSIGNAL,
                                  reinterpret_cast<const sockaddr*>(&to), length);
    return sent == static_cast<ssize_t>(lines.size());
}

}  // namespace lumacast
