#include "extensions/live-push/PictureEncoder.h"

namespace lumacast::extensions {

PictureEncoder::PictureEncoder(int width, int height, std::int64_t bitRate) {
    const AVCodec* codec = avcodec_find_encoder_by_name("libx264");
    if (codec) encoder_.reset(avcodec_alloc_context3(codec));
    if (!encoder_) {
        error_ = "no H.264 encoder";
        return;
    }
    encoder_->width = width;
    encoder_->height = height;
    encoder_->pix_fmt = AV_PIX_FMT_YUV420P;
    encoder_->time_base = {1, kTicksPerSecond};
    encoder_->framerate = {60, 1};
    encoder_->color_range = AVCOL_RANGE_MPEG;
    encoder_->colorspace = AVCOL_SPC_SMPTE170M;
    encoder_->color_primaries = AVCOL_PRI_SMPTE170M;
    encoder_->color_trc = AVCOL_TRC_SMPTE170M;
    encoder_->max_b_frames = 0;
    encoder_->gop_size = 600;  // key frames come by time
    encoder_->bit_rate = bitRate;
    encoder_->rc_max_rate = bitRate;
    encoder_->rc_buffer_size = static_cast<int>(bitRate);
    encoder_->flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
    AVDictionary* options = nullptr;
    av_dict_set(&options, "preset", "veryfast", 0);
    av_dict_set(&options, "tune", "zerolatency", 0);
    av_dict_set(&options, "forced-idr", "1", 0);
    const int status = avcodec_open2(encoder_.get(), codec, &options);
    av_dict_free(&options);
    if (status >= 0) return;
    error_ = "H.264 encoder: " + avErrorText(status);
    encoder_.reset();
}

std::vector<AvOwned<AVPacket>> PictureEncoder::encode(AVFrame& picture, std::int64_t ticks, bool wantsKeyFrame) {
    std::vector<AvOwned<AVPacket>> packets;
    if (!encoder_) return packets;
    const bool isKeyFrame = wantsKeyFrame || !lastKeyFrame_ || ticks - *lastKeyFrame_ >= kTicksBetweenKeyFrames;
    if (isKeyFrame) lastKeyFrame_ = ticks;
    picture.pts = ticks;
    picture.pict_type = isKeyFrame ? AV_PICTURE_TYPE_I : AV_PICTURE_TYPE_NONE;
    if (avcodec_send_frame(encoder_.get(), &picture) < 0) return packets;
    for (;;) {
        AvOwned<AVPacket> packet(av_packet_alloc());
        if (!packet || avcodec_receive_packet(encoder_.get(), packet.get()) < 0) return packets;
        packets.push_back(std::move(packet));
    }
}

}  // namespace lumacast::extensions
