#include "linux/media/mp4/FragmentBoxes.h"

#include <vector>

#include "linux/media/mp4/BoxBuffer.h"
#include "linux/media/mp4/SampleIndex.h"

namespace lumacast::mp4 {
namespace {

// ISO/IEC 14496-12 clause 8.8.8. Answers where its data_offset stands, which is known only when the whole moof is.
std::size_t writeTrackRun(BoxBuffer& out, const TrackFragment& track) {
    const Box box(out, "trun", 0, kRunHasOffsetDurationsSizes | (track.isVideo ? kRunHasFlags : 0));
    out.u32(track.sampleCount);
    const std::size_t dataOffsetAt = out.size();
    out.u32(0);
    const auto& samples = track.index->samples();
    for (std::size_t i = samples.size() - track.sampleCount; i < samples.size(); ++i) {
        out.u32(i + 1 == samples.size() ? track.lastDuration : samples[i].duration);
        out.u32(samples[i].size);
        if (track.isVideo) {
            out.u32(samples[i].isSync != 0 ? kSyncSample : kDeltaSample);
        }
    }
    return dataOffsetAt;
}

// ISO/IEC 14496-12 clause 8.8.6.
std::size_t writeTrackFragment(BoxBuffer& out, const TrackFragment& track) {
    const Box box(out, "traf");
    {
        const Box header(out, "tfhd", 0, kDefaultBaseIsMoof);  // ISO/IEC 14496-12 clause 8.8.7
        out.u32(track.trackId);
    }
    {
        const Box time(out, "tfdt", 1,
                       0);  // ISO/IEC 14496-12 clause 8.8.12; it lengthens the sample before where they differ
        out.u64(track.decodeTime);
    }
    return writeTrackRun(out, track);
}

}  // namespace

void writeMovieExtends(BoxBuffer& out, std::span<const std::uint32_t> trackIds) {
    const Box box(out, "mvex");  // ISO/IEC 14496-12 clause 8.8.1
    for (const std::uint32_t id : trackIds) {
        const Box defaults(out, "trex", 0, 0);  // ISO/IEC 14496-12 clause 8.8.3
        out.u32(id);
        out.u32(1);            // default_sample_description_index
        out.u32(0);            // default_sample_duration: each run states its own
        out.u32(0);            // default_sample_size: the same
        out.u32(kSyncSample);  // default_sample_flags, what every sound sample is
    }
}

void writeFragmentHeader(BoxBuffer& out, std::uint32_t sequenceNumber, std::span<const TrackFragment> tracks) {
    const std::size_t start = out.size();
    std::vector<std::size_t> dataOffsets;
    dataOffsets.reserve(tracks.size());
    {
        // ISO/IEC 14496-12 clause 8.8.4: a moof. It bears another name until its samples are there, since readers give
        // up on a whole file for one moof that is cut off.
        const Box box(out, "free");
        {
            const Box header(out, "mfhd", 0, 0);  // ISO/IEC 14496-12 clause 8.8.5
            out.u32(sequenceNumber);
        }
        for (const TrackFragment& track : tracks) {
            dataOffsets.push_back(writeTrackFragment(out, track));
        }
    }
    std::uint64_t offset = out.size() - start + kMediaHeaderBytes;  // from the first byte of the moof
    std::uint64_t mediaBytes = kMediaHeaderBytes;
    for (std::size_t i = 0; i < tracks.size(); ++i) {
        out.patch32(dataOffsets[i], static_cast<std::uint32_t>(offset));
        offset += tracks[i].payloadBytes;
        mediaBytes += tracks[i].payloadBytes;
    }
    out.u32(static_cast<std::uint32_t>(mediaBytes));  // ISO/IEC 14496-12 clause 8.1.1
    out.code("mdat");
}

}  // namespace lumacast::mp4
