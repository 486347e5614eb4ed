#pragma once
// What a recorder is asked, and what it answers and tells. Values; their owner is whoever holds them.

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <vector>

#include "base/Identifiers.h"
#include "base/Value.h"
#include "broadcast/LCBroadcastConfiguration.h"
#include "writer/media/AudioFormat.h"
#include "writer/media/PixelBuffer.h"
#include "writer/media/SampleBuffer.h"

namespace lumacast::client {

struct StartOptions {
    /// The application's own windows (on X11: window ids), at most 64. All must belong to the application.
    std::vector<ContextID> windows;
    /// Size of the movie in pixels; the daemon caps it.
    Size size;
    bool microphone = false;
    bool camera = false;
    /// Through the extension that was set up last, see Recorder::setUpBroadcast. There is no movie then.
    bool broadcast = false;
    bool systemRecording = false;
    /// Pictures and sound are handed to the application (Events::videoSample, audioSample). There is no movie then.
    bool capture = false;
};

/// What the application's next broadcast goes through.
struct BroadcastSetup {
    /// The bundle identifier of the application that is going to broadcast: its own.
    BundleIdentifier host;
    /// An upload extension, or anything with its prefix: the last component does not count.
    std::string extension;
    /// How long a clip is, and how it is compressed, where the extension takes clips; none: as the daemon does it.
    std::optional<LCBroadcastConfiguration> configuration;
    /// Whatever the extension wants to know: what it is to be called, where it goes.
    Dictionary userInfo;
};

/// One installed upload extension.
struct BroadcastExtension {
    std::string displayName;  ///< in the user's language; may be empty
    BundleIdentifier identifier;
    Data icon;  ///< a PNG file, or nothing
};

struct BroadcastExtensionsAnswer {
    std::vector<BroadcastExtension> extensions;
    std::optional<Error> error;
};

/// PNG files; empty where there is none.
struct BroadcastImagesAnswer {
    Data host, extension;
    std::optional<Error> error;  ///< a connection error
};

struct StartAnswer {
    /// Why nothing is being recorded: FailedToStart (a window that is not the application's own, a size that is none,
    /// an application that is not in the foreground, or something that this daemon does not do), UserDeclined,
    /// InsufficientStorage, InvalidBroadcastSession (a broadcast without a set-up), Entitlements (a system recording),
    /// or a connection error. None: the recording runs.
    std::optional<Error> error;
    bool microphoneRecording = false;
    bool cameraRecording = false;
};

struct StopAnswer {
    /// The finished movie; none after an error. See Recorder for how long the file is good.
    std::optional<URL> movie;
    /// FailedToSave, or a connection error.
    std::optional<Error> error;
};

struct StateAnswer {
    /// What the daemon knows of the application; see RecordingState.
    std::optional<Dictionary> state;
    /// A connection error.
    std::optional<Error> error;
};

/// The entries of a StateAnswer's dictionary.
struct RecordingState {
    bool isRecording = false;  ///< also while paused
    bool isBroadcasting = false;
    bool microphoneEnabled = false;
    bool isSystemRecording = false;
    bool hasUserConsentForMicrophone = false;
    bool hasUserConsentForCamera = false;
    bool microphoneEnabledPersistent = false;
    std::optional<URL> broadcastURL;
};

/// Reads it; an entry that is missing or of another kind counts as false, or absent.
RecordingState recordingState(const Dictionary& state);

/// One captured picture, for those who asked to capture. The memory is the daemon's, shared: let go of `plane` soon,
/// the daemon lends only a few at a time, and none while they are all kept.
struct VideoSample {
    std::shared_ptr<SharedPlane> plane;  ///< null for a frame without a picture
    SampleTiming timing;
};

/// One captured run of sound.
struct AudioSample {
    enum class Source { Application, Microphone };
    Source source = Source::Application;
    AudioFormat format;
    Data bytes;
    std::int64_t frames = 0;
    SampleTiming timing;
};

/// What the daemon tells an application by itself. Any of them may be left empty.
struct Events {
    /// The recording ended by itself (an error says why), or another one took its place (Interrupted). The movie only
    /// where there is one to hand out: after a resume with a foreign window, or an interrupted recording that the
    /// application comes back to.
    std::function<void(std::optional<Error> error, std::optional<URL> movie)> stopped = {};
    /// The connection has ended, or the daemon isn't there to begin with. A recording that was running has ended.
    /// `connected` and `disconnected` alternate.
    std::function<void()> disconnected = {};
    /// The daemon has answered: the first time, and after each `disconnected`. Nothing of an earlier connection is left
    /// at the daemon: start again what is to go on.
    std::function<void()> connected = {};

    /// What the broadcast's extension tells of itself.
    std::function<void(const Value& info)> broadcastServiceInfo = {};
    /// Where the broadcast can be watched.
    std::function<void(std::optional<URL> url)> broadcastURL = {};
    /// Pictures that come twice with one stamp (the last one before a pause is repeated after it) are told once.
    std::function<void(const VideoSample& sample)> videoSample = {};
    std::function<void(const AudioSample& sample)> audioSample = {};

    // Of the messages below today's daemon sends none; they are delivered when it does.

    /// Recording is now on or off.
    std::function<void(bool isOn)> recordingStateChanged = {};
    /// The device was locked.
    std::function<void(const Value& details)> interrupted = {};
    /// How long the recording has been going on, as the daemon shows it.
    std::function<void(const Value& elapsed)> timerUpdated = {};
};

}  // namespace lumacast::client
