#include "tests/fakes/FakeIpcConnection.h"

#include <cerrno>
#include <utility>

#include "tests/fakes/FakeError.h"

namespace lumacast {

class FakeIpcConnection::Proxy final : public IpcRemoteProxy {
public:
    Proxy(std::shared_ptr<FakeIpcConnection> connection, ErrorHandler errorHandler)
        : connection_(std::move(connection)), errorHandler_(std::move(errorHandler)) {}
    void send(std::uint16_t message, Array arguments, std::function<void(Array values)> reply) override {
        connection_->send(message, std::move(arguments), std::move(reply), errorHandler_);
    }

private:
    const std::shared_ptr<FakeIpcConnection> connection_;
    const ErrorHandler errorHandler_;
};

FakeIpcConnection::FakeIpcConnection(std::shared_ptr<FakeIpc::Process> process, ProcessID peerPid, bool isAccepted)
    : process_(std::move(process)), peerPid_(peerPid), isAccepted_(isAccepted) {
    if (!isAccepted_) return;
    const std::lock_guard lock(process_->machine->mutex);
    ++process_->machine->acceptedConnections;
}

FakeIpcConnection::~FakeIpcConnection() {
    for (const ErrorHandler& errorHandler : unanswered_) fail(errorHandler, EPIPE);
    for (const auto& [sequence, pending] : pending_) fail(pending.errorHandler, EPIPE);
    if (!lost_)
        if (const auto peer = peer_.lock()) peer->receive({});
    if (!isAccepted_) return;
    const std::lock_guard lock(process_->machine->mutex);
    --process_->machine->acceptedConnections;
}

void FakeIpcConnection::join(const std::shared_ptr<FakeIpcConnection>& a, const std::shared_ptr<FakeIpcConnection>& b) {
    for (const auto& [end, other] : {std::pair(a, b), std::pair(b, a)}) {
        const std::lock_guard lock(end->mutex_);
        end->peer_ = other;
        end->joined_ = true;
    }
}

void FakeIpcConnection::setExportedInterface(const Protocol& interface) {
    const std::lock_guard lock(mutex_);
    exportedInterface_ = &interface;
}

void FakeIpcConnection::setExportedObject(std::weak_ptr<IpcExportedObject> object) {
    const std::lock_guard lock(mutex_);
    exportedObject_.swap(object);
}

void FakeIpcConnection::setRemoteInterface(const Protocol& interface) {
    const std::lock_guard lock(mutex_);
    remoteInterface_ = &interface;
}

// The handlers are swapped, so that the old ones are released outside of the lock.

void FakeIpcConnection::setInterruptionHandler(Handler handler) {
    const std::lock_guard lock(mutex_);
    interruptionHandler_.swap(handler);
}

void FakeIpcConnection::setInvalidationHandler(Handler handler) {
    const std::lock_guard lock(mutex_);
    invalidationHandler_.swap(handler);
}

std::unique_ptr<IpcRemoteProxy> FakeIpcConnection::remoteProxy(ErrorHandler errorHandler) {
    return std::make_unique<Proxy>(shared_from_this(), std::move(errorHandler));
}

UserID FakeIpcConnection::userIdentifier() const {
    const std::lock_guard lock(process_->mutex);
    const auto found = process_->users.find(peerPid_);
    return found == process_->users.end() ? FakeIpc::kUser : found->second;
}

std::optional<Value> FakeIpcConnection::valueForEntitlement(std::string_view name) {
    if (process_->faults.fails("IpcConnection.valueForEntitlement")) return std::nullopt;
    const std::lock_guard lock(process_->mutex);
    const auto found = process_->grants.find({peerPid_, std::string(name)});
    return found == process_->grants.end() ? std::nullopt : std::optional(found->second);
}

void FakeIpcConnection::resume() {
    bool joined = false;
    std::size_t arrived = 0;
    {
        const std::lock_guard lock(mutex_);
        if (resumed_ || lost_) return;
        resumed_ = true;
        joined = joined_;
        arrived = incoming_.size();
    }
    if (!joined) return lose(false);
    for (; arrived > 0; --arrived)
        process_->queue->async([weak = weak_from_this()] {
            if (auto self = weak.lock()) self->deliverOne();
        });
}

void FakeIpcConnection::readOn() {
    std::size_t arrived = 0;
    {
        const std::lock_guard lock(mutex_);
        arrived = resumed_ ? incoming_.size() : 0;
    }
    for (; arrived > 0; --arrived)
        process_->queue->async([weak = weak_from_this()] {
            if (auto self = weak.lock()) self->deliverOne();
        });
}

void FakeIpcConnection::invalidate() { lose(true); }

// The end

void FakeIpcConnection::drop(const char* reason) {
    process_->log.error("IPC: connection of process %d dropped: %s", number(peerPid_), reason);
    lose(true);
}

void FakeIpcConnection::lose(bool tellPeer) {
    std::shared_ptr<FakeIpcConnection> peer;
    {
        const std::lock_guard lock(mutex_);
        if (lost_) return;
        lost_ = true;
        peer = peer_.lock();
    }
    if (tellPeer && peer) peer->receive({});
    if (process_->isAlive()) process_->queue->async([self = shared_from_this()] { self->deliverLoss(); });
}

void FakeIpcConnection::processDied() {
    std::shared_ptr<FakeIpcConnection> peer;
    std::deque<ErrorHandler> unanswered;
    std::map<std::uint64_t, Pending> pending;
    std::deque<FakeFrame> incoming;
    Leases leases;
    Handler interruption, invalidation;
    {
        const std::lock_guard lock(mutex_);
        if (lost_) return;
        lost_ = true;
        peer = peer_.lock();
        unanswered.swap(unanswered_);
        pending.swap(pending_);
        incoming.swap(incoming_);
        leases.swap(leases_);
        interruption.swap(interruptionHandler_);
        invalidation.swap(invalidationHandler_);
    }
    if (peer) peer->receive({});
}

void FakeIpcConnection::deliverLoss() {
    Handler interruption, invalidation;
    std::deque<FakeFrame> incoming;
    std::deque<ErrorHandler> unanswered;
    std::map<std::uint64_t, Pending> pending;
    Leases leases;
    {
        const std::lock_guard lock(mutex_);
        interruption.swap(interruptionHandler_);
        incoming.swap(incoming_);
        unanswered.swap(unanswered_);
        pending.swap(pending_);
        leases.swap(leases_);
    }
    leases.clear();
    incoming.clear();
    for (const ErrorHandler& errorHandler : unanswered) errorHandler(fakeSystemError(EPIPE));
    for (const auto& [sequence, waiting] : pending)
        if (waiting.errorHandler) waiting.errorHandler(fakeSystemError(EPIPE));
    {
        // Read only now: an error handler may just have replaced it.
        const std::lock_guard lock(mutex_);
        invalidation.swap(invalidationHandler_);
    }
    if (invalidation) invalidation();
    std::shared_ptr<FakeIpcConnection> owned = shared_from_this();
    {
        const std::lock_guard lock(process_->mutex);
        process_->accepted.erase(owned);
    }
}

}  // namespace lumacast
