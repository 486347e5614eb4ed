#pragma once
// Asks the server for what TapSelection decides on.

#include <functional>
#include <vector>

#include "linux/audio/PulseHandles.h"
#include "linux/audio/TapSelection.h"

namespace lumacast::sound {

/// What is taken from what the server says of one client, and of one stream that is played. Strangers write it: any
/// properties, names and channels.
ListedClient listedClient(const pa_client_info& info);
ListedPlayback listedPlayback(const pa_sink_input_info& info);

/// Reads the server's lists, one reading at a time. Belongs to the sound thread; destroying it ends a reading.
class ServerReader final {
public:
    /// `done` is told each reading's result, null when the server refused part of it; it may not destroy the reader.
    using Done = std::function<void(const ServerListing* listing)>;

    ServerReader(pa_context& context, Done done) : context_(context), done_(std::move(done)) {}
    ServerReader(const ServerReader&) = delete;
    ServerReader& operator=(const ServerReader&) = delete;

    bool isReading() const { return open_ > 0; }
    void start();

private:
    static void takeServer(pa_context*, const pa_server_info* info, void* self);
    static void takeClient(pa_context*, const pa_client_info* info, int end, void* self);
    static void takeSink(pa_context*, const pa_sink_info* info, int end, void* self);
    static void takePlayback(pa_context*, const pa_sink_input_info* info, int end, void* self);
    static void takeRecording(pa_context*, const pa_source_output_info* info, int end, void* self);
    void ask(pa_operation* operation);
    void answered(bool succeeded);

    pa_context& context_;
    const Done done_;
    ServerListing listing_;
    int open_ = 0;
    bool failed_ = false;
    std::vector<OperationHandle> operations_;
};

}  // namespace lumacast::sound
