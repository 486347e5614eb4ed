#pragma once
// Owning handles for libav objects, and its errors as ours.

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavformat/avformat.h>
#include <libavutil/buffer.h>
#include <libavutil/frame.h>
#include <libavutil/hwcontext.h>
#include <libavutil/opt.h>
#include <libswresample/swresample.h>
}

#include <cerrno>
#include <memory>
#include <string>

#include "base/Value.h"

namespace lumacast::media {

struct AvFree {
    void operator()(AVCodecContext* context) const { avcodec_free_context(&context); }
    void operator()(AVFormatContext* context) const { avformat_close_input(&context); }
    void operator()(AVFrame* frame) const { av_frame_free(&frame); }
    void operator()(AVPacket* packet) const { av_packet_free(&packet); }
    void operator()(AVBufferRef* buffer) const { av_buffer_unref(&buffer); }
    void operator()(SwrContext* context) const { swr_free(&context); }
};
template <class T>
using AvOwned = std::unique_ptr<T, AvFree>;

inline Error systemError(int number) { return Error(std::string(kSystemErrorDomain), number); }

/// libav's own errors have no number of the system: they become EPROTO (bytes or settings that make no sense).
inline Error avError(int error) {
    const bool isSystem = error < 0 && -error < 4096;
    return systemError(isSystem ? AVUNERROR(error) : EPROTO);
}

}  // namespace lumacast::media
