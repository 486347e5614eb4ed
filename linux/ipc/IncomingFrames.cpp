#include "linux/ipc/IncomingFrames.h"

#include <sys/socket.h>

#include <array>
#include <cerrno>
#include <cstring>

#include "base/Limits.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumDescriptors = limitOf(Limit::HandlesPerMessage);
/// A buffer that grew beyond this for one long message is given back after it.
constexpr std::size_t kKeptCapacity = 16'384;

/// Takes ownership of every descriptor that came with a message.
void takeDescriptors(msghdr& message, std::deque<Fd>& out) {
    for (cmsghdr* header = CMSG_FIRSTHDR(&message); header; header = CMSG_NXTHDR(&message, header)) {
        if (header->cmsg_level != SOL_SOCKET || header->cmsg_type != SCM_RIGHTS) continue;
        const std::size_t count = (header->cmsg_len - CMSG_LEN(0)) / sizeof(int);
        for (std::size_t i = 0; i < count; ++i) {
            int descriptor = -1;
            std::memcpy(&descriptor, CMSG_DATA(header) + i * sizeof(int), sizeof descriptor);
            out.emplace_back(descriptor);
        }
    }
}

}  // namespace

IncomingFrames::Received IncomingFrames::receive(int socket, std::span<std::uint8_t> scratch) {
    iovec part{scratch.data(), scratch.size()};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(kMaximumDescriptors * sizeof(int))> control;
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    const ssize_t count = recvmsg(socket, &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
    if (count < 0) return errno == EAGAIN || errno == EINTR ? Received::Nothing : Received::End;
    takeDescriptors(message, descriptors_);
    if (message.msg_flags & MSG_CTRUNC) return Received::TooManyDescriptors;
    if (count == 0) return Received::End;
    const auto received = scratch.first(static_cast<std::size_t>(count));
    if (kept_.empty()) {
        unread_ = received;
    } else {
        kept_.insert(kept_.end(), received.begin(), received.end());
        unread_ = kept_;
    }
    return Received::Bytes;
}

IncomingFrames::Next IncomingFrames::next(Frame& frame, const char*& reason) {
    if (unread_.size() < kFrameHeaderBytes) {
        // Descriptors come with the first byte of the message they belong to.
        const bool stray = unread_.empty() ? !descriptors_.empty() : descriptors_.size() > kMaximumDescriptors;
        reason = "descriptors without a message";
        return stray ? Next::Malformed : Next::Incomplete;
    }
    reason = readFrameHeader(unread_, frame.header);
    if (reason) return Next::Malformed;
    const bool isWhole = unread_.size() >= frame.header.frameBytes();
    reason = "descriptors and their records differ";
    if (!isWhole) return descriptors_.size() > frame.header.handles ? Next::Malformed : Next::Incomplete;
    if (descriptors_.size() < frame.header.handles) return Next::Malformed;
    frame.value = unread_.subspan(kFrameHeaderBytes, frame.header.valueBytes);
    frame.records = unread_.subspan(kFrameHeaderBytes + frame.header.valueBytes, frame.header.recordBytes);
    frame.descriptors.clear();
    for (std::size_t i = 0; i < frame.header.handles; ++i) {
        frame.descriptors.push_back(std::move(descriptors_.front()));
        descriptors_.pop_front();
    }
    unread_ = unread_.subspan(frame.header.frameBytes());
    // Descriptors of a later message come with its first byte: without one these are this message's, and undeclared.
    return unread_.empty() && !descriptors_.empty() ? Next::Malformed : Next::Frame;
}

std::size_t IncomingFrames::endTurn() {
    if (unread_.empty()) {
        if (kept_.capacity() > kKeptCapacity) kept_ = Data();
        kept_.clear();
    } else if (kept_.empty()) {
        kept_.assign(unread_.begin(), unread_.end());
    } else {
        kept_.erase(kept_.begin(), kept_.end() - static_cast<std::ptrdiff_t>(unread_.size()));
    }
    unread_ = kept_;
    return kept_.size();
}

}  // namespace lumacast
