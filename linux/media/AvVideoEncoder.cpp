#include "linux/media/AvVideoEncoder.h"

#include <algorithm>
#include <bit>
#include <cstring>
#include <string>

namespace lumacast::media {

namespace {

constexpr int kSoftwareThreads = 2;

void describe(AVCodecContext& context, const VideoTrackSettings& settings) {
    context.width = settings.width;
    context.height = settings.height;
    context.pix_fmt = AV_PIX_FMT_YUV420P;
    context.time_base = {1, VideoEncoder::kTimescale};
    context.framerate = {settings.frameRate, 1};
    context.gop_size = settings.maxKeyFrameInterval;
    context.max_b_frames = 0;
    context.profile = FF_PROFILE_H264_HIGH;
    context.bit_rate = settings.bitRate;
    // The average is a ceiling: what is simple takes less. A second's worth may be spent at once.
    context.rc_max_rate = settings.bitRate;
    context.rc_buffer_size = static_cast<int>(settings.bitRate);
    context.flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
    context.color_primaries = AVCOL_PRI_SMPTE170M;
    context.color_trc = AVCOL_TRC_SMPTE170M;
    context.colorspace = AVCOL_SPC_SMPTE170M;
    context.color_range = AVCOL_RANGE_MPEG;
    context.chroma_sample_location = AVCHROMA_LOC_CENTER;  // libyuv averages two by two pixels
}

/// Whatever an encoder does not know it ignores: the options of all three stand in one place each.
void tune(AVCodecContext& context, const std::string& name) {
    void* const options = context.priv_data;
    const auto set = [&](const char* key, const char* value) { av_opt_set(options, key, value, 0); };
    if (name == "libx264") {
        context.thread_count = kSoftwareThreads;
        set("preset", "ultrafast");
        set("tune", "zerolatency");
        set("profile", "high");
        set("forced-idr", "1");
        // Constant quality beneath the ceiling. An average would be met by starving rare pictures: this encoder spends
        // per picture, and can look at the stamps only if it may hold a picture back (see paceRate).
        set("crf", "20");
        // "ultrafast" alone is Constrained Baseline: the 8x8 transform makes it High.
        set("x264-params", "8x8dct=1:cabac=1:force-cfr=1:scenecut=0:keyint-min=1");
    } else if (name == "h264_nvenc") {
        set("preset", "p4");
        set("tune", "ull");
        set("profile", "high");
        set("rc", "vbr");
        set("delay", "0");
        set("zerolatency", "1");
        set("forced-idr", "1");
    } else if (name == "h264_vaapi") {
        set("profile", "high");
        set("async_depth", "1");
    }
}

/// Frames in the graphics card's memory for `context`; null when there is no such card.
AvOwned<AVBufferRef> makeUploads(AVCodecContext& context) {
    AVBufferRef* device = nullptr;
    if (av_hwdevice_ctx_create(&device, AV_HWDEVICE_TYPE_VAAPI, nullptr, nullptr, 0) < 0) return nullptr;
    const AvOwned<AVBufferRef> ownedDevice(device);
    AvOwned<AVBufferRef> frames(av_hwframe_ctx_alloc(device));
    if (!frames) return nullptr;
    auto* const description = reinterpret_cast<AVHWFramesContext*>(frames->data);
    description->format = AV_PIX_FMT_VAAPI;
    description->sw_format = AV_PIX_FMT_YUV420P;
    description->width = context.width;
    description->height = context.height;
    description->initial_pool_size = 4;
    if (av_hwframe_ctx_init(frames.get()) < 0) return nullptr;
    context.pix_fmt = AV_PIX_FMT_VAAPI;
    context.hw_frames_ctx = av_buffer_ref(frames.get());
    return frames;
}

/// A reference that keeps the picture alive for as long as an encoder holds on to it.
AVBufferRef* shareMemory(const std::shared_ptr<I420Picture>& picture) {
    auto* const holder = new std::shared_ptr<I420Picture>(picture);
    const auto release = [](void* opaque, std::uint8_t*) { delete static_cast<std::shared_ptr<I420Picture>*>(opaque); };
    AVBufferRef* const buffer =
        av_buffer_create(picture->y(), picture->byteCount(), release, holder, AV_BUFFER_FLAG_READONLY);
    if (!buffer) delete holder;
    return buffer;
}

}  // namespace

AvVideoEncoder::AvVideoEncoder(AvOwned<AVCodecContext> context, AvOwned<AVBufferRef> uploads)
    : context_(std::move(context)), uploads_(std::move(uploads)), frame_(av_frame_alloc()), uploaded_(av_frame_alloc()),
      packet_(av_packet_alloc()) {}

VideoEncoder::Opened AvVideoEncoder::openNamed(const char* name, const VideoTrackSettings& settings) {
    const AVCodec* const codec = avcodec_find_encoder_by_name(name);
    if (!codec) return systemError(ENOTSUP);
    AvOwned<AVCodecContext> context(avcodec_alloc_context3(codec));
    if (!context) return systemError(ENOMEM);
    describe(*context, settings);
    tune(*context, name);
    AvOwned<AVBufferRef> uploads;
    if (std::string_view(name).ends_with("_vaapi")) {
        uploads = makeUploads(*context);
        if (!uploads) return systemError(ENODEV);
    }
    if (const int error = avcodec_open2(context.get(), codec, nullptr); error < 0) return avError(error);
    return std::unique_ptr<VideoEncoder>(new AvVideoEncoder(std::move(context), std::move(uploads)));
}

std::optional<Error> AvVideoEncoder::encode(const std::shared_ptr<I420Picture>& picture, std::int64_t stamp, KeyFrame key,
                                            const Output& output) {
    if (!uploads_) paceRate(stamp);
    if (picture.get() != shown_ && !show(picture)) return systemError(ENOMEM);
    frame_->pts = stamp;
    frame_->pict_type = key == KeyFrame::Forced ? AV_PICTURE_TYPE_I : AV_PICTURE_TYPE_NONE;
    if (const int error = send(frame_.get()); error < 0) return avError(error);
    return receive(output);
}

bool AvVideoEncoder::show(const std::shared_ptr<I420Picture>& picture) {
    AVFrame& frame = *frame_;
    av_frame_unref(&frame);
    shown_ = nullptr;
    frame.buf[0] = shareMemory(picture);
    if (!frame.buf[0]) return false;
    shown_ = picture.get();
    frame.format = AV_PIX_FMT_YUV420P;
    frame.width = context_->width;
    frame.height = context_->height;
    frame.data[0] = picture->y();
    frame.data[1] = picture->u();
    frame.data[2] = picture->v();
    frame.linesize[0] = picture->lumaStride();
    frame.linesize[1] = frame.linesize[2] = picture->chromaStride();
    return true;
}

/// The software encoder refills its rate buffer by one sixtieth (the frame rate) of a second with each picture. Where
/// pictures are rarer its rate is raised accordingly, by powers of two, so that bits are counted per second of media.
void AvVideoEncoder::paceRate(std::int64_t stamp) {
    const std::int64_t interval = lastStamp_ ? stamp - *lastStamp_ : 0;
    lastStamp_ = stamp;
    const std::int64_t pictures = std::clamp<std::int64_t>(interval * context_->framerate.num / kTimescale, 1,
                                                           context_->framerate.num);
    const auto times = static_cast<std::int64_t>(std::bit_floor(static_cast<std::uint64_t>(pictures)));
    context_->rc_max_rate = context_->bit_rate * times;
}

int AvVideoEncoder::send(AVFrame* frame) {
    if (!uploads_) return avcodec_send_frame(context_.get(), frame);
    av_frame_unref(uploaded_.get());
    if (const int error = av_hwframe_get_buffer(uploads_.get(), uploaded_.get(), 0); error < 0) return error;
    if (const int error = av_hwframe_transfer_data(uploaded_.get(), frame, 0); error < 0) return error;
    uploaded_->pts = frame->pts;
    uploaded_->pict_type = frame->pict_type;
    return avcodec_send_frame(context_.get(), uploaded_.get());
}

std::optional<Error> AvVideoEncoder::drain(const Output& output) {
    if (const int error = avcodec_send_frame(context_.get(), nullptr); error < 0 && error != AVERROR_EOF) {
        return avError(error);
    }
    return receive(output);
}

std::optional<Error> AvVideoEncoder::receive(const Output& output) {
    for (;;) {
        const int error = avcodec_receive_packet(context_.get(), packet_.get());
        if (error == AVERROR(EAGAIN) || error == AVERROR_EOF) return std::nullopt;
        if (error < 0) return avError(error);
        output({{packet_->data, static_cast<std::size_t>(packet_->size)},
                packet_->pts,
                (packet_->flags & AV_PKT_FLAG_KEY) != 0});
        av_packet_unref(packet_.get());
    }
}

std::span<const std::uint8_t> AvVideoEncoder::header() const {
    return {context_->extradata, static_cast<std::size_t>(context_->extradata_size)};
}

}  // namespace lumacast::media
