#include "tests/fakes/FakeIpcConnection.h"

#include <atomic>
#include <cerrno>
#include <utility>

#include "base/Limits.h"
#include "tests/fakes/FakeError.h"
#include "tests/fakes/FakePlane.h"

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

/// A plane as the receiver holds it: a picture of its own, and a lease that is given back with it.
class FakeIpcConnection::LentPlane final : public SharedPlane {
public:
    LentPlane(const SharedPlane& plane, std::weak_ptr<FakeIpcConnection> lender, std::uint64_t lease)
        : width_(plane.width()),
          height_(plane.height()),
          stride_(plane.stride()),
          pictureNumber_(plane.pictureNumber()),
          damage_(plane.damage().begin(), plane.damage().end()),
          lender_(std::move(lender)),
          lease_(lease) {
        const auto* fake = dynamic_cast<const FakePlane*>(&plane);
        pixels_ = fake
                      ? fake->sharedPixels()
                      : std::make_shared<const std::vector<std::uint8_t>>(plane.pixels().begin(), plane.pixels().end());
    }
    ~LentPlane() override {
        if (const auto lender = lender_.lock()) lender->giveBack(lease_);
    }
    std::int32_t width() const override { return width_; }
    std::int32_t height() const override { return height_; }
    std::size_t stride() const override { return stride_; }
    std::span<const std::uint8_t> pixels() const override { return *pixels_; }
    std::span<const PixelRect> damage() const override { return damage_; }
    std::uint64_t pictureNumber() const override { return pictureNumber_; }
    int descriptor() const override { return -1; }

private:
    const std::int32_t width_, height_;
    const std::size_t stride_;
    const std::uint64_t pictureNumber_;
    const std::vector<PixelRect> damage_;
    FakePlane::Pixels pixels_;
    const std::weak_ptr<FakeIpcConnection> lender_;
    const std::uint64_t lease_;
};

/// A request's one answer, or the word that there is none.
class FakeIpcConnection::Answer {
public:
    Answer(std::weak_ptr<FakeIpcConnection> connection, std::uint64_t sequence, const MessageDeclaration& declaration)
        : connection_(std::move(connection)), sequence_(sequence), declaration_(declaration) {}
    Answer(const Answer&) = delete;
    Answer& operator=(const Answer&) = delete;
    ~Answer() {
        if (given_) return;
        const auto live = connection_.lock();
        if (live && live->finishRequest()) live->giveNoReply(sequence_, 0);
    }
    void give(Array values) {
        const auto live = connection_.lock();
        if (given_.exchange(true)) {
            if (live) live->noteSecondAnswer();
            return;
        }
        if (live && live->finishRequest()) live->reply(sequence_, declaration_, std::move(values));
    }

private:
    const std::weak_ptr<FakeIpcConnection> connection_;
    const std::uint64_t sequence_;
    const MessageDeclaration& declaration_;
    std::atomic<bool> given_{false};
};

FakeIpcConnection::FakeIpcConnection(std::shared_ptr<FakeIpc::Process> process, ProcessID peerPid, bool isAccepted)
    : process_(std::move(process)), peerPid_(peerPid), isAccepted_(isAccepted) {
    if (!isAccepted_) return;
    const std::lock_guard lock(process_->machine->mutex);
    ++process_->machine->acceptedConnections;
}

void FakeIpcConnection::noteSecondAnswer() {
    const std::lock_guard lock(process_->machine->mutex);
    ++process_->machine->secondAnswers[process_->pid];
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

// The way out

void FakeIpcConnection::fail(const ErrorHandler& errorHandler, int error) {
    if (!errorHandler || !process_->isAlive()) return;
    process_->queue->async([errorHandler, error] { errorHandler(fakeSystemError(error)); });
}

void FakeIpcConnection::send(std::uint16_t message, Array arguments, std::function<void(Array)> reply,
                             ErrorHandler errorHandler) {
    const Protocol* interface = nullptr;
    {
        const std::lock_guard lock(mutex_);
        interface = remoteInterface_;
    }
    if (!interface || message >= interface->messages.size()) return fail(errorHandler, EINVAL);
    const MessageDeclaration& declaration = interface->messages[message];
    const bool wantsReply = declaration.reply == Reply::Expected;
    if ((reply && !wantsReply) || !matches(arguments, declaration.arguments)) return fail(errorHandler, EINVAL);
    if (process_->faults.fails("Ipc.send")) return fail(errorHandler, ENOBUFS);
    FakeFrame frame;
    frame.kind = wantsReply ? FakeFrame::Kind::Request : FakeFrame::Kind::Message;
    frame.message = message;
    int error = pack(std::move(arguments), frame);
    Pending pending{&declaration, std::move(reply), errorHandler};
    if (error == 0) error = commit(frame, pending);
    if (error != 0) fail(errorHandler, error);
}

int FakeIpcConnection::pack(Array values, FakeFrame& frame) {
    return encode(Value(std::move(values)), frame.body) ? 0 : EMSGSIZE;
}

/// Notes the leases and the reply that is waited for, and sends. Answers 0, or why it can't be delivered.
int FakeIpcConnection::commit(FakeFrame& frame, Pending& pending) {
    std::vector<std::uint64_t> leases;
    {
        const std::lock_guard lock(mutex_);
        const bool isRequest = frame.kind == FakeFrame::Kind::Request;
        if (lost_ || !joined_) return EPIPE;
        if (isRequest && pending_.size() >= limitOf(Limit::MessagesInFlight)) return EAGAIN;
        std::size_t planes = 0;
        for (const Value& handle : frame.body.handles) planes += handle.as<Value::PlaneRef>() ? 1 : 0;
        if (planes > 0 && leases_.size() + planes > limitOf(Limit::PlanesLeased)) return EAGAIN;
        for (Value& handle : frame.body.handles) {
            const auto* plane = handle.as<Value::PlaneRef>();
            if (!plane) continue;
            const std::uint64_t lease = nextLease_++;
            auto lent = std::make_shared<LentPlane>(**plane, weak_from_this(), lease);
            leases_.emplace(lease, *plane);
            leases.push_back(lease);
            handle = Value(Value::PlaneRef(std::move(lent)));
        }
        if (isRequest) {
            frame.sequence = nextSequence_++;
            pending_.emplace(frame.sequence, pending);
        }
    }
    const std::uint64_t sequence = frame.sequence;
    const bool isRequest = frame.kind == FakeFrame::Kind::Request;
    if (give(std::move(frame))) return 0;
    const std::lock_guard lock(mutex_);
    for (const std::uint64_t lease : leases) leases_.erase(lease);
    if (isRequest) pending_.erase(sequence);
    return ENOBUFS;
}

/// False when the peer has too much waiting. A peer that has gone takes everything: its end is on its way here.
bool FakeIpcConnection::give(FakeFrame frame) {
    std::shared_ptr<FakeIpcConnection> peer;
    {
        const std::lock_guard lock(mutex_);
        peer = peer_.lock();
    }
    return !peer || peer->receive(std::move(frame));
}

void FakeIpcConnection::sendRaw(std::uint16_t message, Data bytes, bool asRequest) {
    FakeFrame frame;
    frame.kind = asRequest ? FakeFrame::Kind::Request : FakeFrame::Kind::Message;
    frame.message = message;
    frame.body.bytes = std::move(bytes);
    give(std::move(frame));
}

void FakeIpcConnection::reply(std::uint64_t sequence, const MessageDeclaration& declaration, Array values) {
    FakeFrame frame;
    frame.kind = FakeFrame::Kind::Reply;
    frame.sequence = sequence;
    int error = matches(values, declaration.replyValues) ? pack(std::move(values), frame) : EINVAL;
    Pending nobody;
    if (error == 0) error = commit(frame, nobody);
    if (error == 0 || error == EPIPE) return;
    if (error == ENOBUFS) return drop("it does not read its replies");
    giveNoReply(sequence, error);
}

void FakeIpcConnection::giveNoReply(std::uint64_t sequence, int error) {
    FakeFrame frame;
    frame.kind = FakeFrame::Kind::NoReply;
    frame.sequence = sequence;
    frame.error = error;
    give(std::move(frame));
}

/// One of the peer's requests is in flight no more. False when nobody is there any more to be told.
bool FakeIpcConnection::finishRequest() {
    const std::lock_guard lock(mutex_);
    if (lost_) return false;
    --requestsToAnswer_;
    return true;
}

void FakeIpcConnection::giveBack(std::uint64_t lease) {
    Value::PlaneRef plane;  // released after the lock
    const std::lock_guard lock(mutex_);
    const auto found = leases_.find(lease);
    if (found == leases_.end()) return;
    plane = std::move(found->second);
    leases_.erase(found);
}

// The way in

bool FakeIpcConnection::receive(FakeFrame frame) {
    {
        const std::lock_guard lock(mutex_);
        if (lost_) return true;
        if (frame.kind != FakeFrame::Kind::End &&
            incomingBytes_ + frame.body.bytes.size() > limitOf(Limit::QueuedBytesPerReader))
            return false;
        incomingBytes_ += frame.body.bytes.size();
        incoming_.push_back(std::move(frame));
        if (!resumed_) return true;
    }
    process_->queue->async([weak = weak_from_this()] { if (auto self = weak.lock()) self->deliverOne(); });
    return true;
}

void FakeIpcConnection::deliverOne() {
    if (!process_->isReading()) return;  // readOn asks again
    FakeFrame frame;
    {
        const std::lock_guard lock(mutex_);
        if (lost_ || !resumed_ || incoming_.empty()) return;
        frame = std::move(incoming_.front());
        incoming_.pop_front();
        incomingBytes_ -= frame.body.bytes.size();
    }
    dispatch(std::move(frame));
}

void FakeIpcConnection::dispatch(FakeFrame frame) {
    const char* reason = nullptr;
    switch (frame.kind) {
        case FakeFrame::Kind::Message:
        case FakeFrame::Kind::Request: reason = dispatchMessage(frame); break;
        case FakeFrame::Kind::Reply:
        case FakeFrame::Kind::NoReply: reason = dispatchReply(frame); break;
        case FakeFrame::Kind::End: lose(false); break;
    }
    if (reason) drop(reason);
}

const char* FakeIpcConnection::dispatchMessage(FakeFrame& frame) {
    const Protocol* interface = nullptr;
    std::shared_ptr<IpcExportedObject> object;
    const bool isRequest = frame.kind == FakeFrame::Kind::Request;
    {
        const std::lock_guard lock(mutex_);
        interface = exportedInterface_;
        object = exportedObject_.lock();
        if (isRequest && ++requestsToAnswer_ > limitOf(Limit::MessagesInFlight)) return "too many requests in flight";
    }
    if (!interface || frame.message >= interface->messages.size()) return "an unknown message";
    const MessageDeclaration& declaration = interface->messages[frame.message];
    if (isRequest != (declaration.reply == Reply::Expected)) return "a message whose reply is declared otherwise";
    std::optional<Value> decoded = decode(frame.body.bytes, frame.body.handles);
    const Array* arguments = decoded ? decoded->as<Array>() : nullptr;
    if (!arguments) return "a malformed message";
    if (!matches(*arguments, declaration.arguments)) return "a message with arguments of other types";
    IpcReply answer;
    if (isRequest)
        answer = [shared = std::make_shared<Answer>(weak_from_this(), frame.sequence, declaration)](Array values) {
            shared->give(std::move(values));
        };
    if (!object) return nullptr;
    Array taken = *arguments;
    frame.body = {};
    decoded.reset();
    object->receiveMessage(shared_from_this(), frame.message, std::move(taken), std::move(answer));
    return nullptr;
}

const char* FakeIpcConnection::dispatchReply(FakeFrame& frame) {
    Pending pending;
    {
        const std::lock_guard lock(mutex_);
        const auto found = pending_.find(frame.sequence);
        if (found == pending_.end()) return "a reply to nothing";
        pending = std::move(found->second);
        pending_.erase(found);
    }
    if (frame.kind == FakeFrame::Kind::NoReply) {
        if (frame.error != 0) fail(pending.errorHandler, frame.error);
        else leaveUnanswered(std::move(pending.errorHandler));
        return nullptr;
    }
    const std::optional<Value> decoded = decode(frame.body.bytes, frame.body.handles);
    const Array* values = decoded ? decoded->as<Array>() : nullptr;
    if (!values || !matches(*values, pending.declaration->replyValues)) {
        fail(pending.errorHandler, EBADMSG);
        return "a reply with values of other types";
    }
    if (pending.reply) pending.reply(*values);
    return nullptr;
}

void FakeIpcConnection::leaveUnanswered(ErrorHandler errorHandler) {
    if (!errorHandler) return;
    ErrorHandler oldest;
    {
        const std::lock_guard lock(mutex_);
        unanswered_.push_back(std::move(errorHandler));
        if (unanswered_.size() <= limitOf(Limit::RequestsWithoutReply)) return;
        oldest = std::move(unanswered_.front());
        unanswered_.pop_front();
    }
    fail(oldest, ENODATA);
}

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
