#include "linux/media/mp4/MovieLayout.h"

#include <algorithm>
#include <limits>
#include <numeric>

#include "linux/media/mp4/BoxBuffer.h"
#include "linux/media/mp4/FragmentBoxes.h"
#include "linux/media/mp4/SampleTables.h"
#include "linux/media/mp4/Ticks.h"

namespace lumacast::mp4 {
namespace {

struct TrackEdits {
    std::vector<Edit> list;
    std::uint64_t duration = 0;  // ticks of the movie
};

// ISO/IEC 14496-12 clause 8.6.6: an empty edit up to the track's first presented tick, then its media without what is
// hidden: priming and sound from before the movie. No edits: nothing of the track is presented.
TrackEdits editsOf(const MovieTrack& track, std::int64_t movieStart, std::uint32_t movieTimescale) {
    const std::int64_t start = rescale(movieStart, kNanosecondTimescale, track.timescale);
    const std::int64_t presented = std::max(start, track.presentedStart());
    const std::int64_t end = track.firstPts + static_cast<std::int64_t>(track.index.totalDuration());
    TrackEdits edits;
    if (end <= presented) {
        return edits;
    }
    const std::int64_t delay = rescale(presented - start, track.timescale, movieTimescale);
    const std::int64_t duration = rescale(end - start, track.timescale, movieTimescale) - delay;
    if (delay > 0) {
        edits.list.push_back({static_cast<std::uint64_t>(delay), Edit::kEmpty});
    }
    edits.list.push_back({static_cast<std::uint64_t>(std::max<std::int64_t>(duration, 1)), presented - track.firstPts});
    for (const Edit& edit : edits.list) {
        edits.duration += edit.duration;
    }
    return edits;
}

std::uint32_t nextTrackId(std::span<const MovieTrack> tracks) {
    return static_cast<std::uint32_t>(tracks.size()) + 1;
}

}  // namespace

void writeFileStart(BoxBuffer& out) {
    {
        const Box box(out, "ftyp");  // ISO/IEC 14496-12 clause 4.3
        out.code("mp42");            // ISO/IEC 14496-14 clause 4
        out.u32(0);
        out.code("mp42");
        out.code("isom");
        out.code("iso5");  // what default-base-is-moof asks for, ISO/IEC 14496-12 clause 8.8.7.1
        out.code("avc1");
    }
    const Box reserve(out, "free");  // ISO/IEC 14496-12 clause 8.1.2
    out.u64(0);
}

std::int64_t movieStartNanoseconds(std::span<const MovieTrack> tracks) {
    std::int64_t start = std::numeric_limits<std::int64_t>::max();
    for (const MovieTrack& track : tracks) {
        if (!track.hasSamples()) {
            continue;
        }
        const std::int64_t presented = rescale(track.presentedStart(), track.timescale, kNanosecondTimescale);
        if (track.isVideo()) {
            return presented;
        }
        start = std::min(start, presented);
    }
    return start;
}

void placeFragments(std::span<MovieTrack> tracks, std::optional<std::int64_t> givenStart) {
    const std::int64_t movieStart = givenStart ? *givenStart : movieStartNanoseconds(tracks);
    std::int64_t earliest = movieStart;
    for (const MovieTrack& track : tracks) {
        if (track.hasSamples()) {
            earliest = std::min(earliest, rescale(track.presentedStart(), track.timescale, kNanosecondTimescale));
        }
    }
    for (MovieTrack& track : tracks) {
        const std::int64_t start = rescale(movieStart, kNanosecondTimescale, track.timescale);
        const std::int64_t expected = rescale(earliest, kNanosecondTimescale, track.timescale) - track.priming;
        const std::int64_t first = track.hasSamples() ? track.firstPts : expected;
        track.fragmentSkip = std::max(track.priming, start - first);
        track.fragmentOffset = track.fragmentSkip - start;
    }
}

void writeInitialMovie(BoxBuffer& out, const MovieHead& head, std::span<const MovieTrack> tracks,
                       const MovieNote& note) {
    const Box box(out, "moov");  // ISO/IEC 14496-12 clause 8.2.1
    writeMovieHeader(out, {head.timescale, head.creationTime, 0, nextTrackId(tracks)});
    const SampleIndex nothing;
    std::vector<std::uint32_t> ids;
    for (const MovieTrack& track : tracks) {
        const Edit skip{0, track.fragmentSkip};
        const std::size_t edits = track.fragmentSkip > 0 ? 1 : 0;
        writeTrack(out, track.description, {track.id, head.creationTime, 0, std::span(&skip, edits)}, nothing);
        ids.push_back(track.id);
    }
    writeMovieExtends(out, ids);
    writeNote(out, note);
}

bool writeFinalMovie(BoxBuffer& out, const FinalMovie& movie) {
    const auto& [head, tracks, givenStart, note] = movie;
    const std::int64_t movieStart = givenStart ? *givenStart : movieStartNanoseconds(tracks);
    std::vector<TrackEdits> edits;
    std::uint64_t duration = 0;
    for (const MovieTrack& track : tracks) {
        edits.push_back(track.hasSamples() ? editsOf(track, movieStart, head.timescale) : TrackEdits{});
        duration = std::max(duration, edits.back().duration);
    }
    if (duration == 0) {
        return false;
    }
    const Box box(out, "moov");  // ISO/IEC 14496-12 clause 8.2.1
    writeMovieHeader(out, {head.timescale, head.creationTime, duration, nextTrackId(tracks)});
    for (std::size_t i = 0; i < tracks.size(); ++i) {
        if (!edits[i].list.empty()) {
            writeTrack(out, tracks[i].description, {tracks[i].id, head.creationTime, edits[i].duration, edits[i].list},
                       tracks[i].index);
        }
    }
    if (note) {
        writeNote(out, {*note, false, {}});
    }
    return true;
}

std::size_t finalTableBytes(std::span<const MovieTrack> tracks) {
    return std::accumulate(tracks.begin(), tracks.end(), std::size_t{0}, [](std::size_t sum, const MovieTrack& track) {
        return sum + sampleTableBytes(track.index);
    });
}

}  // namespace lumacast::mp4
