#pragma once
// Owning handles for libav objects.

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavformat/avformat.h>
#include <libavutil/channel_layout.h>
#include <libavutil/opt.h>
#include <libswresample/swresample.h>
}

#include <array>
#include <memory>
#include <string>

namespace lumacast::extensions {

struct AvFree {
    void operator()(AVCodecContext* context) const { avcodec_free_context(&context); }
    void operator()(AVCodecParameters* parameters) const { avcodec_parameters_free(&parameters); }
    void operator()(AVFrame* frame) const { av_frame_free(&frame); }
    void operator()(AVPacket* packet) const { av_packet_free(&packet); }
    void operator()(SwrContext* context) const { swr_free(&context); }
};
template <class T>
using AvOwned = std::unique_ptr<T, AvFree>;

inline std::string avErrorText(int error) {
    std::array<char, AV_ERROR_MAX_STRING_SIZE> text{};
    av_strerror(error, text.data(), text.size());
    return text.data();
}

/// A second reference to a packet's bytes. Null when there is no memory.
inline AvOwned<AVPacket> sharedCopy(const AVPacket& packet) {
    return AvOwned<AVPacket>(av_packet_clone(&packet));
}

}  // namespace lumacast::extensions
