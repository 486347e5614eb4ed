#pragma once
// The daemon's one central object.

#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "base/Identifiers.h"
#include "base/MessageTables.h"
#include "daemon/AcknowledgementAlert.h"
#include "daemon/AlertQueue.h"
#include "platform/DisplayLayoutMonitor.h"
#include "platform/Platform.h"
#include "session/LCRecordingSession.h"

namespace lumacast {

/// What a start request asks for.
struct StartRequest {
    std::vector<ContextID> windowLayerContextIDs;
    Size windowSize;
    bool microphoneEnabled = false;
    bool cameraEnabled = false;
    bool broadcast = false;
    bool systemRecording = false;
    bool captureEnabled = false;
    std::shared_ptr<IpcEndpoint> listenerEndpoint;  ///< where the extension listens already; null where it does not
};

/// A start request that waits for the user's answer, or for its turn to ask. Request lane.
struct WaitingStart {
    std::shared_ptr<LCRecordingSession> session;
    std::shared_ptr<IpcConnection> connection;  ///< who asked
    StartRequest request;
    std::uint64_t number = 0;
    std::function<void(std::optional<Error>, bool microphoneRecording, bool cameraRecording)> handler;
    std::shared_ptr<AcknowledgementAlert> alert;
};

/// What an application has set up for its next broadcast.
struct BroadcastInfo {
    BundleIdentifier hostBundleIdentifier;  ///< "LCBroadcastInfoHostBundleIdentifierKey"
    std::optional<Dictionary> userInfo;     ///< "LCBroadcastInfoExtensionUserInfoKey"
    std::optional<LCBroadcastConfiguration> configuration;  ///< "LCBroadcastInfoExtensionConfigurationKey"
    std::int64_t processMode = 0;                           ///< "LCBroadcastInfoExtensionProcessModeKey"
    std::shared_ptr<AppExtension> extension;                ///< "LCBroadcastInfoExtensionKey"; never null
};

/// One movie on its way to the user's library. Request lane; what does not change is read elsewhere too.
struct MovieSave {
    enum class State { Mixing, Adding, Saved, Failed };

    std::uint64_t number = 0;
    std::optional<URL> movie;
    UserID user{};
    bool removesAsUser = false;  ///< the movie is not a temporary file
    std::uint64_t claim = 0;     ///< later ones of its path are other recordings'
    std::shared_ptr<void> claims;
    std::function<void(std::optional<Error>)> handler;

    State state = State::Mixing;
    std::shared_ptr<MovieExporter> exporter;  ///< while it is mixed
    std::optional<URL> savedAs;
    std::string problem;
};

/// Owns the sessions, one per client application, and everything that clients ask of them. Everything here runs on the
/// request lane (the main queue); what comes from other lanes hops there first, but for the answers of extension lookups, the
/// connecting of an extension on its session's start queue, and what an extension returns, which is sent on. One file per concern.
class LCRecordingManager final : public IpcListenerDelegate,
                                 public IpcExportedObject,
                                 public LCRecordingSessionDelegate,
                                 public DisplayLayoutObserver,
                                 public std::enable_shared_from_this<LCRecordingManager> {
public:
    using StartHandler = std::function<void(std::optional<Error>, bool microphoneRecording, bool cameraRecording)>;
    using StopHandler = std::function<void(std::optional<URL>, std::optional<Error>)>;
    using SaveHandler = std::function<void(std::optional<Error>)>;
    using Handler = std::function<void()>;
    /// Told of one system recording that was stopped: once for each.
    using SystemStopHandler =
        std::function<void(const std::shared_ptr<LCRecordingSession>&, std::optional<URL>, std::optional<Error>)>;

    /// Makes the session of an application.
    using SessionMaker =
        std::function<std::shared_ptr<LCRecordingSession>(const SessionServices&, const BundleIdentifier&)>;

    /// `init` — sets up the temporary directory and the listener, which is not resumed yet. An empty maker makes the
    /// real sessions.
    static std::shared_ptr<LCRecordingManager> init(const SessionServices& services, AlertQueue& alertQueue,
                                                    SessionMaker makeSession);
    /// `dealloc` — stops observing the display's layout.
    ~LCRecordingManager() override;

    /// `lumaAlertQueue` — the process's, see AlertQueue.
    SerialQueue& lumaAlertQueue() { return alertQueue_.get(); }

    /// `finishStartup` — from now on connections are accepted.
    void finishStartup();

    /// `listener:shouldAcceptNewConnection:`
    bool listenerShouldAcceptNewConnection(IpcListener& listener,
                                           const std::shared_ptr<IpcConnection>& connection) override;
    void receiveMessage(const std::shared_ptr<IpcConnection>& connection, std::uint16_t message, Array arguments,
                        IpcReply reply) override;

    /// `recordingSessionForBundleID:` — the registered session, or a new idle one, registered.
    std::shared_ptr<LCRecordingSession> recordingSessionForBundleID(const BundleIdentifier& bundleID);
    /// `removeSessionForBundleID:`
    void removeSessionForBundleID(const BundleIdentifier& bundleID);
    /// The registered session, or null; creates nothing.
    std::shared_ptr<LCRecordingSession> registeredSession(const BundleIdentifier& bundleID) const;

    // Exemptions from the question to the user.
    /// `exemptBundleIdentifiers` — deliberately the set of recordings with the microphone while one is wanted.
    const std::set<BundleIdentifier>& exemptBundleIdentifiers() const;
    bool isExemptFromAcknowledgementAlertSession(const LCRecordingSession& session) const;
    void updateExemptionListWithSession(const LCRecordingSession& session);
    void expireAcknowledgementExemptionsForBundleID(const std::optional<BundleIdentifier>& bundleID);

    /// `frontmostSession:applicationPID:` — the process whose sound belongs to a recording of this session: of a system
    /// recording the process in front, -1 when nothing is; else the client's own. The handler is called at once.
    void frontmostSession(const LCRecordingSession& session, const std::function<void(ProcessID)>& handler);

    /// `notifySystemRecordingMayBeStopped`, `notifySystemRecordingResumed` — to every system recording under way. Nothing
    /// sends them.
    void notifySystemRecordingMayBeStopped();
    void notifySystemRecordingResumed();

    /// `stopSystemRecordingWithHandler:` — stops every system recording, adds its movie to the library and calls the
    /// handler for each; never when there is none. Nothing uses it.
    void stopSystemRecordingWithHandler(SystemStopHandler handler);
    /// `stopSystemRecordingWithInterruption` — the same, and tells the clients. Nothing uses it.
    void stopSystemRecordingWithInterruption();

    /// Where the platform has a monitor of the display's layout: the manager observes it and lets go of it at its end.
    /// This platform has none. Before the service is resumed.
    void setLayoutMonitor(std::shared_ptr<DisplayLayoutMonitor> monitor);
    /// `layoutMonitor:didUpdateDisplayLayout:withContext:` — recordings of applications whose content was resized by the
    /// new layout are stopped. Request lane.
    void layoutMonitorDidUpdateDisplayLayout(DisplayLayoutMonitor* monitor,
                                             const std::vector<DisplayLayoutElement>& layout) override;

    /// `isMicrophoneRecording` and `isCameraRecording` — what the last start that got that far asked for; false once
    /// the user has acknowledged it.
    bool isMicrophoneRecording() const { return microphoneRecording_; }
    bool isCameraRecording() const { return cameraRecording_; }

    /// Sessions and their recordings, for the administrator.
    Dictionary snapshot() const;
    /// Serves the administrator's commands about the temporary movies, "storage" and "purge". Before the service is
    /// resumed.
    void serveStorageCommands();
    /// Serves the administrator's command "save", see saveVideoToCameraRoll; how far each is stands in the snapshot
    /// under "saves".
    void serveSaveCommand();

    /// `currentExtensionDisplayName` — of the extension that was set up last; none once a recording was stopped.
    const std::optional<std::string>& currentExtensionDisplayName() const { return currentExtensionDisplayName_; }

    // LCRecordingSessionDelegate; from any lane.
    void recordingSessionStoppedWithError(const std::shared_ptr<LCRecordingSession>& session,
                                          const std::optional<Error>& error) override;
    void broadcastExtensionFailed(const std::shared_ptr<LCRecordingSession>& session,
                                  const std::shared_ptr<LCBroadcastExtensionProxy>& link, const Error& error) override;
    void broadcastSessionDidUpdateServiceInfo(const std::shared_ptr<LCRecordingSession>& session,
                                              const Value& info) override;
    /// Deliberately does nothing.
    void broadcastSessionDidUpdateDuration(LCRecordingSession&, double) override {}

private:
    LCRecordingManager(const SessionServices& services, AlertQueue& alertQueue);

    // Connections.
    void applicationDisconnectedWithBundleID(const BundleIdentifier& bundleID);
    std::optional<BundleIdentifier> bundleIDOfProcess(ProcessID pid);
    std::optional<BundleIdentifier> getCallingConnectionBundleID();
    std::shared_ptr<LCRecordingSession> getCallingConnectionRecordingSession();

    // Alerts that this system does not show: they deliberately answer true at once.
    static bool showAlertForRecordingSession(const LCRecordingSession&, const std::optional<Error>&) { return true; }
    static bool showAlertForBroadcastSession(const LCRecordingSession&, const std::optional<Error>&) { return true; }
    static bool showResumeBroadcastAlertWithSession(const LCRecordingSession&, ContextID) { return true; }
    static bool showStopRecordingAlert() { return true; }

    // Requests.
    void startRecording(const StartRequest& request, StartHandler handler);
    void stopRecordingWithHandler(StopHandler handler);
    void stopRecordingWithStartClipDuration(double startClipDuration, double endClipDuration, StopHandler handler);
    /// `saveVideoToCameraRoll:handler:` — has the movie's sound mixed, adds it to this user's library and removes its
    /// files. The handler is called once, on the request lane, with an error when it is not in the library. Refused, and
    /// left alone, is a movie that is neither a temporary file nor one that the user may read and remove, and one that
    /// is still being recorded. Another user's own movie is not mixed.
    void saveVideoToCameraRoll(const std::optional<URL>& movie, UserID user, SaveHandler handler);
    /// Request lane: it reads the sessions.
    bool isBeingRecorded(const URL& movie) const;
    /// On a global queue.
    void addToLibrary(const std::shared_ptr<MovieSave>& save, const std::optional<URL>& mixed, bool mixingFailed);
    void endSave(const std::shared_ptr<MovieSave>& save, const std::optional<URL>& savedAs, const std::string& problem);
    Array describeSaves() const;
    void pauseRecording();
    void resumeRecordingWithWindowLayerContextID(ContextID contextID);
    void discardRecordingWithHandler(Handler handler);
    void setMicrophoneEnabled(bool enabled);
    void updateProcessIDForAudioCaptureWithPID(ProcessID pid);
    void clientDidBecomeActive();
    void clientDidResignActive();
    std::optional<Dictionary> synchronousGetCurrentState();

    // Broadcasts.
    /// `setupBroadcastWithHostBundleID:broadcastExtensionBundleID:broadcastConfigurationData:userInfo:handler:` — deliberately
    /// for whatever host the caller names. The handler is told an error, and nothing is kept, when there is no such
    /// extension.
    void setupBroadcastWithHostBundleID(const BundleIdentifier& host, const std::string& broadcastExtensionBundleID,
                                        const Data& broadcastConfigurationData,
                                        const std::optional<Dictionary>& userInfo, SaveHandler handler);
    using ExtensionHandler = std::function<void(const std::shared_ptr<AppExtension>&, std::int64_t processMode,
                                                const std::optional<Error>& error)>;
    /// `loadBroadcastUploadExtensionWithBaseIdentifier:withHandler:` — the first upload extension, else the first of the
    /// older point; null when there is none. The handler runs on a lane of the platform's.
    void loadBroadcastUploadExtensionWithBaseIdentifier(const BaseIdentifier& baseIdentifier, ExtensionHandler handler);
    /// `getSystemBroadcastExtensionInfo:` — the handler runs on a lane of the platform's.
    void getSystemBroadcastExtensionInfo(const std::function<void(Array, std::optional<Error>)>& handler);
    /// `getCurrentBroadcastImages:` — the host's and the extension's that were set up last, by whomever.
    void getCurrentBroadcastImages(
        const std::function<void(std::optional<Data>, std::optional<Data>)>& handler) const;
    void clearCurrentBroadcastImages();
    static std::optional<Data> firstIcon(const AppExtension& extension);
    static std::optional<std::string> displayNameOf(const AppExtension& extension);

    // Storage that runs short. Called on the purge service's lane; each touch of the sessions is a task on the request
    // lane that is waited for, deleting is done on that lane itself.
    void registerPurgeCallbacks();
    PurgeRecord cacheDeletePurgeableSpace();
    std::optional<PurgeRecord> cacheDeletePurge(std::int32_t urgency);
    PurgeRecord cacheDeletePeriodic();
    /// The movies being recorded now. Request lane.
    std::vector<std::string> pathsBeingRecorded() const;

    // Starting.
    bool checkContextIDsMatch(const std::vector<ContextID>& contextIDs);
    bool checkContextIDsMatch(const std::vector<ContextID>& contextIDs, const std::optional<BundleIdentifier>& caller);
    /// What a request may not record; none when it may. Asked again when the user has answered: a window's number may be
    /// another application's by then.
    using Refusal = std::pair<RecordingErrorCode, std::string_view>;
    std::optional<Refusal> whyNotAllowed(const WaitingStart& start, const std::optional<BundleIdentifier>& caller);
    using WaitingStartRef = std::shared_ptr<WaitingStart>;
    void startProper(const WaitingStartRef& start);
    /// `showAcknowledgementAlertForSession:` — goes on with the start once the user has acknowledged the recording, at
    /// once when the session is exempt.
    void showAcknowledgementAlertForSession(const WaitingStartRef& start);
    /// Asks the user about the start that has waited longest, unless somebody is being asked.
    void askNext();
    void takeAnswer(const WaitingStartRef& start, std::optional<UserAlert::Response> response);
    /// Whether the user's answer lets the recording go on; what it means for the microphone, the camera and later starts.
    bool acknowledge(const LCRecordingSession& session, std::optional<UserAlert::Response> response);
    void continueAcknowledged(const WaitingStartRef& start);
    /// Takes down the questions of starts whose client has gone, or has connected anew.
    void cancelOrphanedQuestions();
    /// Whether whoever asked for the start still is the session's client.
    bool isStillWanted(const WaitingStart& start) const;
    void beginRecording(const WaitingStartRef& start);
    /// Waits for the extension on the session's start queue, then goes on with broadcastEnabled.
    void enableBroadcast(const WaitingStartRef& start, std::uint64_t generation, const BroadcastInfo& info);
    /// Ends an extension that is not wanted any more; null is none. Any lane.
    static void endLink(LCRecordingSession& session, const std::shared_ptr<LCBroadcastExtensionProxy>& link);
    /// Whether no newer start of the session has begun. Any lane.
    static bool isNewest(const WaitingStart& start, std::uint64_t generation);
    void broadcastEnabled(const WaitingStartRef& start, std::uint64_t generation,
                          const LCRecordingSession::BroadcastLink& link, bool microphone, bool camera);
    void startEnabledRecording(const WaitingStartRef& start, std::uint64_t generation,
                               const std::shared_ptr<LCBroadcastExtensionProxy>& link = nullptr);
    /// The starts of which this is true, and that their extension has not taken note of, are answered with the error.
    static void answerPendingStarts(LCRecordingSession& session, const Error& error,
                                    const std::function<bool(const LCRecordingSession::ManagerRecord::PendingStart&)>& which);
    void monitorForegroundApps(const std::shared_ptr<LCRecordingSession>& session);
    /// `checkAndPlaySystemRecordSound:isRecordingOn:`
    void checkAndPlaySystemRecordSound(const LCRecordingSession& session, bool isRecordingOn);
    void logRefusal(std::uint64_t number, RecordingErrorCode code, std::string_view reason);
    void refuse(const WaitingStart& start, RecordingErrorCode code, std::string_view reason);
    /// `stopCurrentRecordingSessionWithHandler:` — makes room for this start.
    void stopCurrentRecordingSessionWithHandler(const WaitingStart& by, Handler handler);
    void interruptOtherRecordingSessionAgainstSession(const std::shared_ptr<LCRecordingSession>& session);
    bool isApplicationInForegroundWithBundleIdentifier(const BundleIdentifier& bundleID);

    // Stopping.
    void stopRecordingSession(const std::shared_ptr<LCRecordingSession>& session, double startClipDuration,
                              double endClipDuration, StopHandler handler);
    /// `resetStatesForSession:` — ends what the start with this generation began; a newer start's flags are left alone.
    void resetStatesForSession(const std::shared_ptr<LCRecordingSession>& session, std::uint64_t generation);
    void resetAfterStop(const std::shared_ptr<LCRecordingSession>& session, std::uint64_t generation);
    /// Notes that a stop may still be answered, until the last copy of what is returned has gone.
    std::shared_ptr<void> noteStopUnderWay(const std::shared_ptr<LCRecordingSession>& session,
                                           std::uint64_t generation);
    /// Resets after stops that never will be answered: a failed trim, say.
    void resetUnansweredStops(const std::shared_ptr<LCRecordingSession>& session);
    /// Whose a recording's movie is on its path, also when later ones of that path have come and gone.
    struct PathClaim {
        std::uint64_t number = 0;
        std::shared_ptr<void> remembered;
    };
    /// A recording that another one takes the place of.
    struct EndedRecording {
        std::uint64_t generation = 0;
        PathClaim claim;
        bool isTold = true;  ///< its client is
        std::optional<ProcessID> client;  ///< when it ended; none for one without a connection
    };
    PathClaim claimOf(const LCRecordingSession& session) const;
    void clearSystemRecordingUI(const LCRecordingSession& session);
    /// Adds a system recording's movie to the library of the user whose client it was, waiting on a global queue; then
    /// calls `added` with the error, also when there is no movie or a later recording than the claim's has its path.
    /// `added` runs on the request lane.
    void addSystemRecordingToLibrary(const LCRecordingSession& session, const std::optional<URL>& movieURL,
                                     const PathClaim& claim, std::function<void(std::optional<Error>)> added);
    void keepPreemptedSystemRecording(const std::shared_ptr<LCRecordingSession>& session, const EndedRecording& ended,
                                      const std::optional<URL>& movieURL);
    void discardInterruptedRecording(const std::shared_ptr<LCRecordingSession>& session, const EndedRecording& ended,
                                     const std::optional<URL>& movieURL);
    void recordingSessionStoppedWithError(const std::shared_ptr<LCRecordingSession>& session,
                                          const std::optional<Error>& error, const std::optional<URL>& movieURL);
    void recordingSessionInterrupted(const std::shared_ptr<LCRecordingSession>& session,
                                     const std::optional<Error>& error, const std::optional<URL>& movieURL);

    void beginTransaction() { platform_.keepAlive.beginTransaction(); }
    void endTransaction() { platform_.keepAlive.endTransaction(); }
    /// Runs `task` on the request lane: at once when already there.
    void onRequestLane(Task task);

    const SessionServices services_;
    const Platform platform_;
    Log& log_;
    AlertQueue& alertQueue_;

    SessionMaker makeSession_;
    std::shared_ptr<IpcListener> publicListener_;
    std::set<BundleIdentifier> exemptBundleIdentifiers_, exemptWithMicRecordingEnabledBundleIdentifiers_;
    std::map<BundleIdentifier, Date> lastBackgroundDateByBundleIdentifier_;
    std::vector<std::pair<BundleIdentifier, std::shared_ptr<LCRecordingSession>>> bundleIDToRecordingSessionLookup_;
    std::map<BundleIdentifier, BroadcastInfo> hostBundleIDtoExtensionInfoLookup_;
    std::optional<Data> currentHostAppImage_, currentExtensionAppImage_;  ///< PNG files
    std::optional<std::string> currentExtensionDisplayName_;
    bool didAcceptResume_ = false;
    bool microphoneRecording_ = false, cameraRecording_ = false;

    /// The connection whose message is being handled; only then.
    std::shared_ptr<IpcConnection> callingConnection_;
    std::uint64_t requestNumber_ = 0;

    std::deque<WaitingStartRef> waitingStarts_;  ///< the first one is being asked about
    bool isAsking_ = false;

    std::weak_ptr<LCRecordingSession> monitoredSession_;  ///< whose start set the AppStateMonitor's handler last
    std::shared_ptr<DisplayLayoutMonitor> layoutMonitor_;  ///< none on this system
    std::int32_t previousElementCount_ = 0;

    std::vector<std::shared_ptr<MovieSave>> saves_;  ///< those under way and the last that have ended, oldest first
    std::uint64_t lastSave_ = 0;
};

}  // namespace lumacast
