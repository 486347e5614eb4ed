#include "linux/media/PictureReencoder.h"

#include <algorithm>
#include <cmath>
#include <string>
#include <thread>
#include <utility>

#include "linux/media/SoundTrack.h"
#include "linux/media/mp4/AvcBitstream.h"

namespace lumacast::media {

namespace {

constexpr int kKeyFrameSeconds = 2;
/// Pictures that the encoder looks ahead take memory: no more than so much of it.
constexpr std::int64_t kLookAheadBytes = 256 << 20;
constexpr std::int64_t kLookAheadPictures = 20;

AvOwned<AVCodecContext> described(const AVCodec* codec, const MovieSource& source, std::size_t track) {
    AvOwned<AVCodecContext> context(avcodec_alloc_context3(codec));
    if (!context) return nullptr;
    const AVCodecParameters& from = source.codecOf(track);
    context->width = from.width;
    context->height = from.height;
    context->pix_fmt = AV_PIX_FMT_YUV420P;
    context->time_base = {1, source.tracks()[track].timescale};
    const int rate = static_cast<int>(std::lround(std::clamp(source.rateOf(track), 1.0, 240.0)));
    context->framerate = {rate, 1};
    context->gop_size = kKeyFrameSeconds * rate;
    context->max_b_frames = 0;
    context->profile = FF_PROFILE_H264_HIGH;
    context->thread_count = PictureReencoder::threads();
    context->flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
    context->color_primaries = from.color_primaries;
    context->color_trc = from.color_trc;
    context->colorspace = from.color_space;
    context->color_range = from.color_range;
    context->chroma_sample_location = from.chroma_location;
    context->sample_aspect_ratio = from.sample_aspect_ratio;
    const std::int64_t bytes = std::max(1, from.width * from.height * 3 / 2);
    const std::int64_t ahead = std::clamp<std::int64_t>(kLookAheadBytes / bytes, 1, kLookAheadPictures);
    const auto set = [&](const char* key, const std::string& value) {
        av_opt_set(context->priv_data, key, value.c_str(), 0);
    };
    set("preset", "veryfast");
    set("profile", "high");
    set("crf", "18");
    set("forced-idr", "1");
    set("rc-lookahead", std::to_string(ahead));
    return context;
}

bool isTakable(const AVFrame& picture, const AVCodecContext& context) {
    const bool isPlain = picture.format == AV_PIX_FMT_YUV420P || picture.format == AV_PIX_FMT_YUVJ420P;
    return isPlain && picture.width == context.width && picture.height == context.height;
}

}  // namespace

int PictureReencoder::threads() {
    return static_cast<int>(std::clamp(std::thread::hardware_concurrency() / 4, 1U, 4U));
}

PictureReencoder::PictureReencoder(AvOwned<AVCodecContext> context, mp4::MovieBoxWriter& movie)
    : context_(std::move(context)), frame_(av_frame_alloc()), packet_(av_packet_alloc()), movie_(movie) {}

std::variant<std::unique_ptr<PictureReencoder>, Error> PictureReencoder::open(const MovieSource& source,
                                                                              std::size_t track,
                                                                              mp4::MovieBoxWriter& movie) {
    const AVCodec* const codec = avcodec_find_encoder_by_name("libx264");
    if (!codec) return systemError(ENOTSUP);
    auto context = described(codec, source, track);
    if (!context) return systemError(ENOMEM);
    if (const int error = avcodec_open2(context.get(), codec, nullptr); error < 0) return avError(error);
    std::unique_ptr<PictureReencoder> pictures(new PictureReencoder(std::move(context), movie));
    pictures->timescale_ = source.tracks()[track].timescale;
    auto description = source.describeVideo(track);
    const auto& header = *pictures->context_;
    auto sets = mp4::parameterSetsOf({header.extradata, static_cast<std::size_t>(std::max(header.extradata_size, 0))});
    description.sequenceParameterSets = std::move(sets.sequence);
    description.pictureParameterSets = std::move(sets.picture);
    const auto id = movie.addVideoTrack(std::move(description));
    if (!id) return systemError(ENOTSUP);
    pictures->id_ = *id;
    return pictures;
}

std::optional<Error> PictureReencoder::add(const AVFrame& picture, std::int64_t stamp) {
    if (!isTakable(picture, *context_)) return systemError(EPROTO);
    av_frame_unref(frame_.get());
    if (const int error = av_frame_ref(frame_.get(), &picture); error < 0) return avError(error);
    // Rare pictures shall be found by a player that seeks, too: the encoder counts pictures, not seconds.
    const bool isKey = !keyFrame_ || stamp - *keyFrame_ >= std::int64_t{kKeyFrameSeconds} * timescale_;
    if (isKey) keyFrame_ = stamp;
    frame_->pts = stamp;
    frame_->pict_type = isKey ? AV_PICTURE_TYPE_I : AV_PICTURE_TYPE_NONE;
    const auto error = send(frame_.get());
    av_frame_unref(frame_.get());
    return error;
}

std::optional<Error> PictureReencoder::finish() { return send(nullptr); }

std::optional<Error> PictureReencoder::send(const AVFrame* picture) {
    int error = avcodec_send_frame(context_.get(), picture);
    if (error < 0) return avError(error);
    for (;;) {
        error = avcodec_receive_packet(context_.get(), packet_.get());
        if (error == AVERROR(EAGAIN) || error == AVERROR_EOF) return std::nullopt;
        if (error < 0) return avError(error);
        bytes_.clear();
        const std::span<const std::uint8_t> encoded(packet_->data, static_cast<std::size_t>(packet_->size));
        if (!mp4::appendLengthPrefixed(encoded, bytes_)) return systemError(EPROTO);
        const mp4::SampleInfo info{packet_->pts, 0, (packet_->flags & AV_PKT_FLAG_KEY) != 0};
        const auto result = movie_.addSample(id_, info, bytes_);
        if (result != mp4::MovieError::none) return movieError(result).value_or(systemError(EPROTO));
        written_ = packet_->pts;
        av_packet_unref(packet_.get());
    }
}

}  // namespace lumacast::media
