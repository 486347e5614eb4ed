#pragma once
// Asks the server for the microphone.

#include <functional>
#include <string>
#include <vector>

#include "linux/audio/PulseHandles.h"

namespace lumacast::sound {

/// The server's default source, as it is now.
struct ListedMicrophone {
    /// PA_INVALID_INDEX where there is none. What only repeats an output counts as none: whoever has no microphone
    /// must not find everybody's sound in its place.
    std::uint32_t index = PA_INVALID_INDEX;
    std::string name;
    pa_channel_map channels{};
    /// Whether a stream of a higher-priority role (a telephone call's) records from it.
    bool isTaken = false;
    /// Whether such a stream is about to record from somewhere: PipeWire says only later from where.
    bool isUndecided = false;
    bool isPipeWire = false;  ///< the server
};

/// One reading at a time. Belongs to the sound thread; destroying it ends a reading.
class MicrophoneReader final {
public:
    /// `done` is told each reading's result, null when the server refused part of it; it may not destroy the reader.
    using Done = std::function<void(const ListedMicrophone* microphone)>;

    MicrophoneReader(pa_context& context, Done done) : context_(context), done_(std::move(done)) {}
    MicrophoneReader(const MicrophoneReader&) = delete;
    MicrophoneReader& operator=(const MicrophoneReader&) = delete;

    bool isReading() const { return open_ > 0; }
    void start();

private:
    static void takeServer(pa_context*, const pa_server_info* info, void* self);
    static void takeSource(pa_context*, const pa_source_info* info, int end, void* self);
    static void takeRecording(pa_context*, const pa_source_output_info* info, int end, void* self);
    void ask(pa_operation* operation);
    void answered(bool succeeded);

    pa_context& context_;
    const Done done_;
    ListedMicrophone microphone_;
    int open_ = 0;
    bool failed_ = false;
    std::vector<OperationHandle> operations_;
};

}  // namespace lumacast::sound
