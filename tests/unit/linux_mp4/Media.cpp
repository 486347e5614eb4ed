#include "tests/unit/linux_mp4/Media.h"

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavutil/channel_layout.h>
#include <libavutil/log.h>
#include <libavutil/opt.h>
}

#include <cmath>
#include <memory>
#include <stdexcept>

#include "linux/media/mp4/AvcBitstream.h"

namespace lumacast::mp4::test {
namespace {

constexpr int kWidth = 320;
constexpr int kHeight = 176;

struct Free {
    void operator()(AVCodecContext* context) const { avcodec_free_context(&context); }
    void operator()(AVFrame* frame) const { av_frame_free(&frame); }
    void operator()(AVPacket* packet) const { av_packet_free(&packet); }
};
using Context = std::unique_ptr<AVCodecContext, Free>;
using Frame = std::unique_ptr<AVFrame, Free>;
using Packet = std::unique_ptr<AVPacket, Free>;

void require(bool holds, const char* what) {
    if (!holds) {
        throw std::runtime_error(what);
    }
}

// Sends a frame, or the end when it is null, and hands out what the encoder has ready.
void encode(AVCodecContext* context, const AVFrame* frame, const std::function<void(const AVPacket&)>& take) {
    require(avcodec_send_frame(context, frame) >= 0, "frame not taken");
    const Packet packet(av_packet_alloc());
    while (avcodec_receive_packet(context, packet.get()) >= 0) {
        take(*packet);
        av_packet_unref(packet.get());
    }
}

void paint(AVFrame& frame, std::uint32_t number, bool white) {
    for (int plane = 0; plane < 3; ++plane) {
        const int width = plane == 0 ? kWidth : kWidth / 2;
        const int height = plane == 0 ? kHeight : kHeight / 2;
        for (int y = 0; y < height; ++y) {
            for (int x = 0; x < width; ++x) {
                const bool bit = ((number >> (static_cast<unsigned>(x * 16 / width))) & 1U) != 0;
                const int luma = white ? 235 : (bit ? 120 : 40) + (x * 7 + y * 3) % 16;
                frame.data[plane][y * frame.linesize[plane] + x] = static_cast<std::uint8_t>(plane == 0 ? luma : 128);
            }
        }
    }
}

Context openVideo() {
    const AVCodec* codec = avcodec_find_encoder_by_name("libx264");
    require(codec != nullptr, "no H.264 encoder");
    Context context(avcodec_alloc_context3(codec));
    context->width = kWidth;
    context->height = kHeight;
    context->pix_fmt = AV_PIX_FMT_YUV420P;
    context->time_base = {1, kDefaultVideoTimescale};
    context->framerate = {30, 1};
    context->max_b_frames = 0;
    context->gop_size = 100000;
    context->thread_count = 1;
    context->flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
    context->color_primaries = AVCOL_PRI_SMPTE170M;
    context->color_trc = AVCOL_TRC_SMPTE170M;
    context->colorspace = AVCOL_SPC_SMPTE170M;
    context->color_range = AVCOL_RANGE_MPEG;
    av_opt_set(context->priv_data, "preset", "ultrafast", 0);
    av_opt_set(context->priv_data, "tune", "zerolatency", 0);
    av_opt_set(context->priv_data, "forced-idr", "1", 0);
    require(avcodec_open2(context.get(), codec, nullptr) >= 0, "video encoder does not open");
    return context;
}

Context openAudio() {
    const AVCodec* codec = avcodec_find_encoder(AV_CODEC_ID_AAC);
    require(codec != nullptr, "no AAC encoder");
    Context context(avcodec_alloc_context3(codec));
    context->sample_rate = 48000;
    context->sample_fmt = AV_SAMPLE_FMT_FLTP;
    context->ch_layout = AV_CHANNEL_LAYOUT_STEREO;
    context->bit_rate = 128000;
    context->time_base = {1, 48000};
    context->flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
    require(avcodec_open2(context.get(), codec, nullptr) >= 0, "audio encoder does not open");
    return context;
}

}  // namespace

EncodedVideo encodeVideo(const std::vector<std::int64_t>& stamps, const std::function<bool(std::int64_t)>& bright) {
    av_log_set_level(AV_LOG_ERROR);
    const Context context = openVideo();
    EncodedVideo video;
    const ParameterSets sets =
        parameterSetsOf(std::span(context->extradata, static_cast<std::size_t>(context->extradata_size)));
    video.description.width = kWidth;
    video.description.height = kHeight;
    video.description.sequenceParameterSets = sets.sequence;
    video.description.pictureParameterSets = sets.picture;
    const auto take = [&video](const AVPacket& packet) {
        require(packet.pts == packet.dts, "pictures out of order");
        MediaSample sample{{packet.pts, 0, (packet.flags & AV_PKT_FLAG_KEY) != 0}, {}};
        require(appendLengthPrefixed(std::span(packet.data, static_cast<std::size_t>(packet.size)), sample.bytes),
                "no slice");
        video.samples.push_back(std::move(sample));
    };
    const Frame frame(av_frame_alloc());
    frame->format = context->pix_fmt;
    frame->width = kWidth;
    frame->height = kHeight;
    require(av_frame_get_buffer(frame.get(), 0) >= 0, "no picture");
    std::int64_t lastKey = 0;
    for (std::size_t i = 0; i < stamps.size(); ++i) {
        require(av_frame_make_writable(frame.get()) >= 0, "no picture");
        paint(*frame, static_cast<std::uint32_t>(i) * 2654435761U, bright && bright(stamps[i]));
        frame->pts = stamps[i];
        const bool isKey = i == 0 || stamps[i] - lastKey >= kDefaultVideoTimescale;
        frame->pict_type = isKey ? AV_PICTURE_TYPE_I : AV_PICTURE_TYPE_NONE;
        lastKey = isKey ? stamps[i] : lastKey;
        encode(context.get(), frame.get(), take);
    }
    encode(context.get(), nullptr, take);
    require(video.samples.size() == stamps.size(), "the encoder lost pictures");
    return video;
}

EncodedAudio encodeAudio(std::int64_t start, std::int64_t frames, const std::function<bool(std::int64_t)>& loud,
                         const std::string& name) {
    av_log_set_level(AV_LOG_ERROR);
    const Context context = openAudio();
    EncodedAudio audio;
    audio.description.sampleRate = 48000;
    audio.description.channels = 2;
    audio.description.audioSpecificConfig.assign(context->extradata, context->extradata + context->extradata_size);
    audio.description.primingFrames = static_cast<std::uint32_t>(context->initial_padding);
    audio.description.bitRate = 128000;
    audio.description.name = name;
    const auto take = [&audio](const AVPacket& packet) {
        audio.samples.push_back({{packet.pts, static_cast<std::uint32_t>(packet.duration), true},
                                 Bytes(packet.data, packet.data + packet.size)});
    };
    const Frame frame(av_frame_alloc());
    frame->format = context->sample_fmt;
    frame->nb_samples = context->frame_size;
    frame->sample_rate = context->sample_rate;
    av_channel_layout_copy(&frame->ch_layout, &context->ch_layout);
    require(av_frame_get_buffer(frame.get(), 0) >= 0, "no sound");
    for (std::int64_t at = 0; at < frames; at += context->frame_size) {
        require(av_frame_make_writable(frame.get()) >= 0, "no sound");
        for (int i = 0; i < context->frame_size; ++i) {
            const std::int64_t time = start + at + i;
            const double value = loud && loud(time) ? 0.5 * std::sin(static_cast<double>(time) * 0.1309) : 0;
            for (int channel = 0; channel < 2; ++channel) {
                reinterpret_cast<float*>(frame->data[channel])[i] = static_cast<float>(value);
            }
        }
        frame->pts = start + at;
        frame->nb_samples = static_cast<int>(std::min<std::int64_t>(frames - at, context->frame_size));
        encode(context.get(), frame.get(), take);
    }
    encode(context.get(), nullptr, take);
    return audio;
}

std::vector<std::int64_t> steadyStamps(int count, int perSecond, std::int64_t first) {
    std::vector<std::int64_t> stamps;
    for (int i = 0; i < count; ++i) {
        stamps.push_back(first + std::int64_t{i} * kDefaultVideoTimescale / perSecond);
    }
    return stamps;
}

MovieError writeMovie(MovieBoxWriter& writer, const EncodedVideo& video,
                      const std::vector<const EncodedAudio*>& sounds) {
    struct Source {
        TrackId id;
        const std::vector<MediaSample>* samples;
        double secondsPerTick;
        std::size_t next;
    };
    std::vector<Source> sources;
    const auto videoId = writer.addVideoTrack(video.description);
    require(videoId.has_value(), "video track");
    sources.push_back({*videoId, &video.samples, 1.0 / kDefaultVideoTimescale, 0});
    for (const EncodedAudio* sound : sounds) {
        const auto id = writer.addAudioTrack(sound->description);
        require(id.has_value(), "audio track");
        sources.push_back({*id, &sound->samples, 1.0 / 48000, 0});
    }
    if (const auto error = writer.start(); error != MovieError::none) {
        return error;
    }
    while (true) {
        Source* first = nullptr;
        double earliest = 0;
        for (Source& source : sources) {
            if (source.next == source.samples->size()) {
                continue;
            }
            const double time = static_cast<double>((*source.samples)[source.next].info.pts) * source.secondsPerTick;
            if (first == nullptr || time < earliest) {
                first = &source;
                earliest = time;
            }
        }
        if (first == nullptr) {
            return MovieError::none;
        }
        const MediaSample& sample = (*first->samples)[first->next++];
        if (const auto error = writer.addSample(first->id, sample.info, sample.bytes); error != MovieError::none) {
            return error;
        }
    }
}

}  // namespace lumacast::mp4::test
