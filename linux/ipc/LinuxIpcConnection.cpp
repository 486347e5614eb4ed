// A connection's configuration and its end.

#include "linux/ipc/LinuxIpcConnection.h"

#include <sys/epoll.h>
#include <sys/socket.h>

#include <cerrno>

namespace lumacast {

namespace {

class LinuxIpcRemoteProxy final : public IpcRemoteProxy {
public:
    LinuxIpcRemoteProxy(std::shared_ptr<LinuxIpcConnection> connection, IpcConnection::ErrorHandler errorHandler)
        : connection_(std::move(connection)), errorHandler_(std::move(errorHandler)) {}

    void send(std::uint16_t message, Array arguments, std::function<void(Array values)> reply) override {
        connection_->send(message, std::move(arguments), std::move(reply), errorHandler_);
    }

private:
    const std::shared_ptr<LinuxIpcConnection> connection_;
    const IpcConnection::ErrorHandler errorHandler_;
};

}  // namespace

LinuxIpcConnection::LinuxIpcConnection(std::shared_ptr<IpcCore> core, Fd socket, Peer peer,
                                       std::optional<UserTable::Seat> seat)
    : core_(std::move(core)),
      peer_(std::move(peer)),
      budget_(seat ? seat->budget() : nullptr),
      socket_(std::move(socket)),
      outgoing_(budget_) {
    if (seat) seat_.emplace(std::move(*seat));
}

LinuxIpcConnection::~LinuxIpcConnection() {
    watch_.reset();
    if (budget_) budget_->give(heldBytes_);
    for (const ErrorHandler& errorHandler : unanswered_) fail(errorHandler, EPIPE);
    for (auto& [sequence, pending] : pending_) fail(pending.errorHandler, EPIPE);
    for (auto& [sequence, handler] : exchanges_) failExchange(std::move(handler), EPIPE);
    for (OutgoingFrame& frame : outgoing_.takeAll()) fail(frame.onLost, EPIPE);
}

void LinuxIpcConnection::setExportedInterface(const Protocol& interface) {
    const std::lock_guard lock(mutex_);
    exportedInterface_ = &interface;
}

void LinuxIpcConnection::setExportedObject(std::weak_ptr<IpcExportedObject> object) {
    const std::lock_guard lock(mutex_);
    exportedObject_.swap(object);
}

void LinuxIpcConnection::setRemoteInterface(const Protocol& interface) {
    const std::lock_guard lock(mutex_);
    remoteInterface_ = &interface;
}

void LinuxIpcConnection::setInterruptionHandler(Handler handler) {
    const std::lock_guard lock(mutex_);
    interruptionHandler_.swap(handler);
}

void LinuxIpcConnection::setInvalidationHandler(Handler handler) {
    const std::lock_guard lock(mutex_);
    invalidationHandler_.swap(handler);
}

std::unique_ptr<IpcRemoteProxy> LinuxIpcConnection::remoteProxy(ErrorHandler errorHandler) {
    return std::make_unique<LinuxIpcRemoteProxy>(shared_from_this(), std::move(errorHandler));
}

std::optional<Value> LinuxIpcConnection::valueForEntitlement(std::string_view name) {
    if (!core_->entitlements || !peer_.isAlive()) return std::nullopt;
    std::optional<Value> value = core_->entitlements(peer_.pid, name);
    // Looked up by number: it counts only if the process was there all the time.
    if (!peer_.isAlive()) return std::nullopt;
    return value;
}

void LinuxIpcConnection::resume() {
    bool works = false;
    {
        const std::lock_guard lock(mutex_);
        if (state_ != State::Suspended) return;
        works = startWatching();
        if (works) state_ = State::Open;
    }
    if (!works) lose();
}

bool LinuxIpcConnection::startWatching() {
    if (!socket_) return false;
    const std::uint32_t wait = outgoing_.empty() ? 0u : static_cast<std::uint32_t>(EPOLLOUT);
    watch_ = core_->reactor.watch(socket_.get(), EPOLLIN | EPOLLRDHUP | wait, [weak = weak_from_this()](auto events) {
        const auto self = weak.lock();
        return self ? self->turn(events) : Reactor::Again::No;
    });
    return watch_ != nullptr;
}

void LinuxIpcConnection::invalidate() { lose(); }

bool LinuxIpcConnection::isLost() {
    const std::lock_guard lock(mutex_);
    return state_ == State::Lost;
}

void LinuxIpcConnection::drop(std::string_view reason) {
    if (!isLost()) core_->log.error("IPC: connection of process %d dropped: %s", number(peer_.pid), reason);
    lose();
}

void LinuxIpcConnection::lose() {
    std::vector<OutgoingFrame> done;
    const std::lock_guard lock(mutex_);
    if (state_ == State::Lost) return;
    state_ = State::Lost;
    watch_.reset();
    if (socket_) {
        // What was sent before still goes, as far as the peer has room for it. The reactor may be reading at this
        // moment, so the descriptor itself is closed there.
        outgoing_.flush(socket_.get(), done);
        shutdown(socket_.get(), SHUT_RDWR);
    }
    core_->reactor.async([self = shared_from_this()] { self->deliverLoss(); });
}

void LinuxIpcConnection::deliverLoss() {
    Fd socket;
    std::optional<UserTable::Seat> seat;
    Handler interruption, invalidation;
    std::deque<OutgoingFrame> unsent;
    std::deque<ErrorHandler> unanswered;
    std::unordered_map<std::uint64_t, PendingReply> pending;
    std::unordered_map<std::uint64_t, std::shared_ptr<SharedPlane>> leases;
    std::unordered_map<std::uint64_t, FileHandler> exchanges;
    std::shared_ptr<TokenKeeper> keeper;
    {
        const std::lock_guard lock(mutex_);
        exchanges.swap(exchanges_);
        keeper.swap(tokenKeeper_);
        socket = std::move(socket_);
        if (seat_) seat.emplace(std::move(*seat_));
        seat_.reset();
        interruption.swap(interruptionHandler_);
        unsent = outgoing_.takeAll();
        unanswered.swap(unanswered_);
        pending.swap(pending_);
        leases.swap(leases_);
    }
    socket.reset();
    seat.reset();
    leases.clear();
    incoming_ = IncomingFrames();
    [[maybe_unused]] const bool given = hold(0);
    helloTimer_.reset();
    core_->waitingRoom.leave(this);
    greeted_ = nullptr;
    const Error error(std::string(kSystemErrorDomain), EPIPE);
    for (const ErrorHandler& errorHandler : unanswered) errorHandler(error);
    for (auto& [sequence, waiting] : pending)
        if (waiting.errorHandler) waiting.errorHandler(error);
    for (auto& [sequence, handler] : exchanges) handler(Fd(), error);
    for (OutgoingFrame& frame : unsent)
        if (frame.onLost) frame.onLost(error);
    {
        // Read only now: an error handler may just have replaced it.
        const std::lock_guard lock(mutex_);
        invalidation.swap(invalidationHandler_);
    }
    if (invalidation) invalidation();
    core_->release(this);
}

}  // namespace lumacast
