#pragma once
#include <cstdint>
#include <memory>
#include <optional>
#include <variant>

#include "base/Identifiers.h"
#include "linux/media/PlaneConverter.h"
#include "linux/media/VideoEncoder.h"
#include "linux/media/mp4/MovieBoxWriter.h"
#include "writer/media/SampleBuffer.h"

namespace lumacast::media {

/// The picture track on its way from planes to the movie file. Belongs to the movie's encoder thread.
class PictureTrack final {
public:
    /// Opens the encoder and declares the track.
    static std::variant<std::unique_ptr<PictureTrack>, Error> open(const VideoTrackSettings& settings,
                                                                   const AffineTransform& transform,
                                                                   EncoderChoice& choice, mp4::MovieBoxWriter& movie);

    /// Converts and encodes a picture that is shown from `nanoseconds` after the movie's zero on; lets go of the plane
    /// before it encodes. The movie starts with its first picture, so that one is shown from zero on. A stamp that is
    /// not later than the one before is dropped.
    std::optional<Error> add(SampleRef sample, std::int64_t nanoseconds);
    std::optional<Error> finish();

    /// Whether the picture that was added last showed anything new.
    bool hasNews() const { return hasNews_; }
    /// When the last picture ends if nobody knows better, nanoseconds after zero.
    std::int64_t naturalEnd() const { return naturalEnd_; }

private:
    PictureTrack(const VideoTrackSettings& settings, std::unique_ptr<VideoEncoder> encoder, mp4::MovieBoxWriter& movie);
    void deliver(const EncodedPicture& picture);

    const VideoTrackSettings settings_;
    PlaneConverter converter_;
    const std::unique_ptr<VideoEncoder> encoder_;
    mp4::MovieBoxWriter& movie_;
    mp4::TrackId track_{};
    KeyFrameClock keyFrames_;
    std::optional<std::int64_t> lastStamp_;  ///< ticks of VideoEncoder::kTimescale
    std::int64_t naturalEnd_ = 0;
    bool hasNews_ = false;
    std::vector<std::uint8_t> bytes_;  ///< the sample under construction, kept for its memory
    std::optional<Error> error_;
};

/// A time as nanoseconds; none for a time that is not finite, or so far off that sums would overflow.
std::optional<std::int64_t> nanosecondsOf(const MediaTime& time);

}  // namespace lumacast::media
