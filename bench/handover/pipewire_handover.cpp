// How long a frame takes through a PipeWire video stream to another process that has dequeued it, with its pixels
// mapped, and has read some. Prints microseconds, one line a frame: from where it is queued, in the thread that
// PipeWire calls for it, and from where another thread asks for that, as a capture would.
//
//   pipewire_handover FRAMES FRAMES-A-SECOND
//
// The maker drives the graph; both are called in their data threads, with memory that stays mapped. Needs a PipeWire
// server, and links the two streams by itself.

#include <pipewire/pipewire.h>
#include <spa/param/video/format-utils.h>

#include <cstring>
#include <utility>

#include "bench/handover/Handover.h"

namespace {

using namespace lumacast::bench;

constexpr std::uint32_t kBuffers = 4;
constexpr int kSecondsToLink = 20;

/// What a frame begins with.
struct Stamps {
    std::int64_t queued, triggered;
};

/// What the maker knows of the taker.
struct Shared {
    std::atomic<std::uint32_t> node;  ///< 0: none yet
    std::atomic<bool> isStreaming;
};

const spa_pod* videoFormat(spa_pod_builder& builder, int rate) {
    spa_video_info_raw info{};
    info.format = SPA_VIDEO_FORMAT_BGRx;
    info.size = SPA_RECTANGLE(kWidth, kHeight);
    info.framerate = SPA_FRACTION(static_cast<std::uint32_t>(rate), 1);
    return spa_format_video_raw_build(&builder, SPA_PARAM_EnumFormat, &info);
}

const spa_pod* memoryBuffers(spa_pod_builder& builder) {
    return static_cast<const spa_pod*>(spa_pod_builder_add_object(
        &builder, SPA_TYPE_OBJECT_ParamBuffers, SPA_PARAM_Buffers, SPA_PARAM_BUFFERS_buffers, SPA_POD_Int(kBuffers),
        SPA_PARAM_BUFFERS_blocks, SPA_POD_Int(1), SPA_PARAM_BUFFERS_size, SPA_POD_Int(static_cast<int>(kFrameBytes)),
        SPA_PARAM_BUFFERS_stride, SPA_POD_Int(static_cast<int>(kStride)), SPA_PARAM_BUFFERS_dataType,
        SPA_POD_CHOICE_FLAGS_Int((1 << SPA_DATA_MemFd) | (1 << SPA_DATA_MemPtr))));
}

/// A stream with a thread of its own besides the data thread. `process` is called on the data thread.
class Stream {
public:
    Stream(const char* name, pw_direction direction, pw_stream_flags more, int rate, std::function<void()> process)
        : process_(std::move(process)), loop_(pw_thread_loop_new(name, nullptr)) {
        pw_thread_loop_lock(loop_);
        stream_ = pw_stream_new_simple(pw_thread_loop_get_loop(loop_), name,
                                       pw_properties_new(PW_KEY_MEDIA_TYPE, "Video", nullptr), &kEvents, this);
        if (!stream_) fail("no server");
        std::uint8_t memory[1024];
        spa_pod_builder builder = SPA_POD_BUILDER_INIT(memory, sizeof memory);
        const spa_pod* parameters[] = {videoFormat(builder, rate)};
        const auto flags = static_cast<pw_stream_flags>(PW_STREAM_FLAG_MAP_BUFFERS | PW_STREAM_FLAG_RT_PROCESS | more);
        if (pw_stream_connect(stream_, direction, PW_ID_ANY, flags, parameters, 1) < 0) fail("no stream");
        pw_thread_loop_start(loop_);
        pw_thread_loop_unlock(loop_);
    }
    Stream(const Stream&) = delete;
    Stream& operator=(const Stream&) = delete;
    ~Stream() {
        pw_thread_loop_stop(loop_);
        pw_stream_destroy(stream_);
        pw_thread_loop_destroy(loop_);
    }

    pw_stream* get() const { return stream_; }
    std::uint32_t node() const { return node_; }
    bool isStreaming() const { return isStreaming_; }

    template <class Body>
    auto locked(const Body& body) {
        pw_thread_loop_lock(loop_);
        const auto result = body();
        pw_thread_loop_unlock(loop_);
        return result;
    }

    [[noreturn]] static void fail(const char* what) {
        std::fprintf(stderr, "pipewire_handover: %s\n", what);
        ::_exit(1);
    }

private:
    void stateChanged(pw_stream_state state, const char* error) {
        if (state == PW_STREAM_STATE_ERROR) fail(error ? error : "the stream has failed");
        if (state == PW_STREAM_STATE_PAUSED) node_ = pw_stream_get_node_id(stream_);
        isStreaming_ = state == PW_STREAM_STATE_STREAMING;
    }
    void formatChanged(const spa_pod* format) {
        if (!format) return;
        std::uint8_t memory[1024];
        spa_pod_builder builder = SPA_POD_BUILDER_INIT(memory, sizeof memory);
        const spa_pod* parameters[] = {memoryBuffers(builder)};
        pw_stream_update_params(stream_, parameters, 1);
    }
    static Stream& of(void* stream) { return *static_cast<Stream*>(stream); }
    static pw_stream_events events() {
        pw_stream_events events{};
        events.version = PW_VERSION_STREAM_EVENTS;
        events.state_changed = [](void* me, pw_stream_state, pw_stream_state state, const char* error) {
            of(me).stateChanged(state, error);
        };
        events.param_changed = [](void* me, std::uint32_t id, const spa_pod* parameter) {
            if (id == SPA_PARAM_Format) of(me).formatChanged(parameter);
        };
        events.process = [](void* me) { of(me).process_(); };
        return events;
    }

    static const pw_stream_events kEvents;
    const std::function<void()> process_;
    pw_thread_loop* const loop_;
    pw_stream* stream_ = nullptr;
    std::atomic<std::uint32_t> node_{0};  // no stream's
    std::atomic<bool> isStreaming_{false};
};
const pw_stream_events Stream::kEvents = Stream::events();

bool within(int seconds, const std::function<bool()>& condition) {
    const std::int64_t end = now() + seconds * 1'000'000'000LL;
    while (!condition()) {
        if (now() > end) return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    return true;
}

/// The other process: notes when it has a frame.
[[noreturn]] void takeFrames(Shared& shared, Results& queued, Results& triggered, int rate) {
    pw_init(nullptr, nullptr);
    Stream* self = nullptr;
    Stream stream("taker", PW_DIRECTION_INPUT, PW_STREAM_FLAG_NONE, rate, [&] {
        pw_buffer* const buffer = pw_stream_dequeue_buffer(self->get());
        if (!buffer) return;
        const spa_data& data = buffer->buffer->datas[0];
        // Mapped by the library: part of one shared file, and told as a pointer into it.
        if (!data.data || data.maxsize < kFrameBytes) Stream::fail("no memory");
        Stamps stamps;
        std::memcpy(&stamps, data.data, sizeof stamps);
        const std::int64_t arrived = now();
        queued.add(stamps.queued, arrived);
        triggered.add(stamps.triggered, arrived);
        pw_stream_queue_buffer(self->get(), buffer);
    });
    self = &stream;
    if (!within(kSecondsToLink, [&] { return stream.node() != 0; })) Stream::fail("no node");
    shared.node = stream.node();
    if (!within(kSecondsToLink, [&] { return stream.isStreaming(); })) Stream::fail("no link");
    shared.isStreaming = true;
    for (;;) ::pause();
}

pw_proxy* link(Stream& maker, std::uint32_t taker) {
    return maker.locked([&] {
        pw_properties* const nodes = pw_properties_new(nullptr, nullptr);
        pw_properties_setf(nodes, PW_KEY_LINK_OUTPUT_NODE, "%u", maker.node());
        pw_properties_setf(nodes, PW_KEY_LINK_INPUT_NODE, "%u", taker);
        auto* const made = static_cast<pw_proxy*>(pw_core_create_object(
            pw_stream_get_core(maker.get()), "link-factory", PW_TYPE_INTERFACE_Link, PW_VERSION_LINK, &nodes->dict, 0));
        pw_properties_free(nodes);
        return made;
    });
}

}  // namespace

int main(int argc, char** argv) {
    const int frames = argc == 3 ? std::atoi(argv[1]) : 0;
    const int rate = argc == 3 ? std::atoi(argv[2]) : 0;
    if (frames < 1 || rate < 1) return std::fprintf(stderr, "usage: pipewire_handover FRAMES FRAMES-A-SECOND\n"), 2;
    auto& shared = *static_cast<Shared*>(sharedWithChildren(sizeof(Shared)));
    Results queued(frames), triggered(frames);
    const Child taker([&] { takeFrames(shared, queued, triggered, rate); });

    pw_init(&argc, &argv);
    std::atomic<std::int64_t> asked{0};
    Stream* self = nullptr;
    Stream maker("maker", PW_DIRECTION_OUTPUT, PW_STREAM_FLAG_DRIVER, rate, [&] {
        const std::int64_t trigger = asked.exchange(0);
        if (trigger == 0) return;
        pw_buffer* const buffer = pw_stream_dequeue_buffer(self->get());
        if (!buffer) return;
        spa_data& data = buffer->buffer->datas[0];
        data.chunk->offset = 0;
        data.chunk->size = static_cast<std::uint32_t>(kFrameBytes);
        data.chunk->stride = static_cast<std::int32_t>(kStride);
        const Stamps stamps{now(), trigger};
        std::memcpy(data.data, &stamps, sizeof stamps);
        pw_stream_queue_buffer(self->get(), buffer);
    });
    self = &maker;
    if (!within(kSecondsToLink, [&] { return maker.node() != 0 && shared.node != 0; })) Stream::fail("no nodes");
    pw_proxy* const line = link(maker, shared.node);
    const auto isLinked = [&] { return maker.isStreaming() && shared.isStreaming; };
    if (!line || !within(kSecondsToLink, isLinked)) Stream::fail("no link");
    atPace(frames, rate, [&](std::size_t) {
        asked = now();
        maker.locked([&] { return pw_stream_trigger_process(maker.get()); });
    });
    maker.locked([&] { return pw_proxy_destroy(line), 0; });
    return print({queued.take(), triggered.take()});
}
