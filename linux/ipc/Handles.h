#pragma once
// Endpoints and planes of a message: as descriptors with records on the way out, as objects on the way in.

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <vector>

#include "base/Wire.h"
#include "linux/ipc/IncomingFrames.h"
#include "linux/ipc/OutgoingQueue.h"
#include "linux/ipc/ReceivedPlane.h"

namespace lumacast {

/// A plane that a message lends, under its lease.
struct Lease {
    std::uint64_t number;
    std::shared_ptr<SharedPlane> plane;
};

/// A whole frame, but for its header's sequence.
struct EncodedFrame {
    FrameHeader header;
    OutgoingFrame frame;
    std::vector<Lease> leases;
};

/// Encodes `values` as a frame; `nextLease` numbers each plane. A plane without a descriptor is copied into memory of
/// its own. Answers 0, or the system error that says why it can't be sent: EMSGSIZE (over a limit, or text that is not
/// valid UTF-8), EINVAL (an endpoint of another transport, a plane whose memory could shrink), or that of the copy.
[[nodiscard]] int encodeFrame(FrameKind kind, std::uint16_t message, const Array& values,
                              const std::function<std::uint64_t()>& nextLease, EncodedFrame& out);

/// Decodes a frame's values. Answers null and sets `values`, or answers why the frame must be refused.
const char* decodeFrame(IncomingFrames::Frame& frame, const std::weak_ptr<PlaneLender>& lender, Array& values);

}  // namespace lumacast
