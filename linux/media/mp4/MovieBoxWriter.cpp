#include "linux/media/mp4/MovieBoxWriter.h"

#include <algorithm>
#include <array>
#include <limits>
#include <utility>

#include "linux/media/mp4/FragmentBoxes.h"
#include "linux/media/mp4/IndexInPlace.h"
#include "linux/media/mp4/MovieLayout.h"
#include "linux/media/mp4/MovieNote.h"
#include "linux/media/mp4/SampleDescription.h"
#include "linux/media/mp4/Ticks.h"

namespace lumacast::mp4 {
namespace {

constexpr std::uint64_t kMaxSamples = 1ULL << 26U;  // keeps the final movie box below 4 GiB
constexpr std::uint32_t kMaxFragmentBytes = 1U << 30U;
constexpr std::int64_t kMaxSeconds = 1LL << 31U;  // of a stamp, either way: keeps sums of nanoseconds within 64 bits
constexpr std::int64_t kMaxDuration = std::numeric_limits<std::uint32_t>::max();

std::int64_t nanoseconds(std::int64_t ticks, std::uint32_t timescale) {
    return rescale(ticks, timescale, kNanosecondTimescale);
}

}  // namespace

std::string_view nameOf(MovieError error) {
    switch (error) {
        case MovieError::none:
            return "none";
        case MovieError::badDescription:
            return "bad description";
        case MovieError::badState:
            return "bad state";
        case MovieError::badTrack:
            return "bad track";
        case MovieError::badTime:
            return "bad time";
        case MovieError::badSample:
            return "bad sample";
        case MovieError::tooLong:
            return "too long";
        case MovieError::empty:
            return "empty";
        case MovieError::sinkFailed:
            return "sink failed";
    }
    return "unknown";
}

MovieBoxWriter::MovieBoxWriter(BoxSink& sink, MovieOptions options) : sink_(sink), options_(options) {
    options_.timescale = std::clamp(options_.timescale, 1U, kNanosecondTimescale);
    options_.fragmentBytes = std::min(options_.fragmentBytes, kMaxFragmentBytes);
}

std::optional<TrackId> MovieBoxWriter::addVideoTrack(VideoTrackDescription track) {
    if (!isValid(track) || videoTrack() != nullptr) {
        return std::nullopt;
    }
    return addTrack(std::move(track), 0);
}

std::optional<TrackId> MovieBoxWriter::addAudioTrack(AudioTrackDescription track) {
    if (!isValid(track)) {
        return std::nullopt;
    }
    const std::int64_t priming = track.primingFrames;
    return addTrack(std::move(track), priming);
}

std::optional<TrackId> MovieBoxWriter::addTrack(TrackDescription description, std::int64_t priming) {
    if (state_ != State::describing || tracks_.size() == kMaxTracks) {
        return std::nullopt;
    }
    MovieTrack& track = tracks_.emplace_back();
    track.id = static_cast<std::uint32_t>(tracks_.size());
    track.timescale = timescaleOf(description);
    track.description = std::move(description);
    track.priming = priming;
    return TrackId{track.id};
}

MovieError MovieBoxWriter::start() {
    if (state_ == State::failed) {
        return MovieError::sinkFailed;
    }
    if (state_ != State::describing) {
        return MovieError::badState;
    }
    if (tracks_.empty()) {
        return MovieError::badDescription;
    }
    boxes_.clear();
    writeFileStart(boxes_);
    if (!append(boxes_.view())) {
        return fail();
    }
    state_ = State::writing;
    return MovieError::none;
}

MovieError MovieBoxWriter::addSample(TrackId id, const SampleInfo& info, std::span<const std::uint8_t> bytes) {
    if (state_ != State::writing) {
        return state_ == State::failed ? MovieError::sinkFailed : MovieError::badState;
    }
    MovieTrack* const track = find(id);
    if (track == nullptr) {
        return MovieError::badTrack;
    }
    if (const MovieError error = check(*track, info, bytes); error != MovieError::none) {
        return error;
    }
    if (track->hasSamples()) {
        track->index.setLastDuration(static_cast<std::uint32_t>(info.pts - track->lastPts));
    }
    if (closesFragment(*track, info, bytes.size()) && !waitsForPicture()) {
        if (const MovieError error = writeFragment(); error != MovieError::none) {
            return error;
        }
    }
    if (!track->hasSamples() && fragments_ > 0 && info.pts + track->fragmentOffset < 0) {
        return MovieError::badTime;
    }
    take(*track, info, bytes);
    return MovieError::none;
}

void MovieBoxWriter::take(MovieTrack& track, const SampleInfo& info, std::span<const std::uint8_t> bytes) {
    if (!track.hasSamples()) {
        track.firstPts = info.pts;
    }
    if (track.pendingCount == 0) {
        track.pendingFirstPts = info.pts;
    }
    track.lastStatedDuration = std::max(info.duration, 1U);
    track.lastPts = info.pts;
    const bool isSync = info.isSync || !track.isVideo();
    track.index.add({static_cast<std::uint32_t>(bytes.size()), isSync ? 1U : 0U, track.lastStatedDuration});
    track.pending.insert(track.pending.end(), bytes.begin(), bytes.end());
    track.pendingCount += 1;
    pendingBytes_ += bytes.size();
    samples_ += 1;
}

MovieError MovieBoxWriter::flushFragment() {
    if (state_ != State::writing) {
        return state_ == State::failed ? MovieError::sinkFailed : MovieError::badState;
    }
    return pendingBytes_ == 0 || waitsForPicture() ? MovieError::none : writeFragment();
}

MovieError MovieBoxWriter::finish(std::int64_t lastPictureEnd, std::optional<std::int64_t> presentationEnd) {
    if (state_ != State::writing) {
        return state_ == State::failed ? MovieError::sinkFailed : MovieError::badState;
    }
    if (samples_ == 0) {
        state_ = State::finished;
        return MovieError::empty;
    }
    for (MovieTrack& track : tracks_) {
        if (track.isVideo() && track.hasSamples()) {
            // The end is anybody's number: compare before subtracting.
            const std::int64_t end = std::clamp(lastPictureEnd, track.lastPts + 1, track.lastPts + kMaxDuration);
            track.index.setLastDuration(static_cast<std::uint32_t>(end - track.lastPts));
        }
    }
    if (pendingBytes_ > 0) {
        if (const MovieError error = writeFragment(); error != MovieError::none) {
            return error;
        }
    }
    if (presentationEnd) {
        for (MovieTrack& track : tracks_) {
            cut(track, rescale(*presentationEnd, kNanosecondTimescale, track.timescale));
        }
    }
    return replaceFragmentsByIndex();
}

// A picture at the very end stays, for one tick: it was not later. Sound there has nothing to present.
void MovieBoxWriter::cut(MovieTrack& track, std::int64_t end) {
    const std::size_t kept = track.isVideo() ? 1 : 0;
    while (track.index.count() > kept && track.lastStart() >= end + (track.isVideo() ? 1 : 0)) {
        track.index.removeLast();
    }
    if (track.hasSamples()) {
        const std::int64_t duration = track.index.samples().back().duration;
        track.index.setLastDuration(static_cast<std::uint32_t>(
            std::clamp<std::int64_t>(end - track.lastStart(), 1, std::max<std::int64_t>(duration, 1))));
    }
}

MovieTrack* MovieBoxWriter::find(TrackId id) {
    const auto number = static_cast<std::uint32_t>(id);
    return number >= 1 && number <= tracks_.size() ? &tracks_[number - 1] : nullptr;
}

const MovieTrack* MovieBoxWriter::videoTrack() const {
    const auto found =
        std::find_if(tracks_.begin(), tracks_.end(), [](const MovieTrack& track) { return track.isVideo(); });
    return found == tracks_.end() ? nullptr : &*found;
}

MovieError MovieBoxWriter::check(const MovieTrack& track, const SampleInfo& info,
                                 std::span<const std::uint8_t> bytes) const {
    if (bytes.empty() || bytes.size() > kMaxSampleBytes || (!track.isVideo() && info.duration == 0)) {
        return MovieError::badSample;
    }
    const bool isFirst = !track.hasSamples();
    if (isFirst && track.isVideo() && !info.isSync) {
        return MovieError::badSample;
    }
    const std::int64_t seconds = info.pts / track.timescale;
    if (seconds >= kMaxSeconds || seconds <= -kMaxSeconds) {
        return MovieError::badTime;
    }
    if (!isFirst && (info.pts <= track.lastPts || info.pts - track.lastPts > kMaxDuration)) {
        return MovieError::badTime;
    }
    return samples_ < kMaxSamples ? MovieError::none : MovieError::tooLong;
}

// A fragment is closed before a sample that would make its track's part too long or all of it too large, and before a key
// frame once its pictures are half as long as they may be, so that fragments mostly begin with key frames. Each track is
// measured by itself: sound may come later than the pictures that it belongs to.
bool MovieBoxWriter::closesFragment(const MovieTrack& track, const SampleInfo& info, std::size_t bytes) const {
    if (pendingBytes_ == 0) {
        return false;
    }
    if (pendingBytes_ + bytes > options_.fragmentBytes) {
        return true;
    }
    if (track.pendingCount == 0) {
        return false;
    }
    const std::int64_t pts = nanoseconds(info.pts, track.timescale);
    const std::int64_t start = nanoseconds(track.pendingFirstPts, track.timescale);
    const auto limit = static_cast<std::int64_t>(options_.fragmentNanoseconds);
    const std::int64_t end = nanoseconds(info.pts + info.duration, track.timescale);
    return pts - start >= limit || end - start > limit || (track.isVideo() && info.isSync && pts - start >= limit / 2);
}

// The movie begins with its first picture, and where it begins is written with the first fragment.
bool MovieBoxWriter::waitsForPicture() const {
    const MovieTrack* const video = videoTrack();
    return fragments_ == 0 && video != nullptr && !video->hasSamples() && pendingBytes_ < options_.fragmentBytes;
}

// The last picture may last beyond the fragment's limit. The fragment then states less: the next one's decoding time
// lengthens it (ISO/IEC 14496-12 clause 8.8.12.1), and the final index has the truth.
std::uint32_t MovieBoxWriter::lastFragmentDuration(const MovieTrack& track) const {
    const std::int64_t limit = rescale(options_.fragmentNanoseconds, kNanosecondTimescale, track.timescale);
    const std::int64_t room = limit - (track.lastPts - track.pendingFirstPts);
    const std::int64_t least = track.lastStatedDuration;
    const std::int64_t known = track.index.samples().back().duration;
    return static_cast<std::uint32_t>(std::min(known, std::max(room, least)));
}

MovieError MovieBoxWriter::writeFragment() {
    boxes_.clear();
    if (fragments_ == 0) {
        placeFragments(tracks_, options_.presentationStart);
        const auto kind = options_.purpose == MoviePurpose::copy ? NoteKind::copy : NoteKind::recording;
        writeInitialMovie(boxes_, {options_.timescale, options_.creationTime}, tracks_,
                          noteOf(kind, options_.presentationStart.has_value(), tracks_));
    }
    std::vector<TrackFragment> parts;
    parts.reserve(tracks_.size());
    for (const MovieTrack& track : tracks_) {
        if (track.pendingCount > 0) {
            const auto decodeTime = static_cast<std::uint64_t>(track.pendingFirstPts + track.fragmentOffset);
            parts.push_back({track.id, &track.index, track.pendingCount, lastFragmentDuration(track), decodeTime,
                             track.pending.size(), track.isVideo()});
        }
    }
    const std::uint64_t headerOffset = position_ + boxes_.size();
    writeFragmentHeader(boxes_, fragments_ + 1, parts);
    if (!append(boxes_.view())) {
        return fail();
    }
    for (MovieTrack& track : tracks_) {
        if (track.pendingCount == 0) {
            continue;
        }
        track.index.addChunk(position_, track.pendingCount);
        if (!append(track.pending)) {
            return fail();
        }
        track.pending.clear();
        track.pendingCount = 0;
    }
    pendingBytes_ = 0;
    fragments_ += 1;
    return showFragment(headerOffset) ? MovieError::none : fail();
}

bool MovieBoxWriter::showFragment(std::uint64_t headerOffset) {
    if (options_.purpose == MoviePurpose::copy) {
        return true;
    }
    constexpr std::array<std::uint8_t, 4> kType{'m', 'o', 'o', 'f'};  // it is whole after the sync: readers may see it
    return sink_.sync() && sink_.overwrite(headerOffset + kBoxTypeOffset, kType);
}

MovieError MovieBoxWriter::replaceFragmentsByIndex() {
    const FinalMovie movie{{options_.timescale, options_.creationTime}, tracks_, options_.presentationStart, {}};
    boxes_.clear();
    if (!writeHiddenIndex(boxes_, movie)) {
        state_ = State::finished;
        return MovieError::empty;
    }
    const std::uint64_t indexOffset = position_;
    if (!append(boxes_.view()) || !switchToIndex(sink_, indexOffset)) {
        return fail();
    }
    state_ = State::finished;
    return MovieError::none;
}

bool MovieBoxWriter::append(std::span<const std::uint8_t> bytes) {
    if (bytes.empty()) {
        return true;
    }
    if (!sink_.append(bytes)) {
        return false;
    }
    position_ += bytes.size();
    return true;
}

MovieError MovieBoxWriter::fail() {
    state_ = State::failed;
    return MovieError::sinkFailed;
}

}  // namespace lumacast::mp4
