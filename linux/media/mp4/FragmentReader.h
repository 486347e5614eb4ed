#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <vector>

#include "linux/media/mp4/MovieTrack.h"

namespace lumacast::mp4 {

// A fragment's box takes 12 bytes a sample at most, and lasts a second: ours have some kilobytes.
inline constexpr std::uint32_t kMaxFragmentHeaderBytes = 1U << 20U;

// The part of one track in a fragment.
struct FragmentRun {
    std::uint32_t trackId = 0;
    std::uint64_t decodeTime = 0;   // ticks of the track
    std::uint64_t mediaOffset = 0;  // of the first sample, from the beginning of the fragment's box
    std::vector<IndexedSample> samples;
};

struct Fragment {
    std::uint32_t sequenceNumber = 0;
    std::uint64_t mediaBytes = 0;  // of all samples; they fill the media data box that follows
    std::vector<FragmentRun> runs;
};

// Reads a fragment's box, header included, whatever its type is. None when it isn't what `writeFragmentHeader` writes of
// these tracks.
[[nodiscard]] std::optional<Fragment> readFragment(std::span<const std::uint8_t> box,
                                                   std::span<const MovieTrack> tracks);

}  // namespace lumacast::mp4
