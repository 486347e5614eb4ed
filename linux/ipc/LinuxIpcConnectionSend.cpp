// A connection's way out: called on any lane, never blocks.

#include <sys/epoll.h>
#include <sys/socket.h>

#include <cerrno>
#include <utility>

#include "base/Limits.h"
#include "linux/ipc/LinuxIpcConnection.h"

namespace lumacast {

void LinuxIpcConnection::fail(const ErrorHandler& errorHandler, int error) {
    if (!errorHandler) return;
    core_->reactor.async([errorHandler, error] { errorHandler(Error(std::string(kSystemErrorDomain), error)); });
}

void LinuxIpcConnection::send(std::uint16_t message, Array arguments, ReplyHandler reply, ErrorHandler errorHandler) {
    const Protocol* interface = nullptr;
    {
        const std::lock_guard lock(mutex_);
        interface = remoteInterface_;
    }
    if (!interface || message >= interface->messages.size()) return fail(errorHandler, EINVAL);
    const MessageDeclaration& declaration = interface->messages[message];
    const bool wantsReply = declaration.reply == Reply::Expected;
    if ((reply && !wantsReply) || !matches(arguments, declaration.arguments)) return fail(errorHandler, EINVAL);

    EncodedFrame encoded;
    int error = encodeFrame(
        wantsReply ? FrameKind::Request : FrameKind::Message, message, arguments, [this] { return nextLease_++; },
        encoded);
    PendingReply pending{&declaration, std::move(reply), std::move(errorHandler)};
    if (error == 0) error = commit(encoded, pending);
    if (error != 0) fail(pending.errorHandler, error);
}

/// Numbers the frame and hands it to the kernel or the queue. Answers 0, or why it can't be delivered; then `encoded`
/// and `pending` are the caller's still.
int LinuxIpcConnection::commit(EncodedFrame& encoded, PendingReply& pending) {
    const bool isRequest = encoded.header.kind == FrameKind::Request;
    const bool isNumbered = encoded.header.kind != FrameKind::Reply;
    const std::lock_guard lock(mutex_);
    if (state_ == State::Lost || !socket_) return EPIPE;
    if (isRequest && pending_.size() >= limitOf(Limit::MessagesInFlight)) return EAGAIN;
    if (!encoded.leases.empty() && leases_.size() + encoded.leases.size() > limitOf(Limit::PlanesLeased)) return EAGAIN;
    if (isNumbered) encoded.header.sequence = nextSequence_;
    writeFrameHeader(encoded.header, encoded.frame.bytes);
    if (!isRequest) encoded.frame.onLost.swap(pending.errorHandler);
    const OutgoingQueue::Result result = outgoing_.send(socket_.get(), encoded.frame);
    if (result == OutgoingQueue::Result::Full || result == OutgoingQueue::Result::Broken) {
        if (!isRequest) encoded.frame.onLost.swap(pending.errorHandler);
        if (result == OutgoingQueue::Result::Broken) sayNoMoreLocked();
        return result == OutgoingQueue::Result::Full ? ENOBUFS : EPIPE;
    }
    if (result == OutgoingQueue::Result::Queued) waitForRoomLocked();
    if (isNumbered) ++nextSequence_;
    if (isRequest) pending_.emplace(encoded.header.sequence, std::move(pending));
    for (Lease& lease : encoded.leases) leases_.emplace(lease.number, std::move(lease.plane));
    return 0;
}

/// One of the peer's requests is in flight no more. False when nobody is there any more to be told.
bool LinuxIpcConnection::finishRequest() {
    const std::lock_guard lock(mutex_);
    if (state_ == State::Lost) return false;
    --requestsToAnswer_;
    return true;
}

void LinuxIpcConnection::leaveUnanswered(std::uint64_t sequence) {
    if (finishRequest()) sendTransport(FrameKind::NoReply, sequence, 0);
}

void LinuxIpcConnection::reply(std::uint64_t sequence, const MessageDeclaration& declaration, Array values) {
    if (!finishRequest()) return;
    int error = EINVAL;
    EncodedFrame encoded;
    if (matches(values, declaration.replyValues)) {
        error = encodeFrame(FrameKind::Reply, 0, values, [this] { return nextLease_++; }, encoded);
        encoded.header.sequence = sequence;
        PendingReply nobody{};
        if (error == 0) error = commit(encoded, nobody);
        if (error == 0) return;
    }
    if (error == EPIPE) return;
    if (error == ENOBUFS) return drop("it does not read its replies");
    core_->log.error("IPC: reply of %s to process %d can't be sent: error %d", declaration.name, number(peer_.pid),
                     error);
    sendTransport(FrameKind::NoReply, sequence, static_cast<std::uint16_t>(error));
}

void LinuxIpcConnection::giveBack(std::uint64_t lease) { sendTransport(FrameKind::PlaneReturned, lease, 0); }

void LinuxIpcConnection::sendTransport(FrameKind kind, std::uint64_t sequence, std::uint16_t number) {
    FrameHeader header;
    header.kind = kind;
    header.message = number;
    header.sequence = sequence;
    OutgoingFrame frame;
    frame.bytes.resize(kFrameHeaderBytes);
    writeFrameHeader(header, frame.bytes);
    sendOrLose(frame);
}

void LinuxIpcConnection::sendHello() {
    OutgoingFrame frame;
    frame.bytes = makeHello();
    sendOrLose(frame);
}

void LinuxIpcConnection::sendOrLose(OutgoingFrame& frame) {
    {
        const std::lock_guard lock(mutex_);
        if (state_ == State::Lost || !socket_) return;
        const auto result = outgoing_.send(socket_.get(), frame);
        if (result == OutgoingQueue::Result::Queued) waitForRoomLocked();
        if (result == OutgoingQueue::Result::Broken) sayNoMoreLocked();
        if (result != OutgoingQueue::Result::Full) return;
    }
    drop("it does not read");
}

/// After a failed write: the peer learns that it waits in vain, whatever the failure was. What it has said until then is
/// still read; the reactor then finds its end and reports the loss, and with it what was waiting here.
void LinuxIpcConnection::sayNoMoreLocked() { ::shutdown(socket_.get(), SHUT_WR); }

void LinuxIpcConnection::waitForRoomLocked() {
    if (watch_) watch_->setEvents(EPOLLIN | EPOLLRDHUP | EPOLLOUT);
}

void LinuxIpcConnection::flush() {
    std::vector<OutgoingFrame> done;
    const std::lock_guard lock(mutex_);
    if (state_ == State::Lost) return;
    const auto flushed = outgoing_.flush(socket_.get(), done);
    if (flushed == OutgoingQueue::Flushed::Broken) sayNoMoreLocked();
    if (flushed != OutgoingQueue::Flushed::Some && watch_) watch_->setEvents(EPOLLIN | EPOLLRDHUP);
}

}  // namespace lumacast
