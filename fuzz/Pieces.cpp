#include "fuzz/Pieces.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstring>

#include "linux/ipc/Frames.h"

namespace lumacast::fuzz {

namespace {

constexpr std::size_t kMaximumPieces = 24;

}  // namespace

Wares::Wares() {
    descriptors_[0] = memory(4096, F_SEAL_SHRINK);
    descriptors_[1] = memory(4096, 0);
    descriptors_[2] = memory(0, F_SEAL_SHRINK | F_SEAL_GROW);
    std::array<int, 2> pair{};
    if (::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, pair.data()) == 0) {
        descriptors_[3] = Fd(pair[0]);
        other_ = Fd(pair[1]);
    }
    descriptors_[4] = Fd(::open("/dev/null", O_RDONLY | O_CLOEXEC));
}

Fd Wares::memory(off_t size, int seals) {
    Fd file(::memfd_create("fuzz", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    if (::ftruncate(file.get(), size) != 0 || ::fcntl(file.get(), F_ADD_SEALS, seals) != 0) return Fd();
    return file;
}

bool sendTo(int socket, Bytes bytes, const std::vector<int>& descriptors) {
    iovec part{const_cast<std::uint8_t*>(bytes.data()), bytes.size()};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(16 * sizeof(int))> control{};
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
    return ::sendmsg(socket, &message, MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
}

int nextDescriptor() { return Fd(::open("/dev/null", O_RDONLY | O_CLOEXEC)).get(); }

std::vector<Piece> piecesOf(Input in, const Wares& wares) {
    std::vector<Piece> pieces;
    while (!in.isAtEnd() && pieces.size() < kMaximumPieces) {
        Piece& piece = pieces.emplace_back();
        for (unsigned count = in.below(11); count > 0; --count)
            piece.descriptors.push_back(wares.descriptor(in.byte()));
        const std::uint64_t length = in.number(2);
        const bool isFramed = (length & 0x8000) != 0;
        FrameHeader header;
        if (isFramed) {
            header.kind = static_cast<FrameKind>(in.below(7));
            header.handles = in.byte();
            header.recordBytes = in.byte();
            header.message = static_cast<std::uint16_t>(header.kind <= FrameKind::Request ? in.byte() : 0);
            header.sequence = pieces.size();
        }
        const Bytes bytes = in.bytes(length & 0x3FF);
        if (isFramed) {
            header.recordBytes = std::min(header.recordBytes, static_cast<std::uint32_t>(bytes.size()));
            header.valueBytes = static_cast<std::uint32_t>(bytes.size()) - header.recordBytes;
            piece.bytes.resize(kFrameHeaderBytes);
            writeFrameHeader(header, piece.bytes);
        }
        piece.bytes.insert(piece.bytes.end(), bytes.begin(), bytes.end());
        if (piece.bytes.empty()) pieces.pop_back();  // a stream has no empty pieces
    }
    return pieces;
}

}  // namespace lumacast::fuzz
