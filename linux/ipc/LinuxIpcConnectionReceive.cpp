// A connection's way in: on the reactor. Nothing a peer sends is believed before it was checked.

#include <sys/epoll.h>
#include <sys/socket.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <string>
#include <utility>

#include "base/Limits.h"
#include "linux/ipc/LinuxIpcConnection.h"

namespace lumacast {

namespace {

constexpr int kFramesPerTurn = 64;
constexpr std::chrono::milliseconds kTimePerTurn{2};

/// A request's one answer, or the word that there is none: when the last copy of it goes without having been called.
IpcReply replyOnce(const std::shared_ptr<LinuxIpcConnection>& connection, std::uint64_t sequence,
                   const MessageDeclaration& declaration) {
    struct Answer {
        std::weak_ptr<LinuxIpcConnection> connection;
        std::uint64_t sequence;
        const MessageDeclaration& declaration;
        std::atomic<bool> given{false};

        Answer(std::weak_ptr<LinuxIpcConnection> theConnection, std::uint64_t theSequence,
               const MessageDeclaration& theDeclaration)
            : connection(std::move(theConnection)), sequence(theSequence), declaration(theDeclaration) {}
        Answer(const Answer&) = delete;
        Answer& operator=(const Answer&) = delete;
        ~Answer() {
            if (given) return;
            if (const auto live = connection.lock()) live->leaveUnanswered(sequence);
        }
    };
    return [answer = std::make_shared<Answer>(connection, sequence, declaration)](Array values) {
        if (answer->given.exchange(true)) return;
        if (const auto live = answer->connection.lock())
            live->reply(answer->sequence, answer->declaration, std::move(values));
    };
}

}  // namespace

void LinuxIpcConnection::awaitHello(Greeted greeted) {
    greeted_ = std::move(greeted);
    helloTimer_ = core_->reactor.after(core_->helloDeadline, [weak = weak_from_this()] {
        if (const auto self = weak.lock()) self->drop("no hello in time");
    });
    bool works = false;
    {
        const std::lock_guard lock(mutex_);
        works = startWatching();
    }
    if (!works) lose();
}

void LinuxIpcConnection::lookForHello() {
    if (!isGreeted_) turn(EPOLLIN);
}

bool LinuxIpcConnection::takeItsPlace() {
    const std::lock_guard lock(mutex_);
    return !seat_ || seat_->confirm();
}

Reactor::Again LinuxIpcConnection::turn(std::uint32_t events) {
    if (isLost()) return Reactor::Again::No;
    if (events & EPOLLOUT) flush();
    const bool isReadable = (events & ~static_cast<std::uint32_t>(EPOLLOUT)) != 0;
    if (!isGreeted_) {
        if (!isReadable || !readHello()) return Reactor::Again::No;
        helloTimer_.reset();
        core_->waitingRoom.leave(this);
        if (!greeted_) return Reactor::Again::No;
        {
            // From here on it waits for its resume.
            const std::lock_guard lock(mutex_);
            watch_.reset();
        }
        std::exchange(greeted_, nullptr)(shared_from_this());
        return Reactor::Again::No;
    }
    if (hasFramesLeft_) return readFrames();
    if (!isReadable) return Reactor::Again::No;
    switch (incoming_.receive(socket_.get(), core_->scratch)) {
        case IncomingFrames::Received::Bytes: return readFrames();
        case IncomingFrames::Received::Nothing: break;
        case IncomingFrames::Received::TooManyDescriptors: drop("a message with too many descriptors"); break;
        case IncomingFrames::Received::End: incoming_.isMidFrame() ? drop("a truncated message") : lose(); break;
    }
    return Reactor::Again::No;
}

/// Reads no more than the hello. Answers whether it is there and good.
bool LinuxIpcConnection::readHello() {
    for (;;) {
        const HelloCheck check = checkHello(hello_);
        switch (check.state) {
            case HelloState::Good: isGreeted_ = true; hello_ = Data(); return true;
            case HelloState::WrongMagic: drop("its hello is none"); return false;
            case HelloState::WrongVersion: drop("its version is " + std::to_string(check.version)); return false;
            case HelloState::TooLong: drop("its hello is too long"); return false;
            case HelloState::Incomplete: break;
        }
        // Without room for control data, descriptors sent along are closed by the kernel.
        std::array<std::uint8_t, limitOf(Limit::HelloBytes)> bytes;
        iovec part{bytes.data(), check.size - hello_.size()};
        msghdr message{};
        message.msg_iov = &part;
        message.msg_iovlen = 1;
        const ssize_t count = recvmsg(socket_.get(), &message, MSG_DONTWAIT);
        if (count < 0 && (errno == EAGAIN || errno == EINTR)) return false;
        if (message.msg_flags & MSG_CTRUNC) {
            drop("descriptors with its hello");
            return false;
        }
        if (count <= 0) {
            lose();
            return false;
        }
        hello_.insert(hello_.end(), bytes.begin(), bytes.begin() + count);
    }
}

Reactor::Again LinuxIpcConnection::readFrames() {
    const auto limit = std::chrono::steady_clock::now() + kTimePerTurn;
    hasFramesLeft_ = false;
    for (int i = 0; !isLost(); ++i) {
        if (i == kFramesPerTurn || std::chrono::steady_clock::now() >= limit) {
            hasFramesLeft_ = true;
            break;
        }
        IncomingFrames::Frame frame;
        const char* reason = nullptr;
        const IncomingFrames::Next next = incoming_.next(frame, reason);
        if (next == IncomingFrames::Next::Malformed) drop(reason);
        if (next != IncomingFrames::Next::Frame) break;
        dispatch(frame);
    }
    if (!hold(incoming_.endTurn())) drop("its user has too many unfinished messages");
    return hasFramesLeft_ ? Reactor::Again::Yes : Reactor::Again::No;
}

/// Counts `bytes` as kept for the peer, instead of what was counted before.
bool LinuxIpcConnection::hold(std::uint64_t bytes) {
    const std::uint64_t before = std::exchange(heldBytes_, bytes);
    if (!budget_ || before == bytes) return true;
    budget_->give(before);
    if (budget_->take(bytes)) return true;
    heldBytes_ = 0;
    return false;
}

void LinuxIpcConnection::dispatch(IncomingFrames::Frame& frame) {
    const char* reason = nullptr;
    switch (frame.header.kind) {
        case FrameKind::Message:
        case FrameKind::Request: reason = receiveMessage(frame); break;
        case FrameKind::Reply: reason = receiveReply(frame); break;
        case FrameKind::PlaneReturned: reason = receivePlaneReturned(frame.header); break;
        case FrameKind::NoReply: reason = receiveNoReply(frame.header); break;
        case FrameKind::ExchangeToken: reason = receiveExchange(frame); break;
        case FrameKind::TokenExchanged: reason = receiveExchanged(frame); break;
    }
    if (reason) drop(reason);
}

const char* LinuxIpcConnection::receiveMessage(IncomingFrames::Frame& frame) {
    const FrameHeader& header = frame.header;
    const bool isRequest = header.kind == FrameKind::Request;
    if (header.sequence != ++lastSequence_) return "a message out of sequence";
    const Protocol* interface = nullptr;
    std::shared_ptr<IpcExportedObject> object;
    {
        const std::lock_guard lock(mutex_);
        interface = exportedInterface_;
        object = exportedObject_.lock();
        if (isRequest && ++requestsToAnswer_ > limitOf(Limit::MessagesInFlight)) return "too many requests in flight";
    }
    if (!interface || header.message >= interface->messages.size()) return "an unknown message";
    const MessageDeclaration& declaration = interface->messages[header.message];
    if (isRequest != (declaration.reply == Reply::Expected)) return "a message whose reply is declared otherwise";
    Array arguments;
    if (const char* reason = decodeFrame(frame, weak_from_this(), arguments)) return reason;
    if (!matches(arguments, declaration.arguments)) return "a message with arguments of other types";
    const auto self = shared_from_this();
    IpcReply reply;
    if (isRequest) reply = replyOnce(self, header.sequence, declaration);
    if (!object) return nullptr;
    object->receiveMessage(self, header.message, std::move(arguments), std::move(reply));
    return nullptr;
}

const char* LinuxIpcConnection::receiveReply(IncomingFrames::Frame& frame) {
    PendingReply pending;
    {
        const std::lock_guard lock(mutex_);
        const auto found = pending_.find(frame.header.sequence);
        if (found == pending_.end()) return "a reply to nothing";
        pending = std::move(found->second);
        pending_.erase(found);
    }
    Array values;
    const char* reason = decodeFrame(frame, weak_from_this(), values);
    if (!reason && !matches(values, pending.declaration->replyValues)) reason = "a reply with values of other types";
    if (reason) {
        fail(pending.errorHandler, EBADMSG);
        return reason;
    }
    if (pending.reply) pending.reply(std::move(values));
    return nullptr;
}

const char* LinuxIpcConnection::receivePlaneReturned(const FrameHeader& header) {
    std::shared_ptr<SharedPlane> plane;
    const std::lock_guard lock(mutex_);
    const auto found = leases_.find(header.sequence);
    if (found == leases_.end()) return "a plane given back that was not lent";
    plane = std::move(found->second);
    leases_.erase(found);
    return nullptr;
}

const char* LinuxIpcConnection::receiveNoReply(const FrameHeader& header) {
    PendingReply pending;
    ErrorHandler oldest;
    {
        const std::lock_guard lock(mutex_);
        const auto found = pending_.find(header.sequence);
        if (found == pending_.end()) return "a reply to nothing";
        pending = std::move(found->second);
        pending_.erase(found);
        if (header.message == 0 && pending.errorHandler) {
            unanswered_.push_back(std::exchange(pending.errorHandler, nullptr));
            if (unanswered_.size() > limitOf(Limit::RequestsWithoutReply)) {
                oldest = std::move(unanswered_.front());
                unanswered_.pop_front();
            }
        }
    }
    fail(oldest, ENODATA);
    fail(pending.errorHandler, header.message);
    return nullptr;
}

}  // namespace lumacast
