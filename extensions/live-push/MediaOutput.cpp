#include "extensions/live-push/MediaOutput.h"

#include <thread>

namespace lumacast::extensions {

namespace {

/// The usual latency is 0.12 s; a receiver may ask for more.
constexpr std::chrono::milliseconds kPlayout{1000};
constexpr AVRational kNanoseconds{1, 1'000'000'000};

AVStream* addTrack(AVFormatContext& format, const AVCodecParameters& parameters, AVRational base) {
    AVStream* const stream = avformat_new_stream(&format, nullptr);
    if (!stream || avcodec_parameters_copy(stream->codecpar, &parameters) < 0) return nullptr;
    stream->codecpar->codec_tag = 0;
    stream->time_base = base;
    return stream;
}

}  // namespace

int MediaOutput::interrupt(void* opaque) {
    const auto& self = *static_cast<MediaOutput*>(opaque);
    return self.isGivenUp_() || std::chrono::steady_clock::now() > self.deadline_ ? 1 : 0;
}

std::string MediaOutput::open(const std::string& url, const char* format, const StreamTracks& tracks) {
    expectProgress();
    isSrt_ = url.starts_with("srt://");
    avformat_alloc_output_context2(&format_, nullptr, format, url.c_str());
    if (!format_) return "no memory";
    format_->interrupt_callback = {&interrupt, this};
    videoBase_ = tracks.videoBase;
    soundBase_ = tracks.soundBase;
    if (!addTrack(*format_, *tracks.video, videoBase_) || !addTrack(*format_, *tracks.sound, soundBase_))
        return "no memory";
    int status = avio_open2(&format_->pb, url.c_str(), AVIO_FLAG_WRITE, &format_->interrupt_callback, nullptr);
    if (status < 0) return avErrorText(status);
    format_->flags |= AVFMT_FLAG_FLUSH_PACKETS;
    AVDictionary* options = nullptr;
    // A live stream has no length to go back and fill in.
    av_dict_set(&options, "flvflags", "no_duration_filesize", 0);
    status = avformat_write_header(format_, &options);
    av_dict_free(&options);
    if (status < 0) return avErrorText(status);
    hasHeader_ = true;
    return {};
}

std::string MediaOutput::write(const AVPacket& packet, bool isVideo) {
    expectProgress();
    const AVRational base = isVideo ? videoBase_ : soundBase_;
    const std::int64_t time = av_rescale_q(packet.dts, base, kNanoseconds);
    if (!zero_) zero_ = time;
    if (time < *zero_) return {};
    const AvOwned<AVPacket> copy = sharedCopy(packet);
    if (!copy) return "no memory";
    copy->stream_index = isVideo ? 0 : 1;
    const std::int64_t zero = av_rescale_q(*zero_, kNanoseconds, base);
    copy->pts -= zero;
    copy->dts -= zero;
    av_packet_rescale_ts(copy.get(), base, format_->streams[copy->stream_index]->time_base);
    const int status = av_interleaved_write_frame(format_, copy.get());
    isBroken_ = status < 0;
    return isBroken_ ? avErrorText(status) : std::string();
}

/// SRT ends a connection at once, with what the receiver holds back for its latency.
void MediaOutput::waitForPlayout() const {
    const auto until = std::chrono::steady_clock::now() + kPlayout;
    while (!isGivenUp_() && std::chrono::steady_clock::now() < until)
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
}

MediaOutput::~MediaOutput() {
    if (!format_) return;
    expectProgress();
    const bool isWhole = hasHeader_ && av_write_trailer(format_) >= 0 && !isBroken_;
    if (isWhole && isSrt_) waitForPlayout();
    if (format_->pb) avio_closep(&format_->pb);
    avformat_free_context(format_);
}

}  // namespace lumacast::extensions
