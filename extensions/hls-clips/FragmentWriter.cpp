#include "extensions/hls-clips/FragmentWriter.h"

#include <memory>
#include <span>

#include "extensions/hls-clips/ClipMedia.h"

namespace lumacast::extensions {

namespace {

/// A muxer into memory.
class MemoryOutput final {
public:
    MemoryOutput() {
        avformat_alloc_output_context2(&format_, nullptr, "mp4", nullptr);
        if (format_ && avio_open_dyn_buf(&format_->pb) < 0) format_->pb = nullptr;
    }
    MemoryOutput(const MemoryOutput&) = delete;
    MemoryOutput& operator=(const MemoryOutput&) = delete;
    ~MemoryOutput() {
        if (!format_) return;
        if (format_->pb) take();
        avformat_free_context(format_);
    }
    bool isOpen() const { return format_ && format_->pb; }
    AVFormatContext& format() { return *format_; }
    /// What was written until now. Nothing can be written after it but behind begin().
    Data take() {
        std::uint8_t* bytes = nullptr;
        const int size = avio_close_dyn_buf(format_->pb, &bytes);
        format_->pb = nullptr;
        Data data(bytes, bytes + size);
        av_free(bytes);
        return data;
    }
    bool begin() { return avio_open_dyn_buf(&format_->pb) >= 0; }

private:
    AVFormatContext* format_ = nullptr;
};

AVStream* addStream(AVFormatContext& format, AVRational timeBase) {
    AVStream* stream = avformat_new_stream(&format, nullptr);
    if (stream) stream->time_base = timeBase;
    return stream;
}

int writePackets(AVFormatContext& format, const AVStream& stream, AVRational base,
                 std::span<const AvOwned<AVPacket>> packets) {
    for (const auto& packet : packets) {
        const AvOwned<AVPacket> copy = sharedCopy(*packet);
        if (!copy) return AVERROR(ENOMEM);
        copy->stream_index = stream.index;
        av_packet_rescale_ts(copy.get(), base, stream.time_base);
        // Both tracks go into one fragment, each by itself: no interleaving is needed.
        if (const int status = av_write_frame(&format, copy.get()); status < 0) return status;
    }
    return 0;
}

}  // namespace

std::string writeSegment(const SegmentMedia& media, std::uint32_t number, SegmentBytes& bytes) {
    MemoryOutput output;
    if (!output.isOpen()) return "no memory";
    AVFormatContext& format = output.format();
    const AVRational soundBase{1, media.sound->sample_rate};
    AVStream* const video = addStream(format, {1, kTicksPerSecond});
    AVStream* const sound = addStream(format, soundBase);
    if (!video || !sound || avcodec_parameters_copy(video->codecpar, media.video) < 0 ||
        avcodec_parameters_from_context(sound->codecpar, media.sound) < 0)
        return "no memory";
    video->codecpar->codec_tag = 0;
    video->codecpar->bit_rate = 0;        // each clip's own average would make each header another
    format.flags |= AVFMT_FLAG_BITEXACT;  // the same header each time
    format.avoid_negative_ts = AVFMT_AVOID_NEG_TS_DISABLED;
    AVDictionary* options = nullptr;
    av_dict_set(&options, "movflags", "frag_custom+empty_moov+default_base_moof+frag_discont", 0);
    av_dict_set(&options, "use_editlist", "0", 0);
    av_dict_set_int(&options, "video_track_timescale", kTicksPerSecond, 0);
    av_dict_set_int(&options, "fragment_index", number, 0);
    int status = avformat_write_header(&format, &options);
    av_dict_free(&options);
    if (status < 0) return avErrorText(status);
    bytes.init = output.take();
    if (!output.begin()) return "no memory";
    status = writePackets(format, *video, {1, kTicksPerSecond}, media.pictures);
    if (status >= 0) status = writePackets(format, *sound, soundBase, media.sounds);
    if (status >= 0) status = av_write_frame(&format, nullptr);  // ends the fragment
    if (status < 0) return avErrorText(status);
    bytes.media = output.take();
    return {};
}

}  // namespace lumacast::extensions
