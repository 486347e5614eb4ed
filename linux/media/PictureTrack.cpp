#include "linux/media/PictureTrack.h"

#include <algorithm>
#include <utility>

#include "linux/media/SoundTrack.h"
#include "linux/media/mp4/AvcBitstream.h"

namespace lumacast::media {

std::optional<std::int64_t> nanosecondsOf(const MediaTime& time) {
    constexpr std::int64_t kFarthest = 1'000'000'000LL * 1'000'000'000LL;  // some thirty years
    if (time.flags != MediaTime::kValid && time.flags != (MediaTime::kValid | MediaTime::kRounded)) return std::nullopt;
    if (time.timescale <= 0) return std::nullopt;
    const std::int64_t nanoseconds = av_rescale_rnd(time.value, 1'000'000'000, time.timescale, AV_ROUND_NEAR_INF);
    if (nanoseconds > kFarthest || nanoseconds < -kFarthest) return std::nullopt;
    return nanoseconds;
}

PictureTrack::PictureTrack(const VideoTrackSettings& settings, std::unique_ptr<VideoEncoder> encoder,
                           mp4::MovieBoxWriter& movie)
    : settings_(settings), converter_(settings.width, settings.height), encoder_(std::move(encoder)), movie_(movie) {}

std::variant<std::unique_ptr<PictureTrack>, Error> PictureTrack::open(const VideoTrackSettings& settings,
                                                                      const AffineTransform& transform,
                                                                      EncoderChoice& choice,
                                                                      mp4::MovieBoxWriter& movie) {
    auto opened = VideoEncoder::open(settings, choice);
    if (auto* const error = std::get_if<Error>(&opened)) return *error;
    std::unique_ptr<PictureTrack> pictures(new PictureTrack(settings, std::move(std::get<0>(opened)), movie));
    mp4::ParameterSets sets = mp4::parameterSetsOf(pictures->encoder_->header());
    mp4::VideoTrackDescription description;
    description.width = static_cast<std::uint16_t>(settings.width);
    description.height = static_cast<std::uint16_t>(settings.height);
    description.timescale = VideoEncoder::kTimescale;
    description.sequenceParameterSets = std::move(sets.sequence);
    description.pictureParameterSets = std::move(sets.picture);
    description.transform = {transform.a, transform.b, transform.c, transform.d, transform.tx, transform.ty};
    const auto track = movie.addVideoTrack(std::move(description));
    if (!track) return systemError(EPROTO);
    pictures->track_ = *track;
    return pictures;
}

std::optional<Error> PictureTrack::add(SampleRef sample, std::int64_t nanoseconds) {
    if (!sample->image() || !sample->image()->plane()) return std::nullopt;
    const std::int64_t stamp = lastStamp_ ? (nanoseconds + 500) / 1000 : 0;
    if (lastStamp_ && stamp <= *lastStamp_) return std::nullopt;
    const std::uint64_t converted = converter_.convertedPixels();
    const std::shared_ptr<I420Picture> picture = converter_.convert(*sample->image()->plane());
    if (!picture) return std::nullopt;
    hasNews_ = converter_.convertedPixels() != converted;
    const std::int64_t stated = nanosecondsOf(sample->duration()).value_or(0);
    sample.reset();

    lastStamp_ = stamp;
    naturalEnd_ = nanoseconds + std::max(stated, 1'000'000'000 / std::int64_t{settings_.frameRate});
    const auto error = encoder_->encode(picture, stamp, keyFrames_.next(stamp),
                                        [this](const EncodedPicture& encoded) { deliver(encoded); });
    return error ? error : error_;
}

std::optional<Error> PictureTrack::finish() {
    const auto error = encoder_->drain([this](const EncodedPicture& encoded) { deliver(encoded); });
    return error ? error : error_;
}

void PictureTrack::deliver(const EncodedPicture& picture) {
    if (picture.isKeyFrame) keyFrames_.sawKeyFrame(picture.stamp);
    bytes_.clear();
    if (!mp4::appendLengthPrefixed(picture.bytes, bytes_)) return;
    const mp4::SampleInfo info{picture.stamp, 0, picture.isKeyFrame};
    if (const auto error = movieError(movie_.addSample(track_, info, bytes_)); error && !error_) error_ = error;
}

}  // namespace lumacast::media
