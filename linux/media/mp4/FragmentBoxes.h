#pragma once

#include <cstdint>
#include <span>

namespace lumacast::mp4 {

class BoxBuffer;
class SampleIndex;

// What makes a movie box a fragmented one: the movie extends box, naming each track.
void writeMovieExtends(BoxBuffer& out, std::span<const std::uint32_t> trackIds);

// The part of one track in a fragment: the last `sampleCount` samples of its index.
struct TrackFragment {
    std::uint32_t trackId = 0;
    const SampleIndex* index = nullptr;
    std::uint32_t sampleCount = 0;
    std::uint32_t lastDuration = 0;  // ticks: written for the last sample, at most its true duration
    std::uint64_t decodeTime = 0;    // ticks of the track, of the first sample
    std::uint64_t payloadBytes = 0;  // of all its samples
    bool isVideo = false;
};

// The movie fragment box, hidden as a free box until the fragment is whole, and the header of the media data box that
// must follow it; then come the samples, those of one track after those of the other, in the order given.
inline constexpr std::uint64_t kBoxTypeOffset = 4;  // within any box: where "free" becomes "moof"
void writeFragmentHeader(BoxBuffer& out, std::uint32_t sequenceNumber, std::span<const TrackFragment> tracks);

}  // namespace lumacast::mp4
