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
    /// Asked of the user, never recorded: this version captures neither. What the user grants goes on without them.
    bool microphone = false;
    bool camera = false;
    /// Through the extension that was set up last, see Recorder::setUpBroadcast. There is no movie then.
    bool broadcast = false;
    /// The whole display, whatever `windows` says. Takes the administrator's entitlement, else Entitlements.
    bool systemRecording = false;
    /// Pictures and sound are handed to the application (Events::videoSample, audioSample). There is no movie then.
    bool capture = false;
};

/// What the application's next broadcast goes through.
struct BroadcastSetup {
    /// The bundle identifier of the application that is going to broadcast: its own.
    BundleIdentifier host;
    /// An upload extension's identifier and one more component, as "org.example.clip-keeper.*". The last component is
    /// cut off, whatever it is, and the first installed extension whose identifier begins with the rest is taken. So
    /// the identifier alone may choose a neighbour ("org.example.clip-keeper" takes any "org.example..."), and a text
    /// without a dot takes any extension.
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
    /// an application that is not in the foreground, too many starts that wait for the user, or a newer start),
    /// UserDeclined, InsufficientStorage, InvalidBroadcastSession (a broadcast without a set-up, or whose extension has
    /// died), the error that a broadcast's extension ended with, Entitlements (a system recording), or a connection
    /// error. None: the recording runs.
    std::optional<Error> error;
    /// Asked for, and nobody took it away: true says that the user was not asked about it (LCSuppressAlert; of the
    /// camera, also a grant that still held), not that anything is captured.
    bool microphoneRecording = false;
    bool cameraRecording = false;
};

struct StopAnswer {
    /// The finished movie; none after an error, of a broadcast, and of one that captured. See Recorder for how long the
    /// file is good.
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
    bool microphoneEnabled = false;  ///< what the start had left of it, or setMicrophoneEnabled said last
    bool isSystemRecording = false;
    bool hasUserConsentForMicrophone = false;
    bool hasUserConsentForCamera = false;
    bool microphoneEnabledPersistent = false;
    std::optional<URL> broadcastURL;
};

/// Reads it; an entry that is missing or of another kind counts as false, or absent.
RecordingState recordingState(const Dictionary& state);

// The times of both samples are of one clock, the recording's own: it is zero at the first picture and stands while the
// recording is paused; 1,000,000,000 ticks a second. Their decode time is the invalid one.

/// One captured picture, BGRX, for those who asked to capture. The memory is the daemon's, shared: let go of `plane`
/// soon, the daemon lends only a few at a time, and none while they are all kept. Any thread may do so.
struct VideoSample {
    std::shared_ptr<SharedPlane> plane;  ///< null for a frame without a picture
    SampleTiming timing;                 ///< when it was captured; its duration is the least time to the next one
};

/// One captured run of sound. Nothing of it is the daemon's memory.
struct AudioSample {
    enum class Source { Application, Microphone };
    Source source = Source::Application;  ///< never the microphone in this version
    /// Linear PCM; what is in it counts. Today one channel, signed 16-bit integers, big-endian, 44,100 frames a second.
    AudioFormat format;
    Data bytes;               ///< frames * format.bytesPerFrame
    std::int64_t frames = 0;  ///< one sample of each channel
    SampleTiming timing;      ///< when the first frame was played, and how long they all last
};

/// What the daemon tells an application by itself. Any of them may be left empty.
struct Events {
    /// The recording ended by itself (an error says why; of a broadcast, whatever its extension ended it with), or
    /// another one took its place: Interrupted, or no error when that one's user was being asked as this one began. The
    /// movie only then, after a resume with a foreign window, and when didBecomeActive tells of an earlier recording.
    /// Otherwise the application has lost it (but of the whole display, what another start took the place of is in the
    /// library).
    std::function<void(std::optional<Error> error, std::optional<URL> movie)> stopped = {};
    /// The connection has ended, or the daemon isn't there to begin with. A recording that was running has ended, but
    /// for one of the whole display where the daemon lives on.
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
