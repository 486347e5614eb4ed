#include "linux/media/AudioEncoder.h"

#include <algorithm>

namespace lumacast::media {

AudioEncoder::AudioEncoder(AvOwned<AVCodecContext> context)
    : context_(std::move(context)), frame_(av_frame_alloc()), packet_(av_packet_alloc()) {}

std::variant<std::unique_ptr<AudioEncoder>, Error> AudioEncoder::open(const AudioTrackSettings& settings) {
    const AVCodec* const codec = avcodec_find_encoder_by_name("aac");
    if (!codec) return systemError(ENOTSUP);
    AvOwned<AVCodecContext> context(avcodec_alloc_context3(codec));
    if (!context) return systemError(ENOMEM);
    context->sample_fmt = AV_SAMPLE_FMT_FLTP;
    context->sample_rate = settings.sampleRate;
    av_channel_layout_default(&context->ch_layout, settings.channels);
    context->bit_rate = settings.bitRate;
    context->profile = FF_PROFILE_AAC_LOW;
    context->time_base = {1, settings.sampleRate};
    context->flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
    if (const int error = avcodec_open2(context.get(), codec, nullptr); error < 0) return avError(error);

    std::unique_ptr<AudioEncoder> encoder(new AudioEncoder(std::move(context)));
    AVFrame& frame = *encoder->frame_;
    frame.format = AV_SAMPLE_FMT_FLTP;
    frame.sample_rate = settings.sampleRate;
    frame.nb_samples = static_cast<int>(encoder->packetFrames());
    av_channel_layout_copy(&frame.ch_layout, &encoder->context_->ch_layout);
    if (const int error = av_frame_get_buffer(&frame, 0); error < 0) return avError(error);
    return encoder;
}

std::optional<Error> AudioEncoder::encode(const StereoSound& sound, std::size_t first, const Output& output) {
    if (const int error = av_frame_make_writable(frame_.get()); error < 0) return avError(error);
    const std::size_t wanted = packetFrames();
    const std::size_t count = std::min(wanted, sound.frames() - first);
    const bool isMono = context_->ch_layout.nb_channels == 1;
    for (std::size_t channel = 0; channel < (isMono ? 1 : 2); ++channel) {
        auto* const samples = reinterpret_cast<float*>(frame_->extended_data[channel]);
        const auto from = sound.planes[channel].begin() + static_cast<std::ptrdiff_t>(first);
        std::copy_n(from, count, samples);
        std::fill(samples + count, samples + wanted, 0.0f);
        if (isMono) {
            for (std::size_t i = 0; i < count; ++i) samples[i] = (samples[i] + sound.planes[1][first + i]) / 2;
        }
    }
    frame_->pts = position_;
    position_ += static_cast<std::int64_t>(wanted);
    if (const int error = avcodec_send_frame(context_.get(), frame_.get()); error < 0) return avError(error);
    return receive(output);
}

std::optional<Error> AudioEncoder::drain(const Output& output) {
    if (const int error = avcodec_send_frame(context_.get(), nullptr); error < 0 && error != AVERROR_EOF) {
        return avError(error);
    }
    return receive(output);
}

std::optional<Error> AudioEncoder::receive(const Output& output) {
    for (;;) {
        const int error = avcodec_receive_packet(context_.get(), packet_.get());
        if (error == AVERROR(EAGAIN) || error == AVERROR_EOF) return std::nullopt;
        if (error < 0) return avError(error);
        output({packet_->data, static_cast<std::size_t>(packet_->size)});
        av_packet_unref(packet_.get());
    }
}

}  // namespace lumacast::media
