#pragma once

#include <cstdint>
#include <span>

namespace lumacast::mp4 {

class BoxBuffer;
class SampleIndex;

// Flags of a track fragment and its run as they are written, ISO/IEC 14496-12 clauses 8.8.7 and 8.8.8.
inline constexpr std::uint32_t kDefaultBaseIsMoof = 0x020000;
inline constexpr std::uint32_t kRunHasOffsetDurationsSizes = 0x000301;
inline constexpr std::uint32_t kRunHasFlags = 0x000400;
// Sample flags, ISO/IEC 14496-12 clause 8.8.3.1.
inline constexpr std::uint32_t kSyncSample = 0x02000000;   // sample_depends_on 2: on no other
inline constexpr std::uint32_t kDeltaSample = 0x01010000;  // sample_depends_on 1, sample_is_non_sync_sample
inline constexpr std::uint32_t kMediaHeaderBytes = 8;      // of the media data box behind a fragment

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
