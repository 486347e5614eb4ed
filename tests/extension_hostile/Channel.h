#pragma once
// One connection as bytes: what it sends need not be what a connection may send. Blocks.

#include <sys/socket.h>
#include <unistd.h>

#include <cstring>
#include <optional>
#include <span>
#include <utility>
#include <vector>

#include "base/Wire.h"
#include "linux/ipc/Fd.h"
#include "linux/ipc/Frames.h"

namespace lumacast::hostile {

class Channel final {
public:
    struct Frame {
        FrameHeader header;
        Data value, records;
        std::vector<Fd> descriptors;
    };
    explicit Channel(Fd socket) : socket_(std::move(socket)) {}

    int descriptor() const { return socket_.get(); }
    void close() { socket_.reset(); }
    bool hello() { return write(makeHello()); }
    bool write(std::span<const std::uint8_t> bytes) {
        while (!bytes.empty()) {
            const ssize_t count = ::send(socket_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
            if (count <= 0) return false;
            bytes = bytes.subspan(static_cast<std::size_t>(count));
        }
        return true;
    }
    /// `claimed`: how long the value is said to be, when that is a lie.
    bool send(FrameKind kind, std::uint16_t message, std::uint64_t sequence, const Data& value,
              std::optional<std::uint32_t> claimed = {}) {
        FrameHeader header;
        header.kind = kind;
        header.message = message;
        header.sequence = sequence;
        header.valueBytes = claimed.value_or(static_cast<std::uint32_t>(value.size()));
        Data frame(kFrameHeaderBytes);
        writeFrameHeader(header, frame);
        frame.insert(frame.end(), value.begin(), value.end());
        return write(frame);
    }
    bool message(std::uint16_t number, const Array& arguments) {
        return send(FrameKind::Message, number, ++sequence_, encoded(arguments));
    }
    bool message(std::uint16_t number, const Data& arguments, std::optional<std::uint32_t> claimed = {}) {
        return send(FrameKind::Message, number, ++sequence_, arguments, claimed);
    }
    bool reply(const Frame& request) { return send(FrameKind::Reply, 0, request.header.sequence, encoded(Array{})); }

    /// The next frame; none when there is none any more.
    std::optional<Frame> read() {
        Frame frame;
        if (!hasHello_ && !fill(kHelloBytes, frame.value, frame.descriptors)) return std::nullopt;
        hasHello_ = true;
        Data header;
        if (!fill(kFrameHeaderBytes, header, frame.descriptors)) return std::nullopt;
        if (readFrameHeader(header, frame.header) != nullptr) return std::nullopt;
        if (!fill(frame.header.valueBytes, frame.value, frame.descriptors)) return std::nullopt;
        if (!fill(frame.header.recordBytes, frame.records, frame.descriptors)) return std::nullopt;
        return frame;
    }
    static Data encoded(const Array& values) {
        WireBody body;
        return encodeArray(values, body) ? body.bytes : Data();
    }

private:
    bool fill(std::size_t count, Data& bytes, std::vector<Fd>& descriptors) {
        bytes.assign(count, 0);
        for (std::size_t have = 0; have < count;) {
            iovec part{bytes.data() + have, count - have};
            alignas(cmsghdr) char control[CMSG_SPACE(16 * sizeof(int))];
            msghdr message{};
            message.msg_iov = &part;
            message.msg_iovlen = 1;
            message.msg_control = control;
            message.msg_controllen = sizeof control;
            const ssize_t got = ::recvmsg(socket_.get(), &message, MSG_CMSG_CLOEXEC);
            if (got <= 0) return false;
            have += static_cast<std::size_t>(got);
            for (cmsghdr* part_ = CMSG_FIRSTHDR(&message); part_; part_ = CMSG_NXTHDR(&message, part_)) {
                if (part_->cmsg_type != SCM_RIGHTS) continue;
                for (std::size_t at = CMSG_LEN(0); at + sizeof(int) <= part_->cmsg_len; at += sizeof(int)) {
                    int descriptor = -1;
                    std::memcpy(&descriptor, reinterpret_cast<char*>(part_) + at, sizeof descriptor);
                    descriptors.emplace_back(descriptor);
                }
            }
        }
        return true;
    }

    Fd socket_;
    bool hasHello_ = false;
    std::uint64_t sequence_ = 0;
};

}  // namespace lumacast::hostile
