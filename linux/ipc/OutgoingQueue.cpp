#include "linux/ipc/OutgoingQueue.h"

#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <span>
#include <utility>

#include "base/Limits.h"
#include "linux/calls/FileCalls.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumDescriptors = limitOf(Limit::HandlesPerMessage);
constexpr std::size_t kFramesPerWrite = 32;
constexpr int kWritesPerFlush = 8;
/// Small frames that wait are put together, so that what they take is not many times what they count.
constexpr std::size_t kPutTogetherBytes = 4096;

/// Writes once. Answers the bytes that went, or -1 with errno set.
ssize_t write(int socket, std::span<iovec> parts, std::span<const int> descriptors) {
    msghdr message{};
    message.msg_iov = parts.data();
    message.msg_iovlen = parts.size();
    alignas(cmsghdr) std::array<char, CMSG_SPACE(kMaximumDescriptors * sizeof(int))> control;
    if (!descriptors.empty()) {
        const std::size_t bytes = descriptors.size() * sizeof(int);
        control.fill(0);
        message.msg_control = control.data();
        message.msg_controllen = CMSG_SPACE(bytes);
        cmsghdr* header = CMSG_FIRSTHDR(&message);
        header->cmsg_level = SOL_SOCKET;
        header->cmsg_type = SCM_RIGHTS;
        header->cmsg_len = CMSG_LEN(bytes);
        std::memcpy(CMSG_DATA(header), descriptors.data(), bytes);
    }
    return calls::sendMessage(socket, message, MSG_DONTWAIT | MSG_NOSIGNAL);
}

bool isBytesOnly(const OutgoingFrame& frame) {
    return frame.descriptors.empty() && frame.keep.empty() && frame.own.empty() && !frame.onLost;
}

iovec rest(OutgoingFrame& frame) { return {frame.bytes.data() + frame.written, frame.bytes.size() - frame.written}; }

}  // namespace

OutgoingQueue::Result OutgoingQueue::send(int socket, OutgoingFrame& frame) {
    if (waiting_.empty()) {
        iovec part = rest(frame);
        const ssize_t sent = write(socket, {&part, 1}, frame.descriptors);
        if (sent < 0 && errno != EAGAIN) {
            // Too many descriptors under way, or no memory: a receiver that is too slow. The rest is a lost peer.
            return errno == ETOOMANYREFS || errno == ENOBUFS || errno == ENOMEM ? Result::Full : Result::Broken;
        }
        if (sent > 0) frame.written = static_cast<std::size_t>(sent);
        if (frame.written == frame.bytes.size()) return Result::Sent;
    }
    if (!hasRoomFor(frame)) return Result::Full;
    waitingBytes_ += frame.bytes.size() - frame.written;
    if (!waiting_.empty() && isBytesOnly(frame) && isBytesOnly(waiting_.back()) &&
        waiting_.back().bytes.size() + frame.bytes.size() <= kPutTogetherBytes) {
        Data& bytes = waiting_.back().bytes;
        bytes.insert(bytes.end(), frame.bytes.begin(), frame.bytes.end());
        return Result::Queued;
    }
    waiting_.push_back(std::move(frame));
    return Result::Queued;
}

bool OutgoingQueue::hasRoomFor(const OutgoingFrame& frame) {
    const std::uint64_t size = frame.bytes.size() - frame.written;
    if (frame.written > 0) {
        // It has begun and must be finished. Nothing else waits then.
        if (budget_) budget_->takeAnyway(size);
        return true;
    }
    return waitingBytes_ + size <= limitOf(Limit::QueuedBytesPerReader) && (!budget_ || budget_->take(size));
}

void OutgoingQueue::sent(std::uint64_t bytes) {
    waitingBytes_ -= bytes;
    if (budget_) budget_->give(bytes);
}

OutgoingQueue::Flushed OutgoingQueue::flush(int socket, std::vector<OutgoingFrame>& done) {
    for (int i = 0; i < kWritesPerFlush && !waiting_.empty(); ++i) {
        std::array<iovec, kFramesPerWrite> parts;
        std::size_t used = 0;
        for (OutgoingFrame& frame : waiting_) {
            // Descriptors go with the first byte of a write, so a frame that has some begins one.
            if (used == parts.size() || (used > 0 && !frame.descriptors.empty())) break;
            parts[used++] = rest(frame);
        }
        std::span<const int> descriptors;
        if (waiting_.front().written == 0) descriptors = waiting_.front().descriptors;
        const ssize_t count = write(socket, std::span(parts).first(used), descriptors);
        if (count < 0) return errno == EAGAIN ? Flushed::Some : Flushed::Broken;
        sent(static_cast<std::uint64_t>(count));
        for (auto left = static_cast<std::size_t>(count); left > 0;) {
            OutgoingFrame& frame = waiting_.front();
            const std::size_t part = std::min(left, frame.bytes.size() - frame.written);
            frame.written += part;
            left -= part;
            if (frame.written < frame.bytes.size()) break;
            done.push_back(std::move(frame));
            waiting_.pop_front();
        }
    }
    return waiting_.empty() ? Flushed::All : Flushed::Some;
}

std::deque<OutgoingFrame> OutgoingQueue::takeAll() {
    sent(waitingBytes_);
    return std::exchange(waiting_, {});
}

}  // namespace lumacast
