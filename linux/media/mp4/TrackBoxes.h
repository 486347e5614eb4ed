#pragma once

#include <cstdint>
#include <span>
#include <variant>

#include "linux/media/mp4/TrackDescription.h"

namespace lumacast::mp4 {

class BoxBuffer;
class SampleIndex;

using TrackDescription = std::variant<VideoTrackDescription, AudioTrackDescription>;

[[nodiscard]] std::uint32_t timescaleOf(const TrackDescription& track);

// One entry of an edit list.
struct Edit {
    static constexpr std::int64_t kEmpty = -1;
    std::uint64_t duration = 0;  // ticks of the movie; 0 in a movie that is still being written: all there is and comes
    std::int64_t mediaTime = 0;  // ticks of the track; kEmpty: nothing is presented
};

// What a track box says beyond the track's description.
struct TrackTiming {
    std::uint32_t id = 0;
    std::uint64_t creationTime = 0;   // seconds since 1904 began, UTC
    std::uint64_t movieDuration = 0;  // ticks of the movie: the sum of the edits
    std::span<const Edit> edits;      // none: no edit list
};

// The track box, all of it. Boxes that hold times take their 64-bit form where 32 bits do not do.
void writeTrack(BoxBuffer& out, const TrackDescription& track, const TrackTiming& timing, const SampleIndex& index);

// The movie header box.
struct MovieTiming {
    std::uint32_t timescale = 0;
    std::uint64_t creationTime = 0;
    std::uint64_t duration = 0;  // ticks of the movie
    std::uint32_t nextTrackId = 0;
};
void writeMovieHeader(BoxBuffer& out, const MovieTiming& timing);

}  // namespace lumacast::mp4
