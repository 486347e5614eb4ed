#include "tests/checkers/tests/MovieMaker.h"

#include <algorithm>

#include "examples/scene/Scene.h"
#include "tests/checkers/LibAv.h"

namespace lumacast::checkers {
namespace {

constexpr AVRational kVideoBase{1, 90'000};
constexpr int kSampleRate = 48'000;

struct OutputFree {
    void operator()(AVFormatContext* context) const {
        if (context != nullptr && context->pb != nullptr) avio_closep(&context->pb);
        avformat_free_context(context);
    }
};

// The scene's frame as B, G, R, X bytes.
std::vector<std::uint8_t> sceneBytes(int width, int height, std::uint32_t number, scene::Mark mark) {
    std::vector<std::uint8_t> bytes(static_cast<std::size_t>(width) * static_cast<std::size_t>(height) * 4);
    scene::Scene(width, height, scene::Motion::Everywhere)
        .draw({bytes.data(), width, height, static_cast<std::size_t>(width) * 4}, number, {12, 34, 56, 789}, mark);
    return bytes;
}

class Maker final {
public:
    std::string run(const MoviePlan& plan, const std::string& path) {
        AVFormatContext* raw = nullptr;
        avformat_alloc_output_context2(&raw, nullptr, "mp4", path.c_str());
        file_.reset(raw);
        if (!file_) return "no MP4 muxer";
        if (!addVideo(plan)) return error_;
        if (plan.soundSeconds > 0) {
            if (!addSound(plan.sound)) return error_;
            for (const auto& sound : plan.moreSounds)
                if (!addSound(sound)) return error_;
        }
        if (!good(avio_open(&file_->pb, path.c_str(), AVIO_FLAG_WRITE), "file")) return error_;
        if (!good(avformat_write_header(file_.get(), nullptr), "header")) return error_;
        for (const PlannedPicture& picture : plan.pictures) encodePicture(plan, picture);
        encode(*video_, *videoStream_, nullptr);
        for (const SoundTrack& track : sounds_) encodeSound(track, plan.soundSeconds);
        good(av_write_trailer(file_.get()), "trailer");
        return error_;
    }

private:
    struct SoundTrack {
        AvOwned<AVCodecContext> encoder;
        AVStream* stream = nullptr;
        std::function<float(double seconds)> sound;
    };

    bool good(int status, const char* what) {
        if (status < 0 && error_.empty()) error_ = std::string(what) + ": " + avErrorText(status);
        return error_.empty();
    }

    AvOwned<AVCodecContext> makeEncoder(const char* name) {
        const AVCodec* codec = avcodec_find_encoder_by_name(name);
        if (codec != nullptr) return AvOwned<AVCodecContext>(avcodec_alloc_context3(codec));
        error_ = std::string("no encoder ") + name;
        return nullptr;
    }

    AVStream* open(AVCodecContext& encoder, AVDictionary** options) {
        encoder.flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
        if (!good(avcodec_open2(&encoder, nullptr, options), "encoder")) return nullptr;
        AVStream* const stream = avformat_new_stream(file_.get(), nullptr);
        stream->time_base = encoder.time_base;
        return good(avcodec_parameters_from_context(stream->codecpar, &encoder), "track") ? stream : nullptr;
    }

    bool addVideo(const MoviePlan& plan) {
        video_ = makeEncoder("libx264");
        if (!video_) return false;
        const int divisor = plan.halfSize ? 2 : 1;
        video_->width = plan.width / divisor / 2 * 2;
        video_->height = plan.height / divisor / 2 * 2;
        video_->pix_fmt = AV_PIX_FMT_YUV420P;
        video_->time_base = kVideoBase;
        video_->framerate = {30, 1};
        video_->bit_rate = plan.bitRate;
        video_->max_b_frames = plan.reordered ? 2 : 0;
        video_->gop_size = 30;
        AVDictionary* options = nullptr;
        av_dict_set(&options, "preset", plan.reordered ? "faster" : "ultrafast", 0);
        videoStream_ = open(*video_, &options);
        av_dict_free(&options);
        scaler_.reset(sws_getContext(plan.width, plan.height, AV_PIX_FMT_BGR0, video_->width, video_->height,
                                     AV_PIX_FMT_YUV420P, SWS_BILINEAR, nullptr, nullptr, nullptr));
        return videoStream_ != nullptr && scaler_ != nullptr;
    }

    bool addSound(const std::function<float(double seconds)>& sound) {
        SoundTrack track{makeEncoder("aac"), nullptr, sound};
        if (!track.encoder) return false;
        track.encoder->sample_fmt = AV_SAMPLE_FMT_FLTP;
        track.encoder->sample_rate = kSampleRate;
        track.encoder->time_base = {1, kSampleRate};
        track.encoder->bit_rate = 96'000;
        track.encoder->ch_layout = AV_CHANNEL_LAYOUT_STEREO;
        track.stream = open(*track.encoder, nullptr);
        sounds_.push_back(std::move(track));
        return sounds_.back().stream != nullptr;
    }

    void encodePicture(const MoviePlan& plan, const PlannedPicture& picture) {
        const auto bytes = sceneBytes(plan.width, plan.height, picture.number,
                                      picture.isMarked ? scene::Mark::Border : scene::Mark::None);
        const AvOwned<AVFrame> frame(av_frame_alloc());
        frame->format = AV_PIX_FMT_YUV420P;
        frame->width = video_->width;
        frame->height = video_->height;
        frame->pts = av_rescale_q(picture.time.count(), {1, 1'000'000'000}, kVideoBase);
        if (!good(av_frame_get_buffer(frame.get(), 0), "frame")) return;
        const std::uint8_t* const rows[]{bytes.data()};
        const int strides[]{plan.width * 4};
        sws_scale(scaler_.get(), rows, strides, 0, plan.height, frame->data, frame->linesize);
        encode(*video_, *videoStream_, frame.get());
    }

    void encodeSound(const SoundTrack& track, double seconds) {
        const auto total = static_cast<std::int64_t>(seconds * kSampleRate);
        for (std::int64_t start = 0; start < total; start += track.encoder->frame_size) {
            const AvOwned<AVFrame> frame(av_frame_alloc());
            frame->format = AV_SAMPLE_FMT_FLTP;
            frame->ch_layout = track.encoder->ch_layout;
            frame->sample_rate = kSampleRate;
            frame->nb_samples = static_cast<int>(std::min<std::int64_t>(track.encoder->frame_size, total - start));
            frame->pts = start;
            if (!good(av_frame_get_buffer(frame.get(), 0), "block")) return;
            for (int place = 0; place < frame->nb_samples; ++place) {
                const float value = track.sound(static_cast<double>(start + place) / kSampleRate);
                for (int channel = 0; channel < 2; ++channel)
                    reinterpret_cast<float*>(frame->extended_data[channel])[place] = value;
            }
            encode(*track.encoder, *track.stream, frame.get());
        }
        encode(*track.encoder, *track.stream, nullptr);
    }

    void encode(AVCodecContext& encoder, const AVStream& stream, const AVFrame* frame) {
        if (!good(avcodec_send_frame(&encoder, frame), "encoding")) return;
        const AvOwned<AVPacket> packet(av_packet_alloc());
        while (avcodec_receive_packet(&encoder, packet.get()) >= 0) {
            packet->stream_index = stream.index;
            // Without it the muxer gives the last picture no duration.
            if (&encoder == video_.get()) packet->duration = kVideoBase.den / 30;
            av_packet_rescale_ts(packet.get(), encoder.time_base, stream.time_base);
            if (!good(av_interleaved_write_frame(file_.get(), packet.get()), "writing")) return;
        }
    }

    std::unique_ptr<AVFormatContext, OutputFree> file_;
    AvOwned<AVCodecContext> video_;
    std::vector<SoundTrack> sounds_;
    AvOwned<SwsContext> scaler_;
    AVStream* videoStream_ = nullptr;
    std::string error_;
};

}  // namespace

std::vector<PlannedPicture> steadyPictures(std::uint32_t first, int count, int framesPerSecond) {
    std::vector<PlannedPicture> pictures;
    for (int place = 0; place < count; ++place)
        pictures.push_back({first + static_cast<std::uint32_t>(place),
                            std::chrono::nanoseconds(1'000'000'000LL * place / framesPerSecond), false});
    return pictures;
}

std::string makeMovie(const MoviePlan& plan, const std::string& path) {
    return Maker().run(plan, path);
}

LumaPlane sceneLuma(int width, int height, std::uint32_t number, scene::Mark mark) {
    const auto bytes = sceneBytes(width, height, number, mark);
    LumaPlane plane{width, height, std::vector<std::uint8_t>(bytes.size() / 4)};
    for (std::size_t place = 0; place < plane.samples.size(); ++place) {
        // BT.601, limited range.
        const int blue = bytes[place * 4], green = bytes[place * 4 + 1], red = bytes[place * 4 + 2];
        plane.samples[place] = static_cast<std::uint8_t>(16 + (66 * red + 129 * green + 25 * blue + 128) / 256);
    }
    return plane;
}

}  // namespace lumacast::checkers
