#pragma once
#include <cstdint>
#include <memory>
#include <optional>
#include <variant>
#include <vector>

#include "linux/media/TrackDecoder.h"
#include "linux/media/mp4/MovieBoxWriter.h"

namespace lumacast::media {

/// Encodes pictures anew, at the size, the times and the colours they have, for the best quality that a file is
/// reasonably stored with: x264 at constant rate factor 18, High profile, few threads. Without B-pictures, which the
/// box writer does not know. Belongs to one thread.
class PictureReencoder final {
public:
    /// Opens the encoder and declares the track, described as `track` of `source` is.
    static std::variant<std::unique_ptr<PictureReencoder>, Error> open(const MovieSource& source, std::size_t track,
                                                                       mp4::MovieBoxWriter& movie);

    /// Adds a picture that is shown from `stamp` on, ticks of the track. EPROTO for one of another size or format.
    std::optional<Error> add(const AVFrame& picture, std::int64_t stamp);
    std::optional<Error> finish();
    /// The stamp of the last picture that is in the movie, ticks; none before the first.
    std::optional<std::int64_t> written() const { return written_; }

    /// Threads that an encoding export takes: one where there are few processors.
    static int threads();

private:
    PictureReencoder(AvOwned<AVCodecContext> context, mp4::MovieBoxWriter& movie);
    std::optional<Error> send(const AVFrame* picture);

    const AvOwned<AVCodecContext> context_;
    const AvOwned<AVFrame> frame_;
    const AvOwned<AVPacket> packet_;
    mp4::MovieBoxWriter& movie_;
    mp4::TrackId id_{};
    int timescale_ = 0;
    std::optional<std::int64_t> keyFrame_, written_;
    std::vector<std::uint8_t> bytes_;
};

}  // namespace lumacast::media
