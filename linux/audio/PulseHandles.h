#pragma once
// Owning handles of the sound server's client library. They belong to the sound thread.

#include <pulse/pulseaudio.h>

#include <memory>

namespace lumacast::sound {

struct FreeMainLoop {
    void operator()(pa_mainloop* loop) const { pa_mainloop_free(loop); }
};
struct FreeContext {
    void operator()(pa_context* context) const {
        // First of all: no call comes back to whoever lets go of it.
        pa_context_set_state_callback(context, nullptr, nullptr);
        pa_context_set_subscribe_callback(context, nullptr, nullptr);
        pa_context_disconnect(context);
        pa_context_unref(context);
    }
};
struct FreeStream {
    void operator()(pa_stream* stream) const {
        // First of all: no call comes back to whoever lets go of it.
        pa_stream_set_state_callback(stream, nullptr, nullptr);
        pa_stream_set_read_callback(stream, nullptr, nullptr);
        pa_stream_set_write_callback(stream, nullptr, nullptr);
        pa_stream_set_latency_update_callback(stream, nullptr, nullptr);
        pa_stream_set_moved_callback(stream, nullptr, nullptr);
        pa_stream_set_suspended_callback(stream, nullptr, nullptr);
        if (pa_stream_get_state(stream) == PA_STREAM_CREATING)
            disconnectOnceItIsMade(stream);
        else
            pa_stream_disconnect(stream);
        pa_stream_unref(stream);
    }

private:
    /// The library can't take back what the server hasn't answered yet, and keeps such a stream until its context goes:
    /// it would stay at the server, and record on.
    static void disconnectOnceItIsMade(pa_stream* stream) {
        pa_stream_set_state_callback(
            stream,
            [](pa_stream* made, void*) {
                if (pa_stream_get_state(made) == PA_STREAM_READY) pa_stream_disconnect(made);
            },
            nullptr);
    }
};
struct FreePropertyList {
    void operator()(pa_proplist* list) const { pa_proplist_free(list); }
};
/// An operation that is let go of is cancelled: its answer never comes.
struct CancelOperation {
    void operator()(pa_operation* operation) const {
        pa_operation_cancel(operation);
        pa_operation_unref(operation);
    }
};

using MainLoopHandle = std::unique_ptr<pa_mainloop, FreeMainLoop>;
using ContextHandle = std::unique_ptr<pa_context, FreeContext>;
using StreamHandle = std::unique_ptr<pa_stream, FreeStream>;
using PropertyListHandle = std::unique_ptr<pa_proplist, FreePropertyList>;
using OperationHandle = std::unique_ptr<pa_operation, CancelOperation>;

}  // namespace lumacast::sound
