#pragma once
#include <cstddef>
#include <cstdint>
#include <deque>
#include <utility>

#include "extensions/media/Av.h"

namespace lumacast::extensions {

/// One encoded packet on its way out.
struct OutgoingPacket {
    AvOwned<AVPacket> packet;
    bool isVideo = false;
    bool isKeyFrame() const { return isVideo && (packet->flags & AV_PKT_FLAG_KEY) != 0; }
};

/// What waits for the media server, bounded: when too much waits, everything before the latest key frame goes; when
/// that is not enough, everything. Not thread-safe.
class PacketQueue final {
public:
    explicit PacketQueue(std::size_t mostBytes) : mostBytes_(mostBytes) {}

    /// Answers how many pictures were left out. What can't be shown (before the first key frame, or behind a hole) is
    /// not taken.
    std::uint64_t push(OutgoingPacket packet);
    OutgoingPacket pop();
    /// For a new connection: what waits is to begin with a key frame, the latest. Answers how many pictures were left
    /// out.
    std::uint64_t keepFromLatestKeyFrame();
    bool empty() const { return packets_.empty(); }
    /// Whether nothing is taken until a key frame comes.
    bool needsKeyFrame() const { return needsKeyFrame_; }

private:
    std::uint64_t dropUntil(std::size_t place);

    const std::size_t mostBytes_;
    std::size_t bytes_ = 0;
    std::deque<OutgoingPacket> packets_;
    bool needsKeyFrame_ = true;
};

}  // namespace lumacast::extensions
