#include "extensions/media/AacEncoder.h"

#include <algorithm>

namespace lumacast::extensions {

AacEncoder::AacEncoder(int sampleRate, std::int64_t bitRate, std::int64_t startSample)
    : sampleRate_(sampleRate), start_(startSample), position_(startSample), encoded_(startSample) {
    const AVCodec* codec = avcodec_find_encoder_by_name("aac");
    if (codec) encoder_.reset(avcodec_alloc_context3(codec));
    if (!encoder_) {
        error_ = "no AAC encoder";
        return;
    }
    encoder_->sample_fmt = AV_SAMPLE_FMT_FLTP;
    encoder_->sample_rate = sampleRate;
    encoder_->time_base = {1, sampleRate};
    encoder_->bit_rate = bitRate;
    encoder_->ch_layout = AV_CHANNEL_LAYOUT_STEREO;
    encoder_->flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
    if (const int status = avcodec_open2(encoder_.get(), codec, nullptr); status < 0) {
        error_ = "AAC encoder: " + avErrorText(status);
        encoder_.reset();
    }
}

std::vector<AvOwned<AVPacket>> AacEncoder::encode(const StereoSound& sound) {
    std::vector<AvOwned<AVPacket>> packets;
    if (!encoder_) return packets;
    position_ += static_cast<std::int64_t>(sound.size());
    waiting_.append(sound);
    const auto whole = static_cast<std::size_t>(encoder_->frame_size);
    std::size_t at = 0;
    for (; waiting_.size() - at >= whole; at += whole) encodeFrame(at, whole, packets);
    waiting_.dropFront(at);
    return packets;
}

std::vector<AvOwned<AVPacket>> AacEncoder::finish() {
    std::vector<AvOwned<AVPacket>> packets;
    if (!encoder_) return packets;
    if (waiting_.size() > 0) encodeFrame(0, waiting_.size(), packets);
    waiting_.resize(0);
    if (avcodec_send_frame(encoder_.get(), nullptr) >= 0) collect(packets);
    return packets;
}

void AacEncoder::encodeFrame(std::size_t from, std::size_t count, std::vector<AvOwned<AVPacket>>& packets) {
    const AvOwned<AVFrame> frame(av_frame_alloc());
    if (!frame) return;
    frame->format = AV_SAMPLE_FMT_FLTP;
    frame->ch_layout = encoder_->ch_layout;
    frame->sample_rate = sampleRate_;
    frame->nb_samples = static_cast<int>(count);
    frame->pts = encoded_;
    encoded_ += static_cast<std::int64_t>(count);
    if (av_frame_get_buffer(frame.get(), 0) < 0) return;
    for (std::size_t channel = 0; channel < 2; ++channel)
        std::copy_n(waiting_.channels[channel].begin() + static_cast<std::ptrdiff_t>(from), count,
                    reinterpret_cast<float*>(frame->extended_data[channel]));
    if (avcodec_send_frame(encoder_.get(), frame.get()) >= 0) collect(packets);
}

void AacEncoder::collect(std::vector<AvOwned<AVPacket>>& packets) {
    for (;;) {
        AvOwned<AVPacket> packet(av_packet_alloc());
        if (!packet || avcodec_receive_packet(encoder_.get(), packet.get()) < 0) return;
        if (packet->pts < start_) continue;
        packets.push_back(std::move(packet));
    }
}

}  // namespace lumacast::extensions
