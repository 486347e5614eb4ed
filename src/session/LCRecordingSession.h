#pragma once
// One client's recording, from start to end.

#include <algorithm>
#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/Guarded.h"
#include "base/Identifiers.h"
#include "broadcast/LCBroadcastConfiguration.h"
#include "broadcast/LCBroadcastExtensionProxy.h"
#include "capture/LCCaptureManager.h"
#include "platform/AppExtension.h"
#include "platform/Platform.h"
#include "session/LCClientProtocol.h"
#include "session/LCRecordingSessionDelegate.h"
#include "support/LCReportingAgent.h"
#include "support/Localization.h"
#include "support/RecordingErrors.h"
#include "support/TempStore.h"
#include "writer/LCMovieWriter.h"

namespace lumacast {

/// What every session of a process uses. Borrowed; outlives the sessions' work.
struct SessionServices {
    const Platform& platform;
    TempStore& tempStore;
    Localization& localization;
    RecordingErrors& errors;
    LCCaptureManager& captureManager;
    /// Where the continuation of a start runs; null lets it run where it stands.
    SerialQueue* requestLane = nullptr;
    /// Who is asked whether there is a microphone; null asks the capture manager.
    const CaptureDevices* captureDevices = nullptr;
};

/// How a session's samples leave it.
enum class BroadcastProcessMode : std::int64_t { MovieClips = 0, SampleBuffers = 1 };

/// What a sample is that leaves the session as such.
enum class SampleType : std::int64_t { Video = 1, AppAudio = 2, Microphone = 3 };

/// What a broadcast extension is told about the recording.
enum class ExtensionAction : std::int64_t { Start = 1, Pause = 2, Resume = 3, Finish = 4 };

/// One recording session per client application, kept by the manager under its bundle identifier. Held by shared_ptr:
/// its own work keeps it alive after the registry has let it go.
///
/// Lanes: the manager's requests on the request lane; frames on the capture source's frame lane; source failures on the
/// request lane. Flags are atomics; times and objects that cross lanes sit behind leaf locks.
class LCRecordingSession : public DisplayCaptureDelegate, public std::enable_shared_from_this<LCRecordingSession> {
public:
    using Handler = std::function<void()>;
    using FinishHandler = std::function<void(std::optional<URL> movieURL, std::optional<Error> error)>;

    /// `initWithBundleID:`
    LCRecordingSession(const SessionServices& services, BundleIdentifier bundleID);

    // Properties.
    const BundleIdentifier& bundleID() const { return bundleID_; }
    std::shared_ptr<LCClientProtocol> clientProxy() const { return clientProxy_.get(); }
    void setClientProxy(std::shared_ptr<LCClientProtocol> proxy) { clientProxy_.set(std::move(proxy)); }
    void setDelegate(std::weak_ptr<LCRecordingSessionDelegate> delegate) { delegate_.set(std::move(delegate)); }
    bool isRecording() const { return recordingState_ & 1; }
    /// Request lane.
    void setRecording(bool recording) {
        recordingState_ = (((recordingState_ >> 1) + 1) << 1) | static_cast<std::uint64_t>(recording);
    }
    /// The media services were reset: it never delivers another frame.
    bool isDead() const { return shouldStop_; }
    bool isPaused() const { return paused_; }
    void setPaused(bool paused) { paused_ = paused; }
    bool isSystemRecording() const { return systemRecording_; }
    void setSystemRecording(bool systemRecording) { systemRecording_ = systemRecording; }
    bool isBroadcasting() const { return isBroadcasting_; }
    void setIsBroadcasting(bool broadcasting) { isBroadcasting_ = broadcasting; }
    bool isCapturing() const { return captureRecording_; }
    void setCaptureRecording(bool capturing) { captureRecording_ = capturing; }
    bool microphoneEnabled() const { return microphoneEnabled_; }
    /// `setMicrophoneEnabled:` — of a system recording that runs without the microphone it also starts capturing it.
    /// Request lane.
    void setMicrophoneEnabled(bool enabled);
    /// `haveMicTap` — whether the microphone's capture has begun for this session.
    bool haveMicTap() const { return haveMicTap_; }
    /// The first application in front of this broadcast; forgotten when the next one is enabled.
    std::optional<BundleIdentifier> bundleIDOfFirstForegroundApp() const { return bundleIDOfFirstForegroundApp_.get(); }
    /// The process whose sound is captured; below 1 none is.
    ProcessID frontmostPIDForAudioTap() const { return frontmostPIDForAudioTap_; }
    void setFrontmostPIDForAudioTap(ProcessID pid) { frontmostPIDForAudioTap_ = pid; }
    bool microphoneEnabledPersistent() const { return microphoneEnabledPersistent_; }
    void setMicrophoneEnabledPersistent(bool enabled) { microphoneEnabledPersistent_ = enabled; }
    bool hasUserConsentForCamera() const { return hasUserConsentForCamera_; }
    void setHasUserConsentForCamera(bool consent) { hasUserConsentForCamera_ = consent; }
    bool hasUserConsentForMicrophone() const { return hasUserConsentForMicrophone_; }
    void setHasUserConsentForMicrophone(bool consent) { hasUserConsentForMicrophone_ = consent; }
    std::optional<URL> broadcastURL() const { return broadcastURL_; }
    /// The upload extension of the broadcast; null when there is none.
    std::shared_ptr<AppExtension> broadcastExtension() const { return broadcastExtension_.get(); }
    void setBroadcastExtension(std::shared_ptr<AppExtension> extension) {
        broadcastExtension_.set(std::move(extension));
    }
    /// Of the extension, so none without one.
    std::optional<BundleIdentifier> broadcastExtensionID() const;
    std::shared_ptr<LCBroadcastExtensionProxy> broadcastUploadExtensionProxy() const {
        return broadcastUploadExtensionProxy_.get();
    }
    void setBroadcastUploadExtensionProxy(std::shared_ptr<LCBroadcastExtensionProxy> proxy) {
        broadcastUploadExtensionProxy_.set(std::move(proxy));
    }
    /// Deliberately there; nothing uses them.
    const std::shared_ptr<SerialQueue>& broadcastServiceInfoQueue() const { return broadcastServiceInfoQueue_; }
    const std::shared_ptr<SerialQueue>& broadcastAggregatePayloadQueue() const {
        return broadcastAggregatePayloadQueue_;
    }
    const Array& pendingBroadcastExtensionPayloads() const { return pendingBroadcastExtensionPayloads_; }
    /// What the application wants the extension to know.
    std::optional<Dictionary> broadcastUserInfo() const { return broadcastUserInfo_.get(); }
    void setBroadcastUserInfo(std::optional<Dictionary> info) { broadcastUserInfo_.set(std::move(info)); }
    /// Where the clip being written begins; the invalid time until its first sound.
    MediaTime broadcastFragmentStartTime() const { return broadcastFragmentStartTime_.get(); }
    /// The number of the clip being written.
    std::int64_t broadcastFragmentIndex() const { return broadcastFragmentIndex_; }
    void setBroadcastFragmentIndex(std::int64_t index) { broadcastFragmentIndex_ = index; }
    std::optional<LCBroadcastConfiguration> broadcastConfiguration() const { return broadcastConfiguration_.get(); }
    void setBroadcastConfiguration(std::optional<LCBroadcastConfiguration> configuration) {
        broadcastConfiguration_.set(std::move(configuration));
    }
    std::int64_t broadcastProcessMode() const { return broadcastProcessMode_; }
    void setBroadcastProcessMode(std::int64_t mode) { broadcastProcessMode_ = mode; }
    void setBroadcastURL(std::optional<URL> url) { broadcastURL_ = std::move(url); }
    std::optional<URL> interruptedMovieURL() const { return interruptedMovieURL_; }
    void setInterruptedMovieURL(std::optional<URL> url) { interruptedMovieURL_ = std::move(url); }
    void setContextIDs(std::vector<ContextID> contextIDs) { contextIDs_ = std::move(contextIDs); }
    const std::vector<ContextID>& contextIDs() const { return contextIDs_; }
    /// `setWindowSize:` — keeps the size as given and stores it capped as the capture size.
    void setWindowSize(Size size);
    Size windowSize() const { return windowSize_.get(); }
    Size originalWindowSize() const { return originalWindowSize_; }
    std::shared_ptr<LCMovieWriter> movieWriter() const { return movieWriter_.get(); }
    void setMovieWriter(std::shared_ptr<LCMovieWriter> writer) { movieWriter_.set(std::move(writer)); }
    std::shared_ptr<DisplayCaptureSource> screenCaptureController() const { return screenCaptureController_.get(); }
    std::shared_ptr<LCReportingAgent> reportingAgent() const { return reportingAgent_.get(); }
    std::optional<Date> captureStartTime() const { return captureStartTime_.get(); }
    /// The claim of this session's last writer on its path, see TempStore::claimPath. Request lane.
    std::uint64_t pathClaim() const { return pathClaim_; }
    /// How often startSessionWithHandler was called: tells reports of an older start from the current one's. Any lane.
    std::uint64_t startCount() const { return starts_; }
    /// Seconds of active capture of the current recording so far: the finished stretches and the running one.
    double activeDuration() const;

    // File naming: recomputed at each call, deliberately, so that a system recording's path names the second of the
    // call.
    std::string outputPath() const;
    std::string trimmedOutputPath() const;
    URL outputURL() const { return URL::file(outputPath()); }
    /// Deliberately without effect on what outputURL answers.
    void setOutputURL(const URL&) {}
    URL trimmedOutputURL() const { return URL::file(trimmedOutputPath()); }

    // Lifecycle.
    /// `startSessionWithHandler:` — makes the writer and begins to capture; the handler is always called, whatever came
    /// of it.
    void startSessionWithHandler(Handler handler);
    /// `pauseSession` — only when not paused.
    void pauseSession();
    /// `resumeSessionWithContextID:` — only when paused.
    void resumeSessionWithContextID(ContextID contextID);
    void stopAllCapture();
    /// `stopRecordingWithNotification:error:` — only while recording. Callable from the frame lane.
    void stopRecordingWithNotification(bool notification, const std::optional<Error>& error);
    /// `finishSessionWithHandler:` — the whole movie.
    void finishSessionWithHandler(FinishHandler handler) {
        finishSessionWithStartClipDuration(0, 0, std::move(handler));
    }
    /// `finishSessionWithStartClipDuration:endClipDuration:handler:` — only while recording; otherwise the handler is
    /// deliberately never called, nor when trimming fails. Seconds; both above 0 give a clip.
    virtual void finishSessionWithStartClipDuration(double startClipDuration, double endClipDuration,
                                                    FinishHandler handler);
    /// `finishAndCleanupSessionFilesWithHandler:` — stops and removes the movie, unless a later writer has its path.
    /// The handler is called on the store's background queue.
    void finishAndCleanupSessionFilesWithHandler(Handler handler);
    /// `getRecordedFileSize` — bytes; 0 for anything but a plain recording.
    std::uint64_t getRecordedFileSize();
    void notifyRecordingMayBeStopped();
    void notifyRecordingResumed();
    /// `enableBroadcastWithExtension:processMode:userInfo:listenerEndpoint:` — in sample-buffer mode it waits, without a
    /// limit, until the extension is there: on the session's start queue only. Answers 0, whatever came of it.
    std::int64_t enableBroadcastWithExtension(std::shared_ptr<AppExtension> extension, std::int64_t mode,
                                              std::optional<Dictionary> userInfo,
                                              const std::shared_ptr<IpcEndpoint>& listenerEndpoint);
    /// What came of connecting to an extension.
    struct BroadcastLink {
        std::shared_ptr<LCBroadcastExtensionProxy> proxy;  ///< null in movie-clip mode
        /// The extension's, that ended the wait or came since. Null when nothing was connected.
        std::shared_ptr<const Guarded<std::optional<Error>>> error;
        std::optional<Error> failure() const { return error ? error->get() : std::nullopt; }
    };
    struct ExtensionWait;
    using ExtensionWaitRef = std::shared_ptr<ExtensionWait>;
    /// Its two halves: what the session is from now on, on the request lane, and the connection, which may wait, on the
    /// start queue. The wait is there from the first half on, so that it can be ended before it has begun; then the
    /// second one connects nothing.
    ExtensionWaitRef prepareBroadcast(std::shared_ptr<AppExtension> extension, std::int64_t mode,
                                      std::optional<Dictionary> userInfo);
    BroadcastLink connectBroadcast(const ExtensionWaitRef& wait, std::shared_ptr<AppExtension> extension,
                                   std::int64_t mode, const std::shared_ptr<IpcEndpoint>& listenerEndpoint);
    /// Ends the wait of the last enabling, if it is still to come or under way. Any lane.
    void endWaitForExtension();
    /// Where broadcasts are enabled.
    SerialQueue& startQueue() { return *startQueue_; }
    /// `disableBroadcast` — the link to the extension is left as it is.
    void disableBroadcast();
    /// `_notifyExtensionOfAction:completion:` — the completion is called at once unless samples go to an extension that
    /// can be told; then when it has taken note, and never when it can't be reached.
    void _notifyExtensionOfAction(ExtensionAction action, Handler completion);

    /// `_notifyBroadcastExtensionOfCompletedMovieWithURL:finished:` — hands the extension a clip, which is removed when it
    /// has completed the request.
    void _notifyBroadcastExtensionOfCompletedMovieWithURL(const URL& clip, bool finished);

    // Usage reporting.
    std::string _serviceNameForReporting() const;
    /// `reportSummaryEvent:` — sends the summary of the recording that `agent` has counted, and lets the agent go.
    void reportSummaryEvent(const std::shared_ptr<LCReportingAgent>& agent, std::int64_t endReason);
    /// `sessionReportCameraUsage:` — 1 back, 2 front.
    void sessionReportCameraUsage(std::int32_t cameraPosition);

    // The frame pipeline.
    void screenCaptureControllerDidReceiveSampleBuffer(DisplayCaptureSource& source, const SampleRef& sample,
                                                       std::uint32_t transformFlags) override;
    void screenCaptureControllerDidFailWithStatus(DisplayCaptureSource& source, std::int32_t status) override;
    void screenCaptureControllerWasPreempted(DisplayCaptureSource& source) override;
    void screenCaptureControllerMediaServicesWereReset(DisplayCaptureSource& source) override;

    /// `setupMicTap` — starts capturing the microphone for this session.
    void setupMicTap();
    /// `updateProcessIDForAudioCaptureWithPID:` — the sound captured is that process's from now on. Deliberately nothing
    /// changes for a number below 1 but that it is kept. Request lane.
    void updateProcessIDForAudioCaptureWithPID(ProcessID pid);
    /// `checkAndStopAppAudioForPID:` — no sound any more if it is that process's. Request lane.
    void checkAndStopAppAudioForPID(ProcessID pid);
    /// `updateBundleIdForFirstForegroundApp` — remembers and announces the first application of a broadcast.
    void updateBundleIdForFirstForegroundApp();

    /// `_maximumSizeWithSize:` — the capture-size cap.
    Size _maximumSizeWithSize(Size size);
    /// Whether a picture can have what the cap leaves of this size: a very long and narrow one loses its short side. A
    /// session's capture source keeps its first size for good, so another must not get there.
    bool canCaptureSize(Size size);

    /// The manager's bookkeeping of this session, touched on the request lane only.
    struct ManagerRecord {
        std::uint64_t startGeneration = 0;  ///< counts this session's starts; completions of older ones leave it alone
        std::vector<std::uint64_t> openTransactions;  ///< the starts whose keep-alive transaction is open
        std::vector<std::uint64_t> stopsUnderWay;     ///< the starts whose stop may still be answered
        /// The accepted connection, kept while it is lost too: the proxy's messages then still end in their errors.
        std::shared_ptr<IpcConnection> connection;
        std::weak_ptr<IpcConnection> startConnection;  ///< who began the last recording
        std::optional<UserID> user;                    ///< whose client began the last recording
        /// The start whose broadcast may be enabled: the newest. Read on the start queue too.
        std::atomic<std::uint64_t> broadcastGeneration{0};
        std::vector<std::uint64_t> startsWaiting;  ///< the starts that wait for their extension
        /// A start of a broadcast whose extension has not taken note of it yet; its answer is empty when it was given.
        struct PendingStart {
            std::uint64_t generation = 0;
            std::weak_ptr<LCBroadcastExtensionProxy> link;
            std::shared_ptr<std::function<void(std::optional<Error>, bool, bool)>> answer;
            bool reachesNobody = false;  ///< the extension had not connected when it was to be told of the start
        };
        std::vector<PendingStart> pendingStarts;
        DisplayCaptureSource::Counters countersBefore;  ///< the capture source's when the last recording began

        bool hasTransactionOf(std::uint64_t generation) const {
            return std::find(openTransactions.begin(), openTransactions.end(), generation) != openTransactions.end();
        }
    };
    ManagerRecord managerRecord;

    /// `isNativeScreenOrientationPortrait` — deliberately fixed; kept so that the rule that asks for it stays general.
    static bool isNativeScreenOrientationPortrait() { return true; }

protected:
    // What leaves the session as it is. Frame lane and audio queues.
    /// `_notifyExtensionOfVideoSampleBuffer:withType:sampleOrientation:`
    virtual void _notifyExtensionOfVideoSampleBuffer(const SampleRef& sample, SampleType type,
                                                     std::uint32_t orientation);
    /// `_notifyExtensionOfAudioSampleBuffer:withType:`
    virtual void _notifyExtensionOfAudioSampleBuffer(const SampleRef& sample, SampleType type);
    /// `packageVideoSampleBufferForCapture:`
    virtual void packageVideoSampleBufferForCapture(const SampleRef& sample);
    /// `packageAudioSampleBufferForCapture:withType:`
    virtual void packageAudioSampleBufferForCapture(const SampleRef& sample, SampleType type);
    /// `_processAudioSampleBufferForMP4ClipHandler:` — appends the sound, and cuts the clip that has got too long.
    virtual void _processAudioSampleBufferForMP4ClipHandler(const SampleRef& sample);
    /// `_notifyExtensionOfFrontmostProcessBundleID:`
    virtual void _notifyExtensionOfFrontmostProcessBundleID(const BundleIdentifier& identifier);

private:
    void continueStart(std::uint64_t start, std::uint64_t stops, const Handler& handler);
    void _resumeOrStartSession();
    void forgetTimes();
    /// `startWritingHandler:` or the extension's start, then the continuation on the request lane.
    void startWriter(Size size, Handler continuation);
    BroadcastLink connectToExtension(const ExtensionWaitRef& wait, std::shared_ptr<AppExtension> extension);
    BroadcastLink connectToListeningExtension(const ExtensionWaitRef& wait,
                                              const std::shared_ptr<IpcEndpoint>& listenerEndpoint);
    void installHandlers(LCBroadcastExtensionProxy& proxy, const ExtensionWaitRef& wait);
    void extensionFailed(const std::shared_ptr<LCBroadcastExtensionProxy>& proxy, const Error& error);
    /// The link to send over; null, and a line, when there is none.
    std::shared_ptr<LCBroadcastExtensionProxy> readyExtensionProxy();
    void cutClip(MediaTime time);
    void takeReturnedItems(const std::vector<ExtensionItem>& items);
    void takeReturnedItem(const std::string& title, const Value& item);
    int captureRate() const;
    std::uint64_t getRecordedFileSize(const LCReportingAgent& agent);
    void finishMovie(double startClipDuration, double endClipDuration, FinishHandler handler);

    bool hasAudioCaptureDevice() const;
    void setupMicTapIfWanted();
    /// Starts the tap, which starts the capture source when it runs; the source at once when there is nobody to tap.
    void startAppAudioThenCapture();
    /// Of a movie nobody hears the sound as it comes; of clips, broadcasts and the frames of a client somebody may.
    LCCaptureManager::SoundUse useOfAppAudio() const;
    /// Starts the source, once since the last startAppAudioThenCapture. Request lane and audio capture queue.
    void beginCapture();
    void beginCaptureWithoutTap();
    void takeMicrophoneSample(const SampleRef& sample);
    void takeAppAudioSample(const SampleRef& sample);
    void takeResumedAppAudioSample(ProcessID pid, const SampleRef& sample);
    void appendAudio(const SampleRef& sample, SampleType type);
    void countAppAudio();
    void updateDuartionWithSample(const SampleRef& sample);
    void _processSampleBuffer(const SampleRef& sample, std::uint32_t transformFlags);
    void _processSampleBufferForStreaming(const SampleRef& sample, std::uint32_t transformFlags);
    void _updateSampleBufferWithOffset(const SampleRef& sample, const std::function<void(const SampleRef&)>& handler);
    SampleRef _copySampleBufferFromSourceBuffer(const SampleRef& sample, MediaTime updatedTimeStamp);
    void deliver(const SampleRef& sample, std::uint32_t transformFlags, MediaTime originalTime);
    bool hasFullResolution() const;
    Size cappedSize(Size size);
    std::int64_t chipId();

    const SessionServices services_;
    Log& log_;
    const BundleIdentifier bundleID_;
    const std::shared_ptr<SerialQueue> broadcastServiceInfoQueue_;
    const std::shared_ptr<SerialQueue> broadcastAggregatePayloadQueue_;  ///< never made
    const Array pendingBroadcastExtensionPayloads_;                      ///< stays empty
    const std::shared_ptr<SerialQueue> resetQueue_;
    const std::shared_ptr<SerialQueue> startQueue_;

    Guarded<std::shared_ptr<LCClientProtocol>> clientProxy_;
    Guarded<std::weak_ptr<LCRecordingSessionDelegate>> delegate_;
    /// The lowest bit: whether it records; above it: how often that was set, so that a stop on the frame lane ends the
    /// recording it found and not one that was begun meanwhile.
    std::atomic<std::uint64_t> recordingState_{0};
    std::atomic<bool> paused_{false}, systemRecording_{false}, isBroadcasting_{false}, captureRecording_{false},
        microphoneEnabled_{false}, microphoneEnabledPersistent_{false}, hasUserConsentForCamera_{false},
        hasUserConsentForMicrophone_{false}, sessionWasResumed_{false}, haveMicTap_{false},
        captureHasBegun_{false};
    std::atomic<ProcessID> frontmostPIDForAudioTap_{ProcessID{0}};
    Guarded<std::optional<BundleIdentifier>> bundleIDOfFirstForegroundApp_;
    std::optional<URL> broadcastURL_, interruptedMovieURL_;
    std::vector<ContextID> contextIDs_;
    Guarded<Size> windowSize_;
    Size originalWindowSize_;
    Guarded<std::shared_ptr<LCMovieWriter>> movieWriter_;
    Guarded<std::shared_ptr<DisplayCaptureSource>> screenCaptureController_;
    Guarded<std::shared_ptr<LCReportingAgent>> reportingAgent_;
    Guarded<std::optional<Date>> captureStartTime_;
    Guarded<MediaTime> firstSampleTimestamp_{kZeroMediaTime}, lastSampleTimestamp_{kInvalidMediaTime},
        sampleTimeOffset_{kZeroMediaTime};
    bool finishForgetsTimes_ = false;  ///< since a finish, until the next start; the request lane's
    std::atomic<std::int64_t> broadcastProcessMode_{0};
    Guarded<std::optional<LCBroadcastConfiguration>> broadcastConfiguration_;
    Guarded<std::shared_ptr<AppExtension>> broadcastExtension_;
    Guarded<std::shared_ptr<LCBroadcastExtensionProxy>> broadcastUploadExtensionProxy_;
    Guarded<std::optional<Dictionary>> broadcastUserInfo_;
    Guarded<MediaTime> broadcastFragmentStartTime_{kInvalidMediaTime};
    std::atomic<std::int64_t> broadcastFragmentIndex_{0};
    /// Changes under movieWriter_'s lock: the movie's end is asked for, and no clip is cut any more.
    bool movieIsFinishing_ = false;
    Guarded<ExtensionWaitRef> extensionWait_;  ///< to come or under way
    std::int64_t chipId_ = 0;

    /// None at first: an application that comes back can discard what it left, but not what a writer still has.
    std::uint64_t pathClaim_ = 0;
    std::atomic<std::uint64_t> starts_{0};    ///< counts startSessionWithHandler
    std::atomic<std::uint64_t> stops_{0};     ///< counts stops of a running recording
    std::atomic<bool> stopIsRunning_{false};  ///< the frame lane and the request lane may both stop; one does
    bool startIsPending_ = false;             ///< the continuation of the last start has not run yet

    /// Deliberately left held on the paused path of the frame pipeline; see _processSampleBuffer.
    const std::unique_ptr<OwnerlessLock> shouldStopLock_;
    std::atomic<bool> shouldStop_{false};
};

}  // namespace lumacast
