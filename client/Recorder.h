#pragma once
// What an application links to record itself.

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "base/Identifiers.h"
#include "base/Value.h"
#include "client/Answers.h"
#include "client/Errors.h"

namespace lumacast::client {

class Link;

/// For calls that wait: without a limit, until the daemon answers or the connection ends.
inline constexpr std::chrono::milliseconds kNoLimit = std::chrono::milliseconds::max();
/// For what the daemon may leave without an answer.
inline constexpr std::chrono::milliseconds kPatience = std::chrono::seconds(60);

/// One application's connection to the daemon.
///
/// Threads: callable from any thread, handlers included; nothing blocks but the calls that say so. Every answer and
/// event comes on one thread of the library's own, one at a time, never from within a call, with all signals blocked.
/// A handler must not throw, and holds up all others.
///
/// Answers: each question is answered exactly once: by the daemon, or with a connection error when it can't be reached,
/// goes away, or the recorder is destroyed (see ConnectionError for what each means). Questions that the daemon
/// deliberately leaves without an answer say so below: they wait until the connection ends, and keep no other question
/// from being asked. 1024 of them are kept; one more, and the oldest is answered with NoAnswer. Of all others 64 may be
/// under way at a time; what is asked beyond that is answered with Busy.
///
/// Connection: made at once, and again by itself after it was lost, 50 ms later at first, then less and less often, at
/// the longest every 5 s. In between, questions are answered with NotReached at once and messages without an answer are
/// lost; while the daemon is there but too many wait to be accepted, up to 63 of both are held. An application has one
/// connection: a newer one, of whatever process of it, takes the older one's place, and its recording goes on. The
/// older recorder is told `disconnected` and stays so until it is asked for something, which makes it the newest.
///
/// Movies: the file that a StopAnswer names stays until the application's next start (a clip: until its next clip), its
/// discard() (not a clip), or a day has passed; or until the device runs out of space (below 100 MB free, or by the
/// administrator's purge). Copy it, open it or have it saved before; an opened file stays readable.
///
/// Destroying the recorder ends a running recording and throws it away (one of the whole display goes on without its
/// application, until the next start puts its movie into the library), answers what is pending with Closed and waits
/// for the handler that is running. From within a handler it does all that but the waiting. No handler runs after it.
class Recorder {
public:
    using Events = client::Events;

    /// Connects to the daemon whose sockets are in `runtimeDirectory`; by default the user's
    /// ("$XDG_RUNTIME_DIR/lumacast"). Does not wait for the connection: ask at once. Throws std::system_error when no
    /// thread can be had.
    explicit Recorder(Events events, std::string runtimeDirectory = defaultRuntimeDirectory());
    ~Recorder();
    Recorder(const Recorder&) = delete;
    Recorder& operator=(const Recorder&) = delete;

    /// Starts a recording; one that is running, of whatever application, ends. A broadcast's start is answered when its
    /// extension has taken note of it, which may be never; the next start, or the extension's failure, ends the wait.
    void start(const StartOptions& options, std::function<void(StartAnswer)> answered);
    /// Stops and keeps the whole movie. Not answered when nothing is being recorded, nor when the extension that takes a
    /// broadcast's samples dies before it has taken note of the end.
    void stop(std::function<void(StopAnswer)> answered);
    /// Stops and keeps the movie without its first `fromStart` and last `fromEnd` seconds, rounded to whole ones. Only
    /// with both above 0: else the whole movie is answered, uncut. Not answered when nothing is being recorded, or the
    /// clip can't be made.
    void stopWithClip(double fromStart, double fromEnd, std::function<void(StopAnswer)> answered);
    /// Deletes the last movie, but not a clip of it. Not answered while recording.
    void discard(std::function<void(std::optional<Error>)> answered);
    /// Saves a finished movie to the user's library (the folder Lumacast in the Videos folder), its sound tracks mixed
    /// into one; where that can't be done, as it is. The movie is the daemon's own (a StopAnswer's) or a file that the
    /// user may read and remove. The file is removed, also after a failure: afterwards the copy in the library is all
    /// there is. Answered with none once it is in the library; FailedToSave when it is not (a file that the user may not
    /// touch, or that is being recorded, stays), or a connection error. Takes as long as encoding the movie anew, and
    /// goes on when the connection ends.
    void save(const URL& movie, std::function<void(std::optional<Error>)> answered);
    /// The application's state as the daemon has it; see RecordingState. It comes after the effect of all that was
    /// asked before.
    void state(std::function<void(StateAnswer)> answered);

    /// Chooses the extension of the application's next broadcast, which its start consumes; a newer one replaces it.
    /// How an extension is named, see BroadcastSetup::extension. Answered with an error, and nothing is chosen, when
    /// there is no such extension (InvalidBroadcastSession), or when they can't be looked up (kSystemErrorDomain, a
    /// number of errno). A configuration that can't be archived (more than 64 KiB) is left out without an error.
    void setUpBroadcast(const BroadcastSetup& setup, std::function<void(std::optional<Error>)> answered);
    /// The upload extensions that are installed.
    void broadcastExtensions(std::function<void(BroadcastExtensionsAnswer)> answered);
    /// The icons of the application and the extension that were set up last, by whomever.
    void broadcastImages(std::function<void(BroadcastImagesAnswer)> answered);

    // Without an answer; ignored where they don't apply.

    /// Pauses a running recording, but none of the whole display. What happens until the resume is not in the movie. A
    /// broadcast that is paused stays so until it is stopped: no resume reaches it.
    void pause();
    /// Goes on, recording `window`. With a window that is not the application's own a paused recording is stopped:
    /// `stopped` tells NoContextIDMatch and the movie. Does nothing to a broadcast.
    void resume(ContextID window);
    /// Turns the microphone of a running recording on or off: in its state alone, see StartOptions::microphone.
    void setMicrophoneEnabled(bool enabled);
    /// What the application wants to remember; it comes back with the state.
    void setMicrophoneEnabledPersistent(bool enabled);
    void setHasUserConsentForMicrophone(bool consent);
    void setHasUserConsentForCamera(bool consent);
    void setBroadcastURL(const std::optional<URL>& url);
    /// Whose sound a running recording takes.
    void setProcessForAudioCapture(ProcessID pid);
    /// The application came to the foreground. When it records again, and an earlier recording of it was interrupted
    /// and left a movie, `stopped` tells Interrupted and that movie. While it records nothing, nothing is told.
    void didBecomeActive();
    /// The application left the foreground. Only this starts the clock of the user's grant: more than eight minutes
    /// after the first time, the next connection or didBecomeActive ends the grant, and the user is asked anew. An
    /// application that never says so keeps it until the daemon ends.
    void didResignActive();
    /// Accepted by the daemon, and ignored.
    void reportCameraUsage(std::int32_t usage);

    // The questions once more, waiting for the answer, at most `limit` (then NoAnswer; the request is not taken back).
    // From a handler they answer WouldBlock at once.

    StartAnswer startAndWait(const StartOptions& options, std::chrono::milliseconds limit = kNoLimit);
    StopAnswer stopAndWait(std::chrono::milliseconds limit = kPatience);
    StopAnswer stopWithClipAndWait(double fromStart, double fromEnd, std::chrono::milliseconds limit = kPatience);
    std::optional<Error> discardAndWait(std::chrono::milliseconds limit = kPatience);
    std::optional<Error> saveAndWait(const URL& movie, std::chrono::milliseconds limit = kNoLimit);
    StateAnswer stateAndWait(std::chrono::milliseconds limit = kNoLimit);
    std::optional<Error> setUpBroadcastAndWait(const BroadcastSetup& setup, std::chrono::milliseconds limit = kPatience);
    BroadcastExtensionsAnswer broadcastExtensionsAndWait(std::chrono::milliseconds limit = kPatience);
    BroadcastImagesAnswer broadcastImagesAndWait(std::chrono::milliseconds limit = kPatience);

    /// "$XDG_RUNTIME_DIR/lumacast", or "/run/user/UID/lumacast" without that variable.
    static std::string defaultRuntimeDirectory();

private:
    const std::shared_ptr<Link> link_;
};

}  // namespace lumacast::client
