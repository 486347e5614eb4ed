#pragma once
// What an application links to record itself.

#include <chrono>
#include <cstdint>
#include <functional>
#include <future>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/Identifiers.h"
#include "base/Value.h"

namespace lumacast::client {

/// The domain of errors that come from the connection, not from the daemon; see ConnectionError.
inline constexpr char kConnectionErrorDomain[] = "com.orvane.Lumacast.client";

enum class ConnectionError : std::int64_t {
    NotReached = 1,  ///< the daemon is not there, or the connection ended before the answer came
};

struct StartOptions {
    /// The application's own windows (on X11: window ids). All must belong to the application.
    std::vector<ContextID> windows;
    /// Size of the movie in pixels; the daemon caps it.
    Size size;
    bool microphone = false;
    bool camera = false;
    bool broadcast = false;
    bool systemRecording = false;
    bool capture = false;
};

struct StartAnswer {
    std::optional<Error> error;
    bool microphoneRecording = false;
    bool cameraRecording = false;
};

struct StopAnswer {
    /// The finished movie. The file is good until the application records again, discards it, or the device needs the
    /// space: copy it or open it before.
    std::optional<URL> movie;
    std::optional<Error> error;
};

struct StateAnswer {
    std::optional<Dictionary> state;
    std::optional<Error> error;
};

/// One application's connection to the daemon. Thread-safe. Every answer and every event comes on a thread of the
/// library's own, one at a time; answers exactly once each, with a connection error when the daemon can't be reached or
/// goes away (a request that the daemon never answers waits until then). Destroying the recorder ends a running
/// recording, answers what is pending and joins that thread: never destroy it from a handler.
class Recorder {
public:
    struct Events {
        /// The recording ended by itself, or another one took its place.
        std::function<void(std::optional<Error> error, std::optional<URL> movie)> stopped;
        /// The daemon went away. The recorder is of no use any more.
        std::function<void()> disconnected;
    };

    /// Connects to the daemon whose sockets are in `runtimeDirectory`; by default the user's
    /// ("$XDG_RUNTIME_DIR/lumacast").
    explicit Recorder(Events events, std::string runtimeDirectory = defaultRuntimeDirectory());
    ~Recorder();
    Recorder(const Recorder&) = delete;
    Recorder& operator=(const Recorder&) = delete;

    void start(const StartOptions& options, std::function<void(StartAnswer)> answered);
    /// Stops and keeps the whole movie. Not answered when nothing is being recorded.
    void stop(std::function<void(StopAnswer)> answered);
    /// Stops and keeps the movie without its first `fromStart` and last `fromEnd` seconds (rounded to whole ones, both
    /// above 0). Not answered when the clip can't be made.
    void stopWithClip(double fromStart, double fromEnd, std::function<void(StopAnswer)> answered);
    void pause();
    /// Goes on, recording `window`.
    void resume(ContextID window);
    /// Deletes the last movie. Not answered while recording.
    void discard(std::function<void(std::optional<Error>)> answered);
    /// The application's state as the daemon has it: "isRecording" and others.
    void state(std::function<void(StateAnswer)> answered);

    // The same, waiting for the answer. Never call them from a handler.
    StartAnswer startAndWait(const StartOptions& options);
    StopAnswer stopAndWait();
    StopAnswer stopWithClipAndWait(double fromStart, double fromEnd);
    StateAnswer stateAndWait();

    /// "$XDG_RUNTIME_DIR/lumacast", or "/run/user/UID/lumacast" without that variable.
    static std::string defaultRuntimeDirectory();

private:
    class Connection;
    std::shared_ptr<Connection> connection_;
};

}  // namespace lumacast::client
