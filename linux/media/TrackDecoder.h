#pragma once
#include <cstdint>
#include <memory>
#include <optional>
#include <variant>

#include "linux/media/AvHandles.h"
#include "linux/media/MovieSource.h"

namespace lumacast::media {

/// Decodes one track of a movie, with one thread and without leniency: what is damaged is an error, never a guess.
/// Reads the disk; belongs to one thread.
class TrackDecoder final {
public:
    /// Opens the movie once more, for this track alone (its number among MovieSource::tracks), to be read from
    /// `nanoseconds` on or a little before. ENOTSUP for pictures that are larger than 8192 by 8192.
    static std::variant<std::unique_ptr<TrackDecoder>, Error> open(const std::string& path, std::size_t track,
                                                                   std::int64_t nanoseconds);

    /// The next picture or packet of sound, with its stamp in ticks of the track; null at the end. Valid until the next
    /// call.
    std::variant<const AVFrame*, Error> next();

    const MovieSource& source() const { return *source_; }
    int timescale() const { return source_->tracks()[track_].timescale; }

private:
    TrackDecoder(std::unique_ptr<MovieSource> source, std::size_t track, AvOwned<AVCodecContext> context);
    std::optional<Error> feed();

    const std::unique_ptr<MovieSource> source_;
    const std::size_t track_;
    const AvOwned<AVCodecContext> context_;
    const AvOwned<AVFrame> frame_;
    const AvOwned<AVPacket> packet_;
};

}  // namespace lumacast::media
