#include "linux/media/mp4/MovieRecovery.h"

#include <algorithm>
#include <array>
#include <limits>
#include <new>
#include <utility>
#include <vector>

#include "linux/media/mp4/BoxReader.h"
#include "linux/media/mp4/FileHead.h"
#include "linux/media/mp4/IndexInPlace.h"
#include "linux/media/mp4/Ticks.h"
#include "linux/media/mp4/UnfinishedMovie.h"

namespace lumacast::mp4 {
namespace {

Recovery resultOf(UnreadableMovie why) {
    switch (why) {
        case UnreadableMovie::sourceFailed:
            return Recovery::sourceFailed;
        case UnreadableMovie::notOurs:
            return Recovery::notOurs;
        case UnreadableMovie::copy:
            return Recovery::unfinishedCopy;
        case UnreadableMovie::nothingWhole:
            return Recovery::nothingWhole;
        case UnreadableMovie::damaged:
            return Recovery::damaged;
        case UnreadableMovie::tooLong:
            return Recovery::tooLong;
    }
    return Recovery::damaged;
}

// The last picture stays as long as there is sound: nobody knows any more how long it was shown.
void extendLastPicture(std::vector<MovieTrack>& tracks) {
    std::int64_t end = std::numeric_limits<std::int64_t>::min();
    for (const MovieTrack& track : tracks) {
        if (!track.isVideo() && track.hasSamples()) {
            const std::int64_t ticks = track.firstPts + static_cast<std::int64_t>(track.index.totalDuration());
            end = std::max(end, rescale(ticks, track.timescale, kNanosecondTimescale));
        }
    }
    for (MovieTrack& track : tracks) {
        if (track.isVideo() && track.hasSamples() && end > 0) {
            const std::int64_t stated = track.index.samples().back().duration;
            const std::int64_t left = rescale(end, kNanosecondTimescale, track.timescale) - track.lastStart();
            track.index.setLastDuration(static_cast<std::uint32_t>(
                std::clamp<std::int64_t>(left, stated, std::numeric_limits<std::uint32_t>::max())));
        }
    }
}

bool stands(BoxSource& source, std::uint64_t offset, std::span<const std::uint8_t> expected) {
    constexpr std::size_t kPieceBytes = 16 * 1024;
    std::array<std::uint8_t, kPieceBytes> piece;
    while (!expected.empty()) {
        const std::span bytes = std::span(piece).first(std::min(kPieceBytes, expected.size()));
        if (!source.read(offset, bytes) || !std::ranges::equal(bytes, expected.first(bytes.size()))) {
            return false;
        }
        offset += bytes.size();
        expected = expected.subspan(bytes.size());
    }
    return true;
}

// Whether the index that stands at the end of the file is, to the byte, the one that this movie gets.
bool hasIndex(BoxSource& source, const UnfinishedMovie& movie, std::optional<NoteKind> note) {
    BoxBuffer index;
    return writeHiddenIndex(index, movie.withIndex(note)) && index.size() == movie.fileBytes - *movie.hiddenIndex &&
           stands(source, *movie.hiddenIndex, index.view());
}

// The index of a finish knows how long the last picture was shown: the tracks are given what it says. None when it can't
// be read.
std::optional<std::vector<MovieTrack>> tracksAsFinished(BoxSource& source, const UnfinishedMovie& movie) {
    std::vector<std::uint8_t> index(static_cast<std::size_t>(movie.fileBytes - *movie.hiddenIndex - kHiddenMovieOffset));
    if (!source.read(*movie.hiddenIndex + kHiddenMovieOffset, index)) {
        return std::nullopt;
    }
    std::vector<MovieTrack> tracks = movie.initial.tracks;
    for (MovieTrack& track : tracks) {
        const auto duration = mediaDuration(findBox(index, "moov"), track.id);
        if (!track.hasSamples() || !duration) {
            continue;
        }
        const std::uint64_t before = track.index.totalDuration() - track.index.samples().back().duration;
        if (*duration <= before || *duration - before > std::numeric_limits<std::uint32_t>::max()) {
            return std::nullopt;
        }
        track.index.setLastDuration(static_cast<std::uint32_t>(*duration - before));
    }
    return tracks;
}

// Whether the recording's own index, or that of a recovery, is there whole, and only the switch is missing. `movie` has
// the tracks of its finish then.
bool needsOnlySwitch(BoxSource& source, UnfinishedMovie& movie) {
    if (!movie.hiddenIndex) {
        return false;
    }
    if (hasIndex(source, movie, NoteKind::recovered)) {
        return true;
    }
    auto finished = tracksAsFinished(source, movie);
    if (!finished) {
        return false;
    }
    std::swap(movie.initial.tracks, *finished);
    if (hasIndex(source, movie, std::nullopt)) {
        return true;
    }
    std::swap(movie.initial.tracks, *finished);
    return false;
}

Recovery writeIndex(BoxSource& source, BoxSink& sink) {
    auto read = readUnfinishedMovie(source);
    if (const auto* why = std::get_if<UnreadableMovie>(&read)) {
        return resultOf(*why);
    }
    auto& movie = std::get<UnfinishedMovie>(read);
    extendLastPicture(movie.initial.tracks);
    if (needsOnlySwitch(source, movie)) {
        return switchToIndex(sink, *movie.hiddenIndex) ? Recovery::completed : Recovery::sinkFailed;
    }
    BoxBuffer index;
    if (!writeHiddenIndex(index, movie.withIndex(NoteKind::recovered))) {
        return Recovery::nothingWhole;
    }
    BoxBuffer bridge;
    writeBridge(bridge, movie.end, movie.fileBytes, index.size());
    if ((bridge.size() > 0 && !sink.append(bridge.view())) || !sink.append(index.view()) ||
        !switchToIndex(sink, movie.fileBytes + bridge.size())) {
        return Recovery::sinkFailed;
    }
    return Recovery::recovered;
}

// The size is in force already, so what it points at is the movie's index.
Recovery completeSwitch(BoxSource& source, BoxSink& sink, std::uint64_t movieOffset) {
    std::array<std::uint8_t, 8> header;
    if (!source.read(movieOffset, header)) {
        return Recovery::sourceFailed;
    }
    BoxReader in(header);
    const std::uint32_t size = in.u32();
    if (in.u32() != FourCC("moov").value || size != source.size() - movieOffset) {
        return Recovery::damaged;
    }
    return writeSwitchedHeader(sink) ? Recovery::completed : Recovery::sinkFailed;
}

Recovery recover(BoxSource& source, BoxSink& sink) {
    const HeadView view = readFileHead(source);
    switch (view.head) {
        case FileHead::unreadable:
            return Recovery::sourceFailed;
        case FileHead::notOurs:
            return Recovery::notOurs;
        case FileHead::finished:
            return Recovery::finished;
        case FileHead::halfSwitched:
            return completeSwitch(source, sink, view.mediaEnd);
        case FileHead::unfinished:
            return writeIndex(source, sink);
    }
    return Recovery::notOurs;
}

}  // namespace

std::string_view nameOf(Recovery result) {
    switch (result) {
        case Recovery::recovered:
            return "recovered";
        case Recovery::completed:
            return "completed";
        case Recovery::finished:
            return "finished";
        case Recovery::unfinishedCopy:
            return "unfinished copy";
        case Recovery::notOurs:
            return "not ours";
        case Recovery::nothingWhole:
            return "nothing whole";
        case Recovery::damaged:
            return "damaged";
        case Recovery::tooLong:
            return "too long";
        case Recovery::sourceFailed:
            return "source failed";
        case Recovery::sinkFailed:
            return "sink failed";
    }
    return "unknown";
}

Recovery recoverMovie(BoxSource& source, BoxSink& sink) {
    try {
        return recover(source, sink);
    } catch (const std::bad_alloc&) {
        return Recovery::tooLong;
    }
}

}  // namespace lumacast::mp4
