// When a process encodes its first picture: preloaded into the daemon and into ffmpeg, which both call libavcodec, it
// notes the moments of each video encoder's beginning in the file $LC_ENCODER_STAMPS, one line each: the process, the
// moment's name, CLOCK_MONOTONIC in nanoseconds. It is linked with nothing, as other programs of those processes
// inherit it.
//
//   loaded   the process has its libraries          frame    the encoder is given its first picture
//   opening  the encoder is about to be opened      packet   its first coded picture is there
//   opened   it is open

#include <dlfcn.h>
#include <fcntl.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <ctime>

extern "C" {
#include <libavcodec/avcodec.h>
}

namespace {

void note(const char* moment) {
    const char* const path = ::getenv("LC_ENCODER_STAMPS");
    if (!path) return;
    timespec now{};
    ::clock_gettime(CLOCK_MONOTONIC, &now);
    char line[96];
    const int length = std::snprintf(line, sizeof line, "%d %s %lld\n", static_cast<int>(::getpid()), moment,
                                     now.tv_sec * 1'000'000'000LL + now.tv_nsec);
    const int file = ::open(path, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
    if (file < 0) return;
    if (::write(file, line, static_cast<std::size_t>(length)) != length) std::abort();
    ::close(file);
}

template <class Function>
Function* theirs(Function*, const char* name) {
    auto* const found = reinterpret_cast<Function*>(::dlsym(RTLD_NEXT, name));
    if (!found) std::abort();
    return found;
}

[[gnu::constructor]] void loaded() {
    note("loaded");
}

/// Encoders whose first picture, or first coded one, is still to come.
std::atomic<const AVCodecContext*> withoutFrame{nullptr}, withoutPacket{nullptr};

bool takes(std::atomic<const AVCodecContext*>& expected, const AVCodecContext* context) {
    return expected.compare_exchange_strong(context, nullptr);
}

}  // namespace

extern "C" {

int avcodec_open2(AVCodecContext* context, const AVCodec* codec, AVDictionary** options) {
    static auto* const open = theirs(&avcodec_open2, "avcodec_open2");
    static auto* const isEncoder = theirs(&av_codec_is_encoder, "av_codec_is_encoder");
    const AVCodec* const its = codec ? codec : context->codec;
    if (!its || its->type != AVMEDIA_TYPE_VIDEO || !isEncoder(its)) return open(context, codec, options);
    note("opening");
    const int result = open(context, codec, options);
    if (result == 0) {
        note("opened");
        withoutFrame = withoutPacket = context;
    }
    return result;
}

int avcodec_send_frame(AVCodecContext* context, const AVFrame* frame) {
    static auto* const send = theirs(&avcodec_send_frame, "avcodec_send_frame");
    if (takes(withoutFrame, context)) note("frame");
    return send(context, frame);
}

int avcodec_receive_packet(AVCodecContext* context, AVPacket* packet) {
    static auto* const receive = theirs(&avcodec_receive_packet, "avcodec_receive_packet");
    const int result = receive(context, packet);
    if (result == 0 && takes(withoutPacket, context)) note("packet");
    return result;
}

}  // extern "C"
