#pragma once

#include <cstdint>
#include <vector>

#include "linux/media/mp4/SampleIndex.h"
#include "linux/media/mp4/TrackBoxes.h"

namespace lumacast::mp4 {

inline constexpr std::size_t kMaxTracks = 8;

// What the writer keeps of one track while it writes.
struct MovieTrack {
    std::uint32_t id = 0;
    TrackDescription description;
    std::uint32_t timescale = 0;
    std::int64_t priming = 0;  // ticks hidden at the beginning

    SampleIndex index;
    std::int64_t firstPts = 0;
    std::int64_t lastPts = 0;
    std::uint32_t lastStatedDuration = 0;

    std::vector<std::uint8_t> pending;  // payload of the samples that are in no fragment yet
    std::uint32_t pendingCount = 0;
    std::int64_t pendingFirstPts = 0;

    // Set with the first fragment: pts + fragmentOffset is the decoding time in fragments, of which the first
    // fragmentSkip ticks are hidden.
    std::int64_t fragmentOffset = 0;
    std::int64_t fragmentSkip = 0;

    [[nodiscard]] bool isVideo() const { return std::holds_alternative<VideoTrackDescription>(description); }
    [[nodiscard]] bool hasSamples() const { return index.count() > 0; }
    // When the last sample of the index begins; there must be one.
    [[nodiscard]] std::int64_t lastStart() const {
        return firstPts + static_cast<std::int64_t>(index.totalDuration() - index.samples().back().duration);
    }
    [[nodiscard]] std::int64_t presentedStart() const { return firstPts + priming; }
};

}  // namespace lumacast::mp4
