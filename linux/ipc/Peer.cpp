#include "linux/ipc/Peer.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/syscall.h>

namespace lumacast {

namespace {

/// SO_PEERPIDFD of newer kernels; missing from older headers.
constexpr int kSoPeerPidfd = 77;

Fd pidfdOfPeer(int socket, pid_t pid) {
    int descriptor = -1;
    socklen_t size = sizeof descriptor;
    if (getsockopt(socket, SOL_SOCKET, kSoPeerPidfd, &descriptor, &size) == 0) return Fd(descriptor);
    Fd opened(static_cast<int>(syscall(SYS_pidfd_open, pid, 0)));
    // The number may have been freed and used again before it was opened. A peer that still holds its end was there all
    // the time; one that has closed it gets no pidfd.
    pollfd look{socket, POLLRDHUP, 0};
    if (poll(&look, 1, 0) != 0) return Fd();
    return opened;
}

}  // namespace

Peer Peer::of(int socket) {
    Peer peer;
    ucred credentials{};
    socklen_t size = sizeof credentials;
    if (getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &size) != 0) return peer;
    peer.uid = credentials.uid;
    if (credentials.pid <= 0) return peer;
    peer.pid = ProcessID{credentials.pid};
    peer.pidfd = pidfdOfPeer(socket, credentials.pid);
    return peer;
}

bool Peer::isAlive() const {
    if (!pidfd) return false;
    pollfd look{pidfd.get(), POLLIN, 0};
    return poll(&look, 1, 0) == 0;
}

}  // namespace lumacast
