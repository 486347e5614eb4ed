#pragma once
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "linux/media/AvHandles.h"
#include "linux/media/mp4/MovieBoxWriter.h"

namespace lumacast::media {

/// A finished MPEG-4 movie that is read, sample by sample, as it was written. Times are those of the movie: zero is its
/// beginning, and what lies before, to decode from, has negative ones. Used on one thread at a time; reads the disk.
class MovieSource final {
public:
    /// One sample; `bytes` are valid until the next call of read().
    struct Sample {
        std::size_t track = 0;
        std::span<const std::uint8_t> bytes;
        std::int64_t stamp = 0;     ///< ticks of the track
        std::int64_t duration = 0;  ///< ticks of the track
        bool isKeyFrame = false;
    };
    struct Track {
        bool isVideo = false;
        int timescale = 0;    ///< ticks per second
        std::int32_t id = 0;  ///< in the file
    };

    /// An error for what is no movie, and for tracks that can't be copied: other codecs than ours.
    static std::variant<std::unique_ptr<MovieSource>, Error> open(const std::string& path);

    /// Nanoseconds; 0 when the movie does not know, or says more than a year.
    std::int64_t duration() const;
    const std::vector<Track>& tracks() const { return tracks_; }

    /// Declares the tracks, in order, to a movie that is to hold copies of them.
    [[nodiscard]] bool declareTracks(mp4::MovieBoxWriter& movie, std::vector<mp4::TrackId>& ids) const;

    /// What a track is declared with, as it is in this movie.
    mp4::VideoTrackDescription describeVideo(std::size_t track) const;
    mp4::AudioTrackDescription describeAudio(std::size_t track) const;
    /// For a decoder. Valid while this lives.
    const AVCodecParameters& codecOf(std::size_t track) const { return *streamOf(track).codecpar; }
    /// Pictures a second on average, as far as the movie knows; 0 when it does not.
    double rateOf(std::size_t track) const;
    /// From now on only this track is read; what belongs to others is not even fetched from the disk.
    void readOnly(std::size_t track);

    /// The time of the key frame from which the picture at `nanoseconds` is decoded, ticks of the video track; none
    /// without pictures that early.
    std::optional<std::int64_t> keyFrameBefore(std::int64_t nanoseconds) const;
    /// Goes on reading at `nanoseconds`, or a little before.
    std::optional<Error> seek(std::int64_t nanoseconds);
    /// The next sample in the order of the file; none at the end.
    std::variant<std::optional<Sample>, Error> read();

private:
    explicit MovieSource(AvOwned<AVFormatContext> file);
    const AVStream* videoStream() const;
    const AVStream& streamOf(std::size_t track) const { return *file_->streams[streamOfTrack_[track]]; }

    AvOwned<AVFormatContext> file_;
    AvOwned<AVPacket> packet_;
    std::vector<Track> tracks_;
    std::vector<int> streamOfTrack_;
    std::vector<std::optional<std::size_t>> trackOfStream_;
};

}  // namespace lumacast::media
