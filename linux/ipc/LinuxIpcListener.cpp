#include "linux/ipc/LinuxIpcListener.h"

#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/socket.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <optional>
#include <utility>

#include "base/Limits.h"
#include "linux/ipc/LinuxIpcEndpoint.h"
#include "linux/calls/FileCalls.h"

namespace lumacast {

namespace {

constexpr int kAcceptsPerTurn = 16;
/// Connections that are turned away one after another get one log line, until none was for so long.
constexpr std::chrono::seconds kBurstEndsAfter{10};

int optionOf(int socket, int name) {
    int value = -1;
    socklen_t size = sizeof value;
    return getsockopt(socket, SOL_SOCKET, name, &value, &size) == 0 ? value : -1;
}

/// One ring: a stream socket, and the process that sent it.
struct Ring {
    enum { Nothing, Gone, Malformed, Good } state = Nothing;
    Fd socket;
    pid_t sender = 0;
};

void readControl(msghdr& message, Ring& ring) {
    for (cmsghdr* header = CMSG_FIRSTHDR(&message); header; header = CMSG_NXTHDR(&message, header)) {
        if (header->cmsg_level != SOL_SOCKET) continue;
        if (header->cmsg_type == SCM_RIGHTS) {
            int descriptor = -1;
            std::memcpy(&descriptor, CMSG_DATA(header), sizeof descriptor);
            ring.socket.reset(descriptor);
        } else if (header->cmsg_type == SCM_CREDENTIALS) {
            ucred credentials{};
            std::memcpy(&credentials, CMSG_DATA(header), sizeof credentials);
            ring.sender = credentials.pid;
        }
    }
}

Ring readRing(int doorbell) {
    std::array<char, 1> byte;
    iovec part{byte.data(), byte.size()};
    // Room for one descriptor; the kernel closes further ones and says so.
    alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(ucred)) + CMSG_LEN(sizeof(int))> control;
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    const ssize_t count = recvmsg(doorbell, &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
    Ring ring;
    if (count < 0 && (errno == EAGAIN || errno == EINTR)) return ring;
    ring.state = Ring::Gone;
    if (count <= 0) return ring;
    readControl(message, ring);
    ring.state = Ring::Malformed;
    if ((message.msg_flags & MSG_CTRUNC) || !ring.socket) return ring;
    if (optionOf(ring.socket.get(), SO_DOMAIN) != AF_UNIX || optionOf(ring.socket.get(), SO_TYPE) != SOCK_STREAM)
        return ring;
    // Whoever rings must have made the pair, so that nobody hands us a connection to somebody else as if it were
    // theirs.
    ucred maker{};
    socklen_t size = sizeof maker;
    if (getsockopt(ring.socket.get(), SOL_SOCKET, SO_PEERCRED, &maker, &size) != 0 || maker.pid != ring.sender)
        return ring;
    ring.state = Ring::Good;
    return ring;
}

}  // namespace

LinuxIpcListener::LinuxIpcListener(std::shared_ptr<IpcCore> core, ServiceSocket service)
    : core_(std::move(core)), service_(std::in_place, std::move(service)) {}

LinuxIpcListener::~LinuxIpcListener() {
    watch_.reset();
    // Watches end before their descriptors are closed.
    for (auto& [descriptor, doorbell] : doorbells_) doorbell.watch.reset();
}

void LinuxIpcListener::invalidate() {
    struct Ears {
        std::unique_ptr<Reactor::Watch> watch;
        std::unordered_map<int, Doorbell> doorbells;
    };
    auto ears = std::make_shared<Ears>();
    {
        const std::lock_guard lock(mutex_);
        isInvalid_ = true;
        ears->watch.swap(watch_);
        ears->doorbells.swap(doorbells_);
    }
    // Closed on the reactor, which may be reading from them now. So is the name: who calls it is refused at once.
    core_->reactor.async([self = shared_from_this(), ears] {
        ears->watch.reset();
        self->service_.reset();
        for (auto& [descriptor, doorbell] : ears->doorbells) doorbell.watch.reset();
    });
}

void LinuxIpcListener::setDelegate(std::weak_ptr<IpcListenerDelegate> delegate) {
    const std::lock_guard lock(mutex_);
    delegate_.swap(delegate);
}

void LinuxIpcListener::resume() {
    const std::lock_guard lock(mutex_);
    if (isResumed_ || isInvalid_) return;
    isResumed_ = true;
    if (service_ && service_->descriptor() >= 0) {
        watch_ = core_->reactor.watch(service_->descriptor(), EPOLLIN, [weak = weak_from_this()](std::uint32_t) {
            const auto self = weak.lock();
            return self ? self->acceptFromService() : Reactor::Again::No;
        });
        if (!watch_) {
            core_->log.error("IPC: a service's socket can't be waited for: error %d", errno);
            if (core_->serviceUnavailable) core_->serviceUnavailable();
        }
    }
    for (auto& [descriptor, doorbell] : doorbells_) watchDoorbellLocked(doorbell);
}

std::shared_ptr<IpcEndpoint> LinuxIpcListener::endpoint() {
    std::array<int, 2> ends{-1, -1};
    if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends.data()) != 0)
        core_->log.error("IPC: an endpoint can't be made: error %d", errno);
    auto result = std::make_shared<LinuxIpcEndpoint>(Fd(ends[0]));
    Doorbell doorbell{Fd(ends[1]), nullptr};
    if (!doorbell.socket) return result;
    const int on = 1;
    setsockopt(doorbell.socket.get(), SOL_SOCKET, SO_PASSCRED, &on, sizeof on);
    const std::lock_guard lock(mutex_);
    if (isInvalid_) return result;
    if (isResumed_) watchDoorbellLocked(doorbell);
    doorbells_.emplace(ends[1], std::move(doorbell));
    return result;
}

void LinuxIpcListener::watchDoorbellLocked(Doorbell& doorbell) {
    const int descriptor = doorbell.socket.get();
    doorbell.watch = core_->reactor.watch(descriptor, EPOLLIN, [weak = weak_from_this(), descriptor](std::uint32_t) {
        const auto self = weak.lock();
        return self ? self->acceptFromDoorbell(descriptor) : Reactor::Again::No;
    });
}

Reactor::Again LinuxIpcListener::acceptFromService() {
    for (int i = 0; i < kAcceptsPerTurn; ++i) {
        Fd socket(accept4(service_->descriptor(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
        if (socket) {
            admit(std::move(socket));
        } else if (errno == EMFILE || errno == ENFILE) {
            refuseForLackOfDescriptors();
            break;
        } else if (errno != EINTR && errno != ECONNABORTED) {
            break;
        }
    }
    return Reactor::Again::No;
}

/// Without this the connection would stay at the door and keep the loop awake for nothing.
void LinuxIpcListener::refuseForLackOfDescriptors() {
    core_->spare.reset();
    Fd refused(accept4(service_->descriptor(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
    if (refused && core_->noDescriptorLeft.begins(std::chrono::steady_clock::now(), kBurstEndsAfter))
        core_->log.error("IPC: a connection was refused: no descriptor is left");
    refused.reset();
    core_->spare.reset(open("/dev/null", O_RDONLY | O_CLOEXEC));
}

Reactor::Again LinuxIpcListener::acceptFromDoorbell(int descriptor) {
    for (int i = 0; i < kAcceptsPerTurn; ++i) {
        Ring ring = readRing(descriptor);
        if (ring.state == Ring::Nothing) break;
        if (ring.state == Ring::Good) {
            admit(std::move(ring.socket));
            continue;
        }
        if (ring.state == Ring::Malformed)
            core_->log.error("IPC: an endpoint was closed: process %d sent something else than a connection",
                             ring.sender);
        // Nobody holds the other end any more, or somebody who misuses it.
        const std::lock_guard lock(mutex_);
        const auto found = doorbells_.find(descriptor);
        if (found == doorbells_.end()) break;
        found->second.watch.reset();
        doorbells_.erase(found);
        break;
    }
    return Reactor::Again::No;
}

void LinuxIpcListener::admit(Fd socket) {
    Peer peer = Peer::of(socket.get());
    std::optional<UserTable::Seat> seat = core_->users->take(peer.uid);
    if (!seat) return sayUserIsFull(peer.pid, peer.uid);
    const uid_t user = peer.uid;
    const ProcessID process = peer.pid;
    auto connection =
        std::make_shared<LinuxIpcConnection>(core_, std::move(socket), std::move(peer), std::move(seat));
    core_->own(connection);
    core_->waitingRoom.enter(connection, user, process);
    connection->sendHello();
    connection->awaitHello([weak = weak_from_this(), user](const std::shared_ptr<LinuxIpcConnection>& greeted) {
        const auto self = weak.lock();
        if (!self) return greeted->invalidate();
        if (greeted->takeItsPlace()) return self->ask(greeted);
        self->sayUserIsFull(greeted->processIdentifier(), user);
        greeted->invalidate();
    });
    makeRoomForTheSilent(user);
}

void LinuxIpcListener::sayUserIsFull(ProcessID process, uid_t user) {
    if (!core_->userFull.begins(std::chrono::steady_clock::now(), kBurstEndsAfter)) return;
    core_->log.error("IPC: connection of process %d refused: user %u has too many", number(process), user);
}

/// So that connections that say nothing never keep others out.
void LinuxIpcListener::makeRoomForTheSilent(uid_t user) {
    WaitingRoom& room = core_->waitingRoom;
    while (room.countOf(user) > limitOf(Limit::ConnectionsBeforeHello)) {
        const auto first = room.firstToGo(user);
        if (!first) return;
        first->lookForHello();  // it may be there, and only not have been read
        if (!room.holds(first.get())) continue;
        room.leave(first.get());
        if (core_->silentDropped.begins(std::chrono::steady_clock::now(), kBurstEndsAfter))
            core_->log.error("IPC: connection of process %d dropped: user %u has too many without a hello",
                             number(first->processIdentifier()), user);
        first->invalidate();
    }
}

void LinuxIpcListener::ask(const std::shared_ptr<LinuxIpcConnection>& connection) {
    std::shared_ptr<IpcListenerDelegate> delegate;
    {
        const std::lock_guard lock(mutex_);
        if (!isInvalid_) delegate = delegate_.lock();
    }
    if (!delegate || !delegate->listenerShouldAcceptNewConnection(*this, connection)) connection->invalidate();
}

EndpointCall ringEndpoint(const IpcEndpoint& endpoint) {
    EndpointCall call;
    const auto* ours = dynamic_cast<const LinuxIpcEndpoint*>(&endpoint);
    if (!ours) return call;
    call.peer = Peer::of(ours->descriptor());
    std::array<int, 2> ends{-1, -1};
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends.data()) != 0) return call;
    call.socket = Fd(ends[0]);
    const Fd theirs(ends[1]);
    char byte = 0;
    iovec part{&byte, 1};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int))> control{};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    cmsghdr* header = CMSG_FIRSTHDR(&message);
    header->cmsg_level = SOL_SOCKET;
    header->cmsg_type = SCM_RIGHTS;
    header->cmsg_len = CMSG_LEN(sizeof(int));
    std::memcpy(CMSG_DATA(header), &ends[1], sizeof(int));
    if (calls::sendMessage(ours->descriptor(), message, MSG_DONTWAIT | MSG_NOSIGNAL) < 0) call.socket.reset();
    return call;
}

}  // namespace lumacast
