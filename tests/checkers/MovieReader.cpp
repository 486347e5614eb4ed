#include "tests/checkers/MovieReader.h"

#include <algorithm>
#include <cmath>

#include "tests/checkers/LibAv.h"

namespace lumacast::checkers {
namespace {

constexpr AVRational kNanosecond{1, 1'000'000'000};

nanoseconds timeOf(std::int64_t value, AVRational base) {
    return nanoseconds(value == AV_NOPTS_VALUE ? 0 : av_rescale_q(value, base, kNanosecond));
}

AvOwned<AVFormatContext> openFile(const std::string& path, std::string& error) {
    AVFormatContext* raw = nullptr;
    int status = avformat_open_input(&raw, path.c_str(), nullptr, nullptr);
    AvOwned<AVFormatContext> file(raw);
    if (status >= 0) status = avformat_find_stream_info(file.get(), nullptr);
    if (status >= 0) return file;
    error = path + ": " + avErrorText(status);
    return nullptr;
}

// The index of the n-th stream of a kind, -1 when there are fewer.
int streamIndex(const AVFormatContext& file, AVMediaType kind, std::size_t place) {
    for (unsigned index = 0; index < file.nb_streams; ++index)
        if (file.streams[index]->codecpar->codec_type == kind && place-- == 0) return static_cast<int>(index);
    return -1;
}

int rotationOf(const AVStream& stream) {
    const auto* matrix =
        reinterpret_cast<const std::int32_t*>(av_stream_get_side_data(&stream, AV_PKT_DATA_DISPLAYMATRIX, nullptr));
    if (matrix == nullptr) return 0;
    const double counterClockwise = av_display_rotation_get(matrix);
    if (std::isnan(counterClockwise)) return 0;
    return (static_cast<int>(std::lround(-counterClockwise)) % 360 + 360) % 360;
}

AvOwned<AVCodecContext> openDecoder(const AVStream& stream, std::string& error) {
    const AVCodec* codec = avcodec_find_decoder(stream.codecpar->codec_id);
    AvOwned<AVCodecContext> decoder(codec == nullptr ? nullptr : avcodec_alloc_context3(codec));
    if (!decoder) {
        error = std::string("no decoder for ") + avcodec_get_name(stream.codecpar->codec_id);
        return nullptr;
    }
    avcodec_parameters_to_context(decoder.get(), stream.codecpar);
    decoder->pkt_timebase = stream.time_base;
    decoder->thread_count = 2;
    // Damage is to be reported, not painted over.
    decoder->err_recognition = AV_EF_CRCCHECK | AV_EF_BITSTREAM | AV_EF_BUFFER | AV_EF_EXPLODE;
    const int status = avcodec_open2(decoder.get(), codec, nullptr);
    if (status >= 0) return decoder;
    error = "decoder: " + avErrorText(status);
    return nullptr;
}

// Runs one stream through its decoder.
class StreamDecoder final {
public:
    using Each = std::function<void(const AVFrame&)>;

    StreamDecoder(AVFormatContext& file, int index, AVCodecContext& decoder)
        : file_(file), index_(index), decoder_(decoder), packet_(av_packet_alloc()), frame_(av_frame_alloc()) {}

    // The first thing that went wrong, empty when nothing did.
    std::string run(const Each& each) {
        for (;;) {
            const int status = av_read_frame(&file_, packet_.get());
            if (status == AVERROR_EOF) break;
            if (status < 0) {
                note("reading: " + avErrorText(status));
                break;
            }
            if (packet_->stream_index == index_) {
                if ((packet_->flags & AV_PKT_FLAG_CORRUPT) != 0) note("a packet is cut short");
                send(packet_.get(), each);
            }
            av_packet_unref(packet_.get());
        }
        if (file_.pb != nullptr && file_.pb->error < 0) note("reading: " + avErrorText(file_.pb->error));
        send(nullptr, each);
        return problem_;
    }

private:
    void note(const std::string& problem) {
        if (problem_.empty()) problem_ = problem;
    }

    void send(const AVPacket* packet, const Each& each) {
        const int sent = avcodec_send_packet(&decoder_, packet);
        if (sent < 0 && sent != AVERROR_EOF) note("decoding: " + avErrorText(sent));
        for (;;) {
            const int received = avcodec_receive_frame(&decoder_, frame_.get());
            if (received == AVERROR(EAGAIN) || received == AVERROR_EOF) return;
            if (received < 0) {
                note("decoding: " + avErrorText(received));
                return;
            }
            if (frame_->decode_error_flags != 0 || (frame_->flags & AV_FRAME_FLAG_CORRUPT) != 0)
                note("decoding: a damaged picture or block");
            each(*frame_);
            av_frame_unref(frame_.get());
        }
    }

    AVFormatContext& file_;
    int index_;
    AVCodecContext& decoder_;
    AvOwned<AVPacket> packet_;
    AvOwned<AVFrame> frame_;
    std::string problem_;
};

bool lumaIsEightBits(int format) {
    return format == AV_PIX_FMT_YUV420P || format == AV_PIX_FMT_YUVJ420P || format == AV_PIX_FMT_NV12 ||
           format == AV_PIX_FMT_YUV444P || format == AV_PIX_FMT_GRAY8;
}

// Channel average of one sample of a decoded block; none for formats the decoders used here don't give.
std::optional<float> monoSample(const AVFrame& frame, int place) {
    const int channels = frame.ch_layout.nb_channels;
    float sum = 0;
    for (int channel = 0; channel < channels; ++channel) {
        const int mixed = place * channels + channel;
        switch (frame.format) {
            case AV_SAMPLE_FMT_FLTP:
                sum += reinterpret_cast<const float*>(frame.extended_data[channel])[place];
                break;
            case AV_SAMPLE_FMT_FLT:
                sum += reinterpret_cast<const float*>(frame.data[0])[mixed];
                break;
            case AV_SAMPLE_FMT_S16:
                sum += reinterpret_cast<const std::int16_t*>(frame.data[0])[mixed] / 32768.0F;
                break;
            case AV_SAMPLE_FMT_S16P:
                sum += reinterpret_cast<const std::int16_t*>(frame.extended_data[channel])[place] / 32768.0F;
                break;
            default:
                return std::nullopt;
        }
    }
    return channels == 0 ? std::nullopt : std::optional(sum / static_cast<float>(channels));
}

}  // namespace

MovieReader::MovieReader(std::string path) : path_(std::move(path)) {
    const auto file = openFile(path_, error_);
    if (!file) return;
    duration_ = timeOf(file->duration, {1, AV_TIME_BASE});
    for (unsigned index = 0; index < file->nb_streams; ++index) {
        const AVStream& stream = *file->streams[index];
        const AVCodecParameters& codec = *stream.codecpar;
        const nanoseconds length = timeOf(stream.duration, stream.time_base);
        if (codec.codec_type == AVMEDIA_TYPE_VIDEO) {
            const char* profile = avcodec_profile_name(codec.codec_id, codec.profile);
            const char* format = av_get_pix_fmt_name(static_cast<AVPixelFormat>(codec.format));
            video_.push_back({avcodec_get_name(codec.codec_id), profile != nullptr ? profile : "",
                              format != nullptr ? format : "", codec.width, codec.height, rotationOf(stream), length});
        } else if (codec.codec_type == AVMEDIA_TYPE_AUDIO) {
            audio_.push_back(
                {avcodec_get_name(codec.codec_id), codec.sample_rate, codec.ch_layout.nb_channels, length});
        }
    }
}

bool MovieReader::readPictures(const std::function<void(const DecodedPicture&)>& each) {
    std::string problem;
    const auto file = openFile(path_, problem);
    const int index = file ? streamIndex(*file, AVMEDIA_TYPE_VIDEO, 0) : -1;
    if (file && index < 0) problem = "there is no video track";
    const auto decoder = index < 0 ? nullptr : openDecoder(*file->streams[index], problem);
    if (decoder) {
        const AVRational base = file->streams[index]->time_base;
        bool readable = true;
        problem = StreamDecoder(*file, index, *decoder).run([&](const AVFrame& frame) {
            if (!lumaIsEightBits(frame.format)) {
                readable = false;
                return;
            }
            const LumaView luma{frame.data[0], frame.width, frame.height, static_cast<std::size_t>(frame.linesize[0])};
            each({timeOf(frame.best_effort_timestamp, base), luma, &frame});
        });
        if (!readable) problem = "the pictures have no 8-bit luma plane";
    }
    if (!problem.empty()) error_ = problem;
    return problem.empty();
}

std::optional<Sound> MovieReader::readSound(std::size_t track) {
    std::string problem;
    const auto file = openFile(path_, problem);
    const int index = file ? streamIndex(*file, AVMEDIA_TYPE_AUDIO, track) : -1;
    if (file && index < 0) problem = "there is no such audio track";
    const auto decoder = index < 0 ? nullptr : openDecoder(*file->streams[index], problem);
    Sound sound;
    if (decoder) {
        sound.rate = decoder->sample_rate;
        const AVRational base = file->streams[index]->time_base;
        bool readable = true;
        problem = StreamDecoder(*file, index, *decoder).run([&](const AVFrame& frame) {
            const std::int64_t start = av_rescale_q(frame.best_effort_timestamp, base, {1, sound.rate});
            for (int place = 0; place < frame.nb_samples; ++place) {
                const auto sample = monoSample(frame, place);
                readable = readable && sample;
                const std::int64_t at = start + place;
                if (at < 0 || !sample) continue;
                if (static_cast<std::size_t>(at) >= sound.samples.size())
                    sound.samples.resize(static_cast<std::size_t>(at) + 1);
                sound.samples[static_cast<std::size_t>(at)] = *sample;
            }
        });
        if (!readable) problem = "the sound has an unknown sample format";
    }
    if (problem.empty()) return sound;
    error_ = problem;
    return std::nullopt;
}

RgbPicture toRgb(const DecodedPicture& picture, int width, int height) {
    const AVFrame& frame = *picture.frame;
    RgbPicture result{width, height, std::vector<std::uint8_t>(static_cast<std::size_t>(width) * height * 3)};
    const AvOwned<SwsContext> scaler(sws_getContext(frame.width, frame.height, static_cast<AVPixelFormat>(frame.format),
                                                    width, height, AV_PIX_FMT_RGB24, SWS_BILINEAR, nullptr, nullptr,
                                                    nullptr));
    std::uint8_t* const rows[]{result.samples.data()};
    const int strides[]{width * 3};
    if (scaler) sws_scale(scaler.get(), frame.data, frame.linesize, 0, frame.height, rows, strides);
    return result;
}

}  // namespace lumacast::checkers
