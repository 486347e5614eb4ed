// The way out of an end: messages, replies and lent planes.

#include <cerrno>
#include <utility>

#include "base/Limits.h"
#include "tests/fakes/FakeError.h"
#include "tests/fakes/FakeIpcConnection.h"
#include "tests/fakes/FakePlane.h"

namespace lumacast {

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

void FakeIpcConnection::giveBack(std::uint64_t lease) {
    Value::PlaneRef plane;  // released after the lock
    const std::lock_guard lock(mutex_);
    const auto found = leases_.find(lease);
    if (found == leases_.end()) return;
    plane = std::move(found->second);
    leases_.erase(found);
}

}  // namespace lumacast
