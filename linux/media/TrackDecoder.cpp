#include "linux/media/TrackDecoder.h"

#include <cstring>
#include <utility>

namespace lumacast::media {

namespace {

constexpr std::int64_t kMostPixels = 8192LL * 8192LL;

}  // namespace

TrackDecoder::TrackDecoder(std::unique_ptr<MovieSource> source, std::size_t track, AvOwned<AVCodecContext> context)
    : source_(std::move(source)), track_(track), context_(std::move(context)), frame_(av_frame_alloc()),
      packet_(av_packet_alloc()) {}

std::variant<std::unique_ptr<TrackDecoder>, Error> TrackDecoder::open(const std::string& path, std::size_t track,
                                                                      std::int64_t nanoseconds) {
    auto opened = MovieSource::open(path);
    if (auto* const error = std::get_if<Error>(&opened)) return *error;
    auto source = std::move(std::get<0>(opened));
    if (track >= source->tracks().size()) return systemError(EPROTO);  // somebody has put another movie there
    source->readOnly(track);
    if (const auto error = source->seek(nanoseconds)) return *error;

    const AVCodecParameters& parameters = source->codecOf(track);
    if (std::int64_t{parameters.width} * parameters.height > kMostPixels) return systemError(ENOTSUP);
    const AVCodec* const codec = avcodec_find_decoder(parameters.codec_id);
    if (!codec) return systemError(ENOTSUP);
    AvOwned<AVCodecContext> context(avcodec_alloc_context3(codec));
    if (!context) return systemError(ENOMEM);
    if (const int error = avcodec_parameters_to_context(context.get(), &parameters); error < 0) return avError(error);
    context->thread_count = 1;
    context->max_pixels = kMostPixels;
    context->err_recognition = AV_EF_EXPLODE | AV_EF_CRCCHECK | AV_EF_BITSTREAM | AV_EF_BUFFER;
    // Concealment stays on though what is concealed is refused: without it the decoder takes the second slice of any
    // picture for damaged.
    context->pkt_timebase = {1, source->tracks()[track].timescale};
    if (const int error = avcodec_open2(context.get(), codec, nullptr); error < 0) return avError(error);
    return std::unique_ptr<TrackDecoder>(new TrackDecoder(std::move(source), track, std::move(context)));
}

std::variant<const AVFrame*, Error> TrackDecoder::next() {
    for (;;) {
        const int error = avcodec_receive_frame(context_.get(), frame_.get());
        if (error == AVERROR_EOF) return nullptr;
        if (error == AVERROR(EAGAIN)) {
            if (const auto failure = feed()) return *failure;
            continue;
        }
        if (error < 0) return avError(error);
        const bool isDamaged = frame_->decode_error_flags != 0 || (frame_->flags & AV_FRAME_FLAG_CORRUPT) != 0;
        if (isDamaged || frame_->pts == AV_NOPTS_VALUE) return systemError(EPROTO);
        return frame_.get();
    }
}

/// One sample, or the end, into the decoder.
std::optional<Error> TrackDecoder::feed() {
    auto next = source_->read();
    if (auto* const error = std::get_if<Error>(&next)) return *error;
    const auto& sample = std::get<0>(next);
    int error = 0;
    if (sample) {
        av_packet_unref(packet_.get());
        if (av_new_packet(packet_.get(), static_cast<int>(sample->bytes.size())) < 0) return systemError(ENOMEM);
        std::memcpy(packet_->data, sample->bytes.data(), sample->bytes.size());
        packet_->pts = packet_->dts = sample->stamp;
        packet_->duration = sample->duration;
        packet_->flags = sample->isKeyFrame ? AV_PKT_FLAG_KEY : 0;
        error = avcodec_send_packet(context_.get(), packet_.get());
    } else {
        error = avcodec_send_packet(context_.get(), nullptr);
    }
    return error < 0 && error != AVERROR_EOF ? std::optional(avError(error)) : std::nullopt;
}

}  // namespace lumacast::media
