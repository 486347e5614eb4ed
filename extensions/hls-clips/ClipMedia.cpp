#include "extensions/hls-clips/ClipMedia.h"

#include <algorithm>
#include <memory>

#include "extensions/hls-clips/DescriptorInput.h"

namespace lumacast::extensions {

namespace {

/// A clip of more sound than this is none: a file that claims it would only use up memory.
constexpr std::int64_t kMostSoundSeconds = 600;
constexpr AVRational kTicks{1, kTicksPerSecond};

/// Decodes one sound track and adds it to the clip's sound.
class SoundReader final {
public:
    SoundReader(const AVStream& stream, int rate, StereoSound& into) : stream_(stream), rate_(rate), into_(into) {
        const AVCodec* codec = avcodec_find_decoder(stream.codecpar->codec_id);
        if (!codec) return;
        decoder_.reset(avcodec_alloc_context3(codec));
        if (!decoder_ || avcodec_parameters_to_context(decoder_.get(), stream.codecpar) < 0) {
            decoder_.reset();
            return;
        }
        decoder_->pkt_timebase = stream.time_base;  // so that what an edit list skips is skipped
        if (avcodec_open2(decoder_.get(), codec, nullptr) < 0) decoder_.reset();
    }

    /// Null: the end.
    void take(const AVPacket* packet) {
        // The last packet says how much of it is sound; the rest is the encoder's padding.
        if (packet && packet->pts != AV_NOPTS_VALUE && packet->duration > 0)
            end_ = std::max(end_, av_rescale_q(packet->pts + packet->duration, stream_.time_base, {1, rate_}));
        if (!decoder_ || avcodec_send_packet(decoder_.get(), packet) < 0) return;
        const AvOwned<AVFrame> frame(av_frame_alloc());
        while (frame && avcodec_receive_frame(decoder_.get(), frame.get()) >= 0) add(*frame);
        if (!packet && resampler_) convert(nullptr, 0);
    }

private:
    void add(AVFrame& frame) {
        if (!resampler_ && !open(frame)) return;
        if (position_ < 0 && frame.pts != AV_NOPTS_VALUE)
            position_ = std::max<std::int64_t>(0, av_rescale_q(frame.pts, stream_.time_base, {1, rate_}));
        // The track's sound is without holes but for those that its times tell of.
        if (frame.pts != AV_NOPTS_VALUE && rate_ == frame.sample_rate) {
            const std::int64_t at = av_rescale_q(frame.pts, stream_.time_base, {1, rate_});
            if (at > position_ + kJitter) position_ = at;
        }
        convert(const_cast<const std::uint8_t**>(frame.extended_data), frame.nb_samples);
    }

    bool open(AVFrame& frame) {
        AVChannelLayout stereo = AV_CHANNEL_LAYOUT_STEREO;
        SwrContext* raw = nullptr;
        swr_alloc_set_opts2(&raw, &stereo, AV_SAMPLE_FMT_FLTP, rate_, &frame.ch_layout,
                            static_cast<AVSampleFormat>(frame.format), frame.sample_rate, 0, nullptr);
        resampler_.reset(raw);
        if (resampler_ && swr_init(resampler_.get()) >= 0) return true;
        resampler_.reset();
        return false;
    }

    void convert(const std::uint8_t** samples, int count) {
        const int room = swr_get_out_samples(resampler_.get(), count);
        if (room <= 0) return;
        piece_.resize(static_cast<std::size_t>(room));
        std::uint8_t* out[]{reinterpret_cast<std::uint8_t*>(piece_.channels[0].data()),
                            reinterpret_cast<std::uint8_t*>(piece_.channels[1].data())};
        const int made = swr_convert(resampler_.get(), out, room, samples, count);
        if (made > 0) mix(static_cast<std::size_t>(made));
    }

    void mix(std::size_t count) {
        position_ = std::max<std::int64_t>(0, position_);
        count = std::min(count, static_cast<std::size_t>(std::max<std::int64_t>(0, end_ - position_)));
        const auto end = static_cast<std::size_t>(position_) + count;
        if (end > static_cast<std::size_t>(kMostSoundSeconds) * static_cast<std::size_t>(rate_)) return;
        if (into_.size() < end) into_.resize(end);
        for (std::size_t channel = 0; channel < 2; ++channel)
            for (std::size_t at = 0; at < count; ++at) {
                float& sample = into_.channels[channel][static_cast<std::size_t>(position_) + at];
                sample = std::clamp(sample + piece_.channels[channel][at], -1.0F, 1.0F);
            }
        position_ += static_cast<std::int64_t>(count);
    }

    static constexpr std::int64_t kJitter = 64;  ///< samples

    const AVStream& stream_;
    const int rate_;
    StereoSound& into_;
    AvOwned<AVCodecContext> decoder_;
    AvOwned<SwrContext> resampler_;
    StereoSound piece_;
    std::int64_t position_ = -1;  ///< where the next sample goes
    std::int64_t end_ = 0;        ///< where the track ends, as far as it was read
};

void takePicture(const AVPacket& packet, const AVStream& stream, ClipMedia& media) {
    // What an edit list hides is needed for decoding alone; the daemon's clips have no such pictures.
    if (packet.flags & AV_PKT_FLAG_DISCARD || packet.pts == AV_NOPTS_VALUE || packet.dts == AV_NOPTS_VALUE) return;
    auto picture = sharedCopy(packet);
    if (!picture) return;
    av_packet_rescale_ts(picture.get(), stream.time_base, kTicks);
    media.pictureEnd = std::max(media.pictureEnd, picture->pts + picture->duration);
    media.pictures.push_back(std::move(picture));
}

}  // namespace

std::string readClip(const Fd& movie, int rate, ClipMedia& media) {
    DescriptorInput input(movie.get());
    if (const int status = input.open("mov"); status < 0) return avErrorText(status);
    AVFormatContext& format = input.format();
    std::vector<std::unique_ptr<SoundReader>> sounds(format.nb_streams);
    int videoIndex = -1;
    for (unsigned at = 0; at < format.nb_streams; ++at) {
        const AVCodecParameters& parameters = *format.streams[at]->codecpar;
        if (parameters.codec_type == AVMEDIA_TYPE_VIDEO && videoIndex < 0 && parameters.codec_id == AV_CODEC_ID_H264) {
            videoIndex = static_cast<int>(at);
            media.video.reset(avcodec_parameters_alloc());
            if (!media.video || avcodec_parameters_copy(media.video.get(), &parameters) < 0) return "no memory";
        } else if (parameters.codec_type == AVMEDIA_TYPE_AUDIO && parameters.sample_rate > 0) {
            if (media.soundRate == 0) media.soundRate = parameters.sample_rate;
            sounds[at] =
                std::make_unique<SoundReader>(*format.streams[at], rate > 0 ? rate : media.soundRate, media.sound);
        }
    }
    const AvOwned<AVPacket> packet(av_packet_alloc());
    int status = 0;
    while (packet && (status = av_read_frame(&format, packet.get())) >= 0) {
        if (packet->stream_index == videoIndex)
            takePicture(*packet, *format.streams[videoIndex], media);
        else if (sounds[static_cast<std::size_t>(packet->stream_index)])
            sounds[static_cast<std::size_t>(packet->stream_index)]->take(packet.get());
        av_packet_unref(packet.get());
    }
    if (status != AVERROR_EOF) return avErrorText(status);
    for (const auto& sound : sounds)
        if (sound) sound->take(nullptr);
    return {};
}

}  // namespace lumacast::extensions
