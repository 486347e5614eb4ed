#pragma once
// A peer that speaks bytes: for saying what no well-behaved end says.

#include <fcntl.h>
#include <poll.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>
#include <cstring>
#include <filesystem>
#include <span>
#include <string>
#include <utility>
#include <vector>

#include "base/Wire.h"
#include "linux/ipc/Fd.h"
#include "linux/ipc/Frames.h"

namespace lumacast {

inline sockaddr_un socketAddress(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, path.data(), std::min(path.size(), sizeof address.sun_path - 1));
    return address;
}

/// One write of bytes with descriptors; whether all bytes went.
inline bool sendRaw(int socket, std::span<const std::uint8_t> bytes, const std::vector<int>& descriptors = {}) {
    iovec part{const_cast<std::uint8_t*>(bytes.data()), bytes.size()};
    std::vector<char> control(CMSG_SPACE(std::max<std::size_t>(descriptors.size(), 1) * sizeof(int)));
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    if (!descriptors.empty()) {
        message.msg_control = control.data();
        message.msg_controllen = CMSG_SPACE(descriptors.size() * sizeof(int));
        cmsghdr* header = CMSG_FIRSTHDR(&message);
        header->cmsg_level = SOL_SOCKET;
        header->cmsg_type = SCM_RIGHTS;
        header->cmsg_len = CMSG_LEN(descriptors.size() * sizeof(int));
        std::memcpy(CMSG_DATA(header), descriptors.data(), descriptors.size() * sizeof(int));
    }
    return sendmsg(socket, &message, MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
}

class RawPeer {
public:
    RawPeer() : socket_(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {}
    explicit RawPeer(Fd socket) : socket_(std::move(socket)) {}
    explicit RawPeer(const std::string& path) : RawPeer() { connectTo(path); }

    bool connectTo(const std::string& path) {
        const sockaddr_un address = socketAddress(path);
        return connect(socket_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
    }
    bool send(std::span<const std::uint8_t> bytes, const std::vector<int>& descriptors = {}) {
        return sendRaw(socket_.get(), bytes, descriptors);
    }
    bool hello() { return send(makeHello()); }

    /// Reads exactly `count` bytes; fewer when the other end closes, or says nothing for ten seconds.
    Data read(std::size_t count) {
        Data bytes(count);
        std::size_t have = 0;
        while (have < count && isReadable()) {
            const ssize_t got = recv(socket_.get(), bytes.data() + have, count - have, 0);
            if (got <= 0) break;
            have += static_cast<std::size_t>(got);
        }
        bytes.resize(have);
        return bytes;
    }
    /// Whether the other end closes, after whatever it still says.
    bool seesEnd() {
        std::array<std::uint8_t, 65'536> bytes;
        while (isReadable()) {
            const ssize_t got = recv(socket_.get(), bytes.data(), bytes.size(), 0);
            if (got <= 0) return true;
        }
        return false;
    }
    int descriptor() const { return socket_.get(); }
    void close() { socket_.reset(); }

private:
    bool isReadable() {
        pollfd wait{socket_.get(), POLLIN, 0};
        return poll(&wait, 1, 10'000) == 1;
    }
    Fd socket_;
};

/// A frame's bytes from its parts; `header`'s sizes are set, unless `keepSizes`.
inline Data rawFrame(FrameHeader header, const Data& value, const Data& records = {}, bool keepSizes = false) {
    if (!keepSizes) {
        header.valueBytes = static_cast<std::uint32_t>(value.size());
        header.recordBytes = static_cast<std::uint32_t>(records.size());
    }
    Data frame(kFrameHeaderBytes);
    writeFrameHeader(header, frame);
    frame.insert(frame.end(), value.begin(), value.end());
    frame.insert(frame.end(), records.begin(), records.end());
    return frame;
}

inline Data encoded(const Value& value) {
    WireBody body;
    return encode(value, body) ? body.bytes : Data();
}

inline FrameHeader messageHeader(FrameKind kind, std::uint16_t message, std::uint64_t sequence,
                                 std::uint8_t handles = 0) {
    FrameHeader header;
    header.kind = kind;
    header.message = message;
    header.sequence = sequence;
    header.handles = handles;
    return header;
}

/// Memory for a plane of `bytes` bytes.
inline Fd planeMemory(std::size_t bytes, int seals) {
    Fd memory(memfd_create("test", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    if (ftruncate(memory.get(), static_cast<off_t>(bytes)) != 0 || fcntl(memory.get(), F_ADD_SEALS, seals) != 0)
        return Fd();
    return memory;
}

inline std::size_t openDescriptors() {
    std::size_t count = 0;
    for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) ++count;
    return count;
}

}  // namespace lumacast
