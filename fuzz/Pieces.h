#pragma once
#include <sys/types.h>
#include <array>
#include <vector>

#include "base/Value.h"
#include "fuzz/Input.h"
#include "linux/ipc/Fd.h"

namespace lumacast::fuzz {

/// Descriptors that pieces carry copies of: memory sealed against shrinking, memory that is not, empty memory, the end
/// of a doorbell, and one that is nothing of the kind. Made once: they cost more than everything else.
class Wares {
public:
    Wares();
    int descriptor(unsigned kind) const { return descriptors_[kind % descriptors_.size()].get(); }

private:
    static Fd memory(off_t size, int seals);

    std::array<Fd, 5> descriptors_;
    Fd other_;
};

/// What is sent in one go; never without bytes.
struct Piece {
    Data bytes;
    std::vector<int> descriptors;  ///< borrowed from the wares
};

/// Reads a script of pieces, 24 at most. Each is
///
///   byte: number of descriptors (below 11) · that many bytes: their kinds · u16: length, at most 1023 · the bytes
///
/// A length's highest bit makes the piece a frame with a good header before the bytes (then the length is followed by
/// byte: kind, byte: descriptors declared, byte: bytes of the records at the end, byte: message, of a message).
std::vector<Piece> piecesOf(Input in, const Wares& wares);

/// Sends bytes in one go, with copies of descriptors, 16 at most. False when the socket does not take them.
bool sendTo(int socket, Bytes bytes, const std::vector<int>& descriptors);

/// The lowest free number: it grows with every descriptor that is not given back.
int nextDescriptor();

}  // namespace lumacast::fuzz
