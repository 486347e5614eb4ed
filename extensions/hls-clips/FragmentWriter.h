#pragma once
// Fragmented MP4, one segment at a time.

#include <cstdint>
#include <string>
#include <vector>

#include "base/Value.h"
#include "extensions/media/Av.h"

namespace lumacast::extensions {

/// The two tracks of a segment. Times of pictures are in ticks, those of sound in samples.
struct SegmentMedia {
    const AVCodecParameters* video = nullptr;
    const AVCodecContext* sound = nullptr;
    std::vector<AvOwned<AVPacket>> pictures;
    std::vector<AvOwned<AVPacket>> sounds;
};

struct SegmentBytes {
    Data init;   ///< the header that a player needs before this segment; the same bytes for the same tracks
    Data media;  ///< one movie fragment with both tracks, at the packets' own times
};

/// Writes one segment. `number` is the fragment's, from 1. The reason when that fails, else empty.
[[nodiscard]] std::string writeSegment(const SegmentMedia& media, std::uint32_t number, SegmentBytes& bytes);

}  // namespace lumacast::extensions
