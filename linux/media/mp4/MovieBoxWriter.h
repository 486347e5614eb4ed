#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

#include "linux/media/mp4/BoxBuffer.h"
#include "linux/media/mp4/BoxSink.h"
#include "linux/media/mp4/MovieTrack.h"
#include "linux/media/mp4/TrackDescription.h"

namespace lumacast::mp4 {

enum class MovieError : std::uint8_t {
    none,
    badDescription,  // a track that can't be described in the file, or one too many
    badState,        // the call does not belong here: before start, after finish
    badTrack,        // no such track
    badTime,         // not later than the track's sample before, out of range, or before the movie's first fragment
    badSample,       // empty, too large, sound without duration, or a video track's first sample that is no key frame
    tooLong,         // the index is full, after 67 million samples
    empty,           // finished without anything to present: the file is no movie
    sinkFailed,      // the sink answered false, now or before; nothing is written any more
};
[[nodiscard]] std::string_view nameOf(MovieError error);

enum class TrackId : std::uint32_t {};  // the track_ID in the file

// What is lost when the movie is not finished.
enum class MoviePurpose : std::uint8_t {
    recording,  // everything: so its fragments are shown and synced as they come
    copy,       // nothing, it can be made again: none of its fragments is shown, and nothing is synced, before the finish
};

struct MovieOptions {
    std::uint32_t timescale = kDefaultVideoTimescale;   // ticks per second of edit lists and of the movie's duration
    std::uint64_t creationTime = 0;                     // seconds since 1904 began, UTC; 0: not stated
    std::uint32_t fragmentNanoseconds = 1'000'000'000;  // media time after which a fragment is closed
    std::uint32_t fragmentBytes = 8U << 20U;            // pending bytes after which it is closed early; 1 GiB at most
    // Nanoseconds on the tracks' time line at which the movie begins. What lies before is there to decode from and is
    // not presented. None: the movie begins with its first picture.
    std::optional<std::int64_t> presentationStart;
    MoviePurpose purpose = MoviePurpose::recording;
};

struct SampleInfo {
    std::int64_t pts = 0;        // ticks of the track; all tracks count from the same zero. Also the decoding time
    std::uint32_t duration = 0;  // ticks; what is surely presented. Video may say 0: until the next sample
    bool isSync = false;         // sound: every sample is one, whatever is said here
};

// Writes one movie to a sink: fragments while it is recorded, an ordinary movie with a complete index once finished, in
// the same file and without copying the media (README.md tells how). Cut anywhere, the file plays up to its last whole
// fragment.
//
// A resource, used on one lane at a time; it has no clock, no thread and no file. It blocks as long as the sink does.
// The sink is borrowed and must outlive it. Destroying it unfinished writes nothing: what was flushed stays playable.
//
// Memory: the samples of one fragment, and an index of 8 bytes a sample and 12 a chunk; at the finish once more about
// as much.
class MovieBoxWriter final {
public:
    explicit MovieBoxWriter(BoxSink& sink, MovieOptions options = {});
    MovieBoxWriter(const MovieBoxWriter&) = delete;
    MovieBoxWriter& operator=(const MovieBoxWriter&) = delete;

    // Declare the tracks before the start: at most one of video, eight in all. None: it can't be described.
    [[nodiscard]] std::optional<TrackId> addVideoTrack(VideoTrackDescription track);
    [[nodiscard]] std::optional<TrackId> addAudioTrack(AudioTrackDescription track);

    // Begins the file. The tracks' boxes follow with the first fragment, when it is known where the movie begins.
    [[nodiscard]] MovieError start();

    // Takes a copy of the bytes. Closes the fragment before the sample where it is long enough, so it may call the
    // sink. Anything but none: the sample was not taken, and, except for sinkFailed, writing can go on.
    [[nodiscard]] MovieError addSample(TrackId track, const SampleInfo& info, std::span<const std::uint8_t> bytes);

    // Writes what is pending as a fragment of its own. To be called once a second by an owner that has a clock, so that
    // no more than that is lost when pictures are rare. The last picture of a fragment whose end is not known yet is
    // given one tick there, and its true duration by the start of the next fragment and by the final index. Nothing to
    // do is no error; nor is sound that waits for a video track's first picture, where the movie begins.
    [[nodiscard]] MovieError flushFragment();

    // Completes the movie: the last picture lasts until `lastPictureEnd` (ticks of the video track; one tick at least,
    // and 2^32-1 at most), tracks without a sample are left out. To be called once. After sinkFailed the file plays as
    // far as it was flushed. `presentationEnd` (nanoseconds on the tracks' time line): later samples are left out of
    // the movie, though their bytes stay in the file, and what lasts longer is cut; the first picture always stays.
    [[nodiscard]] MovieError finish(std::int64_t lastPictureEnd,
                                    std::optional<std::int64_t> presentationEnd = std::nullopt);

    // Bytes handed to the sink so far.
    [[nodiscard]] std::uint64_t bytesWritten() const { return position_; }
    [[nodiscard]] std::uint32_t fragmentCount() const { return fragments_; }

private:
    enum class State : std::uint8_t { describing, writing, finished, failed };

    [[nodiscard]] std::optional<TrackId> addTrack(TrackDescription description, std::int64_t priming);
    [[nodiscard]] MovieTrack* find(TrackId id);
    [[nodiscard]] const MovieTrack* videoTrack() const;
    [[nodiscard]] MovieError check(const MovieTrack& track, const SampleInfo& info,
                                   std::span<const std::uint8_t> bytes) const;
    [[nodiscard]] bool closesFragment(const MovieTrack& track, const SampleInfo& info, std::size_t bytes) const;
    [[nodiscard]] bool waitsForPicture() const;
    void cut(MovieTrack& track, std::int64_t end);
    void take(MovieTrack& track, const SampleInfo& info, std::span<const std::uint8_t> bytes);
    [[nodiscard]] std::uint32_t lastFragmentDuration(const MovieTrack& track) const;
    [[nodiscard]] MovieError writeFragment();
    [[nodiscard]] bool showFragment(std::uint64_t headerOffset);
    [[nodiscard]] MovieError replaceFragmentsByIndex();
    [[nodiscard]] bool append(std::span<const std::uint8_t> bytes);
    [[nodiscard]] MovieError fail();

    BoxSink& sink_;
    MovieOptions options_;
    State state_ = State::describing;
    std::vector<MovieTrack> tracks_;
    BoxBuffer boxes_;  // scratch, kept for its memory
    std::uint64_t position_ = 0;
    std::uint64_t pendingBytes_ = 0;
    std::uint64_t samples_ = 0;
    std::uint32_t fragments_ = 0;
};

}  // namespace lumacast::mp4
