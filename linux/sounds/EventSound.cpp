#include "linux/sounds/EventSound.h"

#include <sys/stat.h>

#include <cmath>
#include <numbers>

#include "linux/media/AvHandles.h"

namespace lumacast::sound {

namespace {

using media::AvOwned;

constexpr off_t kMaximumBytes = 4 * 1024 * 1024;
constexpr std::size_t kMostSamples = EventSound::kLongest.count() * EventSound::kRate * EventSound::kChannels;

AvOwned<AVFormatContext> openSound(const std::string& path) {
    struct stat status {};
    if (::stat(path.c_str(), &status) != 0 || !S_ISREG(status.st_mode) || status.st_size > kMaximumBytes)
        return nullptr;
    AVDictionary* options = nullptr;
    // Nothing that would open other files.
    av_dict_set(&options, "format_whitelist", "ogg,wav", 0);
    av_dict_set(&options, "protocol_whitelist", "file", 0);
    AVFormatContext* file = nullptr;
    const int opened = avformat_open_input(&file, ("file:" + path).c_str(), nullptr, &options);
    av_dict_free(&options);
    return AvOwned<AVFormatContext>(opened < 0 ? nullptr : file);
}

AvOwned<AVCodecContext> openDecoder(const AVFormatContext& file, int track, const AVCodec* codec) {
    AvOwned<AVCodecContext> decoder(avcodec_alloc_context3(codec));
    if (!decoder || avcodec_parameters_to_context(decoder.get(), file.streams[track]->codecpar) < 0) return nullptr;
    decoder->thread_count = 1;
    return avcodec_open2(decoder.get(), codec, nullptr) < 0 ? nullptr : std::move(decoder);
}

/// Decoded frames as interleaved stereo floats.
class Collector final {
public:
    bool take(const AVFrame& frame) {
        if (!converter_ && !open(frame)) return false;
        return convert(const_cast<const std::uint8_t**>(frame.extended_data), frame.nb_samples);
    }
    void finish() {
        if (converter_) convert(nullptr, 0);
    }
    bool isFull() const { return samples_.size() >= kMostSamples; }
    std::vector<float> samples() {
        samples_.resize(std::min(samples_.size(), kMostSamples));
        return std::move(samples_);
    }

private:
    bool open(const AVFrame& frame) {
        AVChannelLayout stereo = AV_CHANNEL_LAYOUT_STEREO, theirs{};
        if (frame.ch_layout.order == AV_CHANNEL_ORDER_UNSPEC)
            av_channel_layout_default(&theirs, frame.ch_layout.nb_channels);
        else if (av_channel_layout_copy(&theirs, &frame.ch_layout) < 0)
            return false;
        SwrContext* converter = nullptr;
        const int made = swr_alloc_set_opts2(&converter, &stereo, AV_SAMPLE_FMT_FLT, EventSound::kRate, &theirs,
                                             static_cast<AVSampleFormat>(frame.format), frame.sample_rate, 0, nullptr);
        av_channel_layout_uninit(&theirs);
        converter_.reset(converter);
        return made >= 0 && swr_init(converter) >= 0;
    }

    bool convert(const std::uint8_t** planes, int count) {
        const int room = swr_get_out_samples(converter_.get(), count);
        if (room < 0) return false;
        const std::size_t before = samples_.size();
        samples_.resize(before + static_cast<std::size_t>(room) * EventSound::kChannels);
        auto* out = reinterpret_cast<std::uint8_t*>(samples_.data() + before);
        const int made = swr_convert(converter_.get(), &out, room, planes, count);
        samples_.resize(before + static_cast<std::size_t>(std::max(made, 0)) * EventSound::kChannels);
        return made >= 0;
    }

    AvOwned<SwrContext> converter_;
    std::vector<float> samples_;
};

}  // namespace

std::optional<std::vector<float>> readSoundFile(const std::string& path) {
    const auto file = openSound(path);
    if (!file || avformat_find_stream_info(file.get(), nullptr) < 0) return std::nullopt;
    const AVCodec* codec = nullptr;
    const int track = av_find_best_stream(file.get(), AVMEDIA_TYPE_AUDIO, -1, -1, &codec, 0);
    if (track < 0) return std::nullopt;
    const auto decoder = openDecoder(*file, track, codec);
    const AvOwned<AVPacket> packet(av_packet_alloc());
    const AvOwned<AVFrame> frame(av_frame_alloc());
    if (!decoder || !packet || !frame) return std::nullopt;
    Collector collector;
    for (bool ended = false; !ended && !collector.isFull();) {
        ended = av_read_frame(file.get(), packet.get()) < 0;
        if (ended || packet->stream_index == track) {
            // A packet that can't be decoded is left out; what is left may still be heard.
            (void)avcodec_send_packet(decoder.get(), ended ? nullptr : packet.get());
            while (avcodec_receive_frame(decoder.get(), frame.get()) >= 0)
                if (!collector.take(*frame)) return std::nullopt;
        }
        av_packet_unref(packet.get());
    }
    collector.finish();
    auto samples = collector.samples();
    return samples.empty() ? std::nullopt : std::optional(std::move(samples));
}

std::vector<float> glidingTone(double first, double last) {
    constexpr int kFrames = EventSound::kRate * 18 / 100;
    constexpr double kLoudness = 0.35;
    std::vector<float> samples;
    samples.reserve(kFrames * EventSound::kChannels);
    double phase = 0;
    for (int frame = 0; frame < kFrames; ++frame) {
        const double place = static_cast<double>(frame) / kFrames;
        // A raised sine over the whole length: no click at either end.
        const double level = std::sin(std::numbers::pi * place);
        const auto sample = static_cast<float>(kLoudness * level * level * std::sin(phase));
        samples.insert(samples.end(), EventSound::kChannels, sample);
        phase += 2 * std::numbers::pi * (first + (last - first) * place) / EventSound::kRate;
    }
    return samples;
}

}  // namespace lumacast::sound
