#pragma once
#include <cstdint>
#include <deque>
#include <span>
#include <vector>

#include "linux/ipc/Fd.h"
#include "linux/ipc/Frames.h"

namespace lumacast {

/// Collects the bytes and descriptors of one socket and cuts them into frames. Reads only what it is asked to, keeps at
/// most one unfinished frame's bytes between two turns. Used on the reactor's lane only.
class IncomingFrames {
public:
    enum class Received { Bytes, Nothing, End, TooManyDescriptors };
    /// Reads once. `scratch` must stay as it is until endTurn.
    Received receive(int socket, std::span<std::uint8_t> scratch);

    struct Frame {
        FrameHeader header;
        Bytes value;
        Bytes records;
        std::vector<Fd> descriptors;
    };
    enum class Next { Frame, Incomplete, Malformed };
    /// The next whole frame, valid until endTurn. `reason` is set for Malformed.
    Next next(Frame& frame, const char*& reason);

    /// Whether a frame has begun and is not complete.
    bool isMidFrame() const { return !unread_.empty(); }
    /// Keeps what has not been consumed. Answers how many bytes that is.
    std::size_t endTurn();

private:
    Data
        kept_;  ///< what was left from earlier turns; `unread_` is all of it, or a part of the scratch when it is empty
    Bytes unread_;
    std::deque<Fd> descriptors_;
};

}  // namespace lumacast
