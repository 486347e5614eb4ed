#pragma once
// The capture of sound: of the recorded application, and of the microphone.

#include <array>
#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <vector>

#include "base/Date.h"
#include "base/Guarded.h"
#include "base/Identifiers.h"
#include "capture/SharedSampleHandler.h"
#include "platform/AudioInputQueue.h"
#include "platform/DeviceCapture.h"
#include "platform/Platform.h"
#include "writer/media/MediaTime.h"
#include "writer/media/SampleBuffer.h"
#include "writer/media/SampleMaker.h"

namespace lumacast {

/// What there is to capture with.
class CaptureDevices {
public:
    virtual ~CaptureDevices() = default;
    /// `+hasAudioCaptureDevice` — whether the microphone can be offered.
    virtual bool hasAudioCaptureDevice() const = 0;
};

/// One tap. The manager owns the current one; work that is under way, and the queue's callback, share it, so that a tap
/// is known by its identity alone. Belongs to the audio capture queue, but for `buffersInRotation`.
struct AudioRecorderState {
    static constexpr std::size_t kBuffers = 10;

    std::shared_ptr<AudioInputQueue> queue;
    AudioFormat format;  ///< what the queue really delivers
    std::array<AudioQueueBufferRef, kBuffers> buffers;
    const void* audioFile = nullptr;  ///< deliberately never set: the tap writes no audio file
    std::uint32_t bufferByteSize = 0;
    std::int64_t currentPacket = 0;  ///< packets received so far
    bool isRunning = false;

    /// Buffers that the queue has, or will get back. At none a tap that has been replaced is over.
    std::atomic<int> buffersInRotation{0};
};

/// The process's one owner of device capture (the `sharedManager` of the process), held by shared_ptr.
///
/// Lanes: starting, stopping and every buffer of the application's sound run on the audio capture queue, starting and
/// stopping the microphone too; stops wait for it, and are legal on it. Microphone samples come on
/// sessionSampleBufferQueue, interruptions and the microphone's start on lanes of the platform, where its did-start
/// handler is called. The other handlers are called on the audio capture queue, the microphone's and camera's sample
/// handlers on sessionSampleBufferQueue. What crosses lanes is atomic or behind a
/// leaf lock. Nothing here waits for the sound server.
class LCCaptureManager : public CaptureDevices,
                         public CaptureOutputDelegate,
                         public CaptureSessionObserver,
                         public std::enable_shared_from_this<LCCaptureManager> {
public:
    using SampleHandler = SharedSampleHandler::Handler;
    using Handler = std::function<void()>;

    /// `init`, and what `sharedManager` adds: watches the shared audio session, and makes it one that plays, records and
    /// mixes.
    static std::shared_ptr<LCCaptureManager> init(const Platform& platform);
    /// Ends its taps: a tap's queue and its record keep each other.
    ~LCCaptureManager() override;

    /// `+audioDispatchQueue` — the audio capture queue.
    const std::shared_ptr<SerialQueue>& audioDispatchQueue() const { return audioDispatchQueue_; }
    const std::shared_ptr<SerialQueue>& sessionSampleBufferQueue() const { return sessionSampleBufferQueue_; }

    // The application's sound.
    /// Who takes it: somebody who hears it as it comes, or a movie, to which silence may come late.
    enum class SoundUse { Live, Movie };
    /// `startAppAudioCaptureForProcessID:outputHandler:didStartHandler:` — returns at once. A tap there is already is
    /// deliberately replaced without being stopped. `didStartHandler` may be empty.
    void startAppAudioCaptureForProcessID(ProcessID pid, SampleHandler outputHandler, Handler didStartHandler,
                                          SoundUse use = SoundUse::Live);
    /// `resumeAppAudioCaptureForProcessID:outputHandler:` — the same, and the next buffer is preceded by silence for the
    /// time since the last one.
    void resumeAppAudioCaptureForProcessID(ProcessID pid, SampleHandler outputHandler,
                                           SoundUse use = SoundUse::Live);
    /// `stopAppAudioCapture` — no buffer of the tap is delivered after its return.
    void stopAppAudioCapture();

    // The microphone and the camera.
    /// Deliberately never: this system has no microphone to offer. All that captures one is here nevertheless.
    bool hasAudioCaptureDevice() const override { return false; }
    void startCaptureSession();
    void stopCaptureSession();
    /// `startMicrophoneCaptureWithOutput:didStartHandler:` — returns at once. While the microphone is captured a second
    /// start does nothing. Either handler may be empty.
    void startMicrophoneCaptureWithOutput(SampleHandler outputHandler, Handler didStartHandler);
    void stopMicrophoneCapture();
    /// `stopAllCapture` — returns the manager to its idle state; the stopped capture session stays until the next.
    void stopAllCapture();

    // Told by the platform.
    void captureOutputDidOutputSampleBuffer(const std::shared_ptr<CaptureOutput>& output,
                                            const SampleRef& sample) override;
    void observeValueForKeyPath(std::string_view keyPath) override;
    /// `handleAudioSessionInterruption:` — deliberately only notes that one has begun.
    void handleAudioSessionInterruption(std::uint64_t type);
    /// `checkAndHandleMicInterruption` — before each microphone sample: silence for the time of an interruption.
    void checkAndHandleMicInterruption();

    // Properties.
    SampleHandler appAudioOutputHandler() const { return appAudioOutputHandler_.get(); }
    void setAppAudioOutputHandler(SampleHandler handler) { appAudioOutputHandler_.set(std::move(handler)); }
    Handler appTapDidStartHandler() const { return appTapDidStartHandler_.get(); }
    void setAppTapDidStartHandler(Handler handler) { appTapDidStartHandler_.set(std::move(handler)); }
    /// The current tap; null when there is none.
    std::shared_ptr<AudioRecorderState> audioRecorderQueue() const { return audioRecorderQueue_.get(); }
    void setAudioRecorderQueue(std::shared_ptr<AudioRecorderState> recorder) {
        audioRecorderQueue_.set(std::move(recorder));
    }
    /// What is asked of a tap, and what inserted silence is.
    AudioFormat audioBasicDescription() const { return audioBasicDescription_.get(); }
    void setAudioBasicDescription(const AudioFormat& format) { audioBasicDescription_.set(format); }
    AudioTimeStamp initialTimestamp() const { return initialTimestamp_; }
    void setInitialTimestamp(const AudioTimeStamp& timestamp) { initialTimestamp_ = timestamp; }
    /// When the application's sound delivered so far ends.
    std::optional<Date> lastAudioDate() const { return lastAudioDate_.get(); }
    void setLastAudioDate(std::optional<Date> date) { lastAudioDate_.set(date); }
    bool isResumed() const { return resumed_; }
    void setResumed(bool resumed) { resumed_ = resumed; }
    /// When the current capture began on the capture clock: set from the first screen frame of a recording, invalid
    /// before and after. While it is invalid what a tap hears is thrown away, its buffers with it.
    MediaTime captureStartTime() const { return captureStartTime_.get(); }
    void setCaptureStartTime(MediaTime time) { captureStartTime_.set(time); }
    bool isRecordingAppAudio() const { return recordingAppAudio_; }
    void setRecordingAppAudio(bool recording) { recordingAppAudio_ = recording; }

    std::shared_ptr<DeviceCaptureSession> captureSession() const { return captureSession_.get(); }
    /// Takes the manager off the session that is replaced.
    void setCaptureSession(std::shared_ptr<DeviceCaptureSession> session);
    std::shared_ptr<CaptureInput> captureDeviceAudioInput() const { return captureDeviceAudioInput_.get(); }
    void setCaptureDeviceAudioInput(std::shared_ptr<CaptureInput> input) {
        captureDeviceAudioInput_.set(std::move(input));
    }
    std::shared_ptr<CaptureOutput> captureSessionAudioDataOutput() const {
        return captureSessionAudioDataOutput_.get();
    }
    void setCaptureSessionAudioDataOutput(std::shared_ptr<CaptureOutput> output) {
        captureSessionAudioDataOutput_.set(std::move(output));
    }
    /// The camera's: nothing here fills them, but what comes from this output is delivered.
    std::shared_ptr<CaptureInput> captureDeviceVideoInput() const { return captureDeviceVideoInput_.get(); }
    void setCaptureDeviceVideoInput(std::shared_ptr<CaptureInput> input) {
        captureDeviceVideoInput_.set(std::move(input));
    }
    std::shared_ptr<CaptureOutput> captureSessionVideoDataOutput() const {
        return captureSessionVideoDataOutput_.get();
    }
    void setCaptureSessionVideoDataOutput(std::shared_ptr<CaptureOutput> output) {
        captureSessionVideoDataOutput_.set(std::move(output));
    }
    SampleHandler microphoneOutputHandler() const { return microphoneOutputHandler_.get(); }
    void setMicrophoneOutputHandler(SampleHandler handler) { microphoneOutputHandler_.set(std::move(handler)); }
    SampleHandler cameraOutputHandler() const { return cameraOutputHandler_.get(); }
    void setCameraOutputHandler(SampleHandler handler) { cameraOutputHandler_.set(std::move(handler)); }
    Handler micDidStartHandler() const { return micDidStartHandler_.get(); }
    void setMicDidStartHandler(Handler handler) { micDidStartHandler_.set(std::move(handler)); }
    /// Stored only.
    std::int64_t cameraPosition() const { return cameraPosition_; }
    void setCameraPosition(std::int64_t position) { cameraPosition_ = position; }
    /// `avPreviewLayer` — an object of the client's, stored only.
    std::shared_ptr<void> avPreviewLayer() const { return avPreviewLayer_.get(); }
    void setAvPreviewLayer(std::shared_ptr<void> layer) { avPreviewLayer_.set(std::move(layer)); }
    bool isRecordingMicrophone() const { return recordingMicrophone_; }
    void setRecordingMicrophone(bool recording) { recordingMicrophone_ = recording; }
    bool isRecordingCamera() const { return recordingCamera_; }
    void setRecordingCamera(bool recording) { recordingCamera_ = recording; }
    bool sessionInProgress() const { return sessionInProgress_; }
    void setSessionInProgress(bool inProgress) { sessionInProgress_ = inProgress; }
    bool micInterrupted() const { return micInterrupted_; }
    void setMicInterrupted(bool interrupted) { micInterrupted_ = interrupted; }
    /// When the microphone's sound delivered so far ends.
    std::optional<Date> lastMicAudioDate() const { return lastMicAudioDate_.get(); }
    void setLastMicAudioDate(std::optional<Date> date) { lastMicAudioDate_.set(date); }
    /// Where the next microphone sample should begin.
    MediaTime micInterruptionPresentationTimeStamp() const { return micInterruptionPresentationTimeStamp_.get(); }
    void setMicInterruptionPresentationTimeStamp(MediaTime time) { micInterruptionPresentationTimeStamp_.set(time); }

private:
    explicit LCCaptureManager(const Platform& platform);

    // On the audio capture queue.
    void startTap(ProcessID pid, SampleHandler outputHandler, Handler didStartHandler, SoundUse use);
    void stopTap();
    void disposeOfFormerTaps();
    void handleInputBuffer(const std::shared_ptr<AudioRecorderState>& recorder, const AudioQueueBufferRef& buffer,
                           const AudioTimeStamp& start, std::uint32_t packetCount,
                           std::span<const AudioPacketDescription> descriptions);
    void fillGapAfterResume();
    void startMicrophone(SampleHandler outputHandler, Handler didStartHandler);

    void logStartError(std::int32_t status);
    bool isCurrent(const std::shared_ptr<AudioRecorderState>& recorder) const {
        return audioRecorderQueue_.get() == recorder;
    }
    /// A buffer will never be filled again. The last one of a tap that has been replaced ends its queue, if no stop has
    /// ended it before.
    void leaveRotation(const std::shared_ptr<AudioRecorderState>& recorder);
    /// Takes the handler out and calls it.
    void tellMicrophoneStarted();
    /// Silence of `seconds` from `presentation` on; null for a length that can't be.
    SampleRef makeSilence(double seconds, MediaTime presentation) const;

    const Platform platform_;
    Log& log_;
    const std::shared_ptr<SerialQueue> audioDispatchQueue_, sessionSampleBufferQueue_;
    std::unique_ptr<AudioSession::Registration> interruptions_;

    SharedSampleHandler appAudioOutputHandler_;
    SampleMaker tappedSamples_;
    Guarded<Handler> appTapDidStartHandler_;
    Guarded<std::shared_ptr<AudioRecorderState>> audioRecorderQueue_;
    std::vector<std::weak_ptr<AudioRecorderState>> formerTaps_;  ///< may still run; of the audio capture queue alone
    Guarded<AudioFormat> audioBasicDescription_;
    AudioTimeStamp initialTimestamp_;
    Guarded<std::optional<Date>> lastAudioDate_;
    std::atomic<bool> resumed_{false};
    Guarded<MediaTime> captureStartTime_{kInvalidMediaTime};
    std::atomic<bool> recordingAppAudio_{false};

    Guarded<std::shared_ptr<DeviceCaptureSession>> captureSession_;
    Guarded<std::shared_ptr<CaptureInput>> captureDeviceAudioInput_, captureDeviceVideoInput_;
    Guarded<std::shared_ptr<CaptureOutput>> captureSessionAudioDataOutput_, captureSessionVideoDataOutput_;
    SharedSampleHandler microphoneOutputHandler_, cameraOutputHandler_;
    Guarded<Handler> micDidStartHandler_;
    std::atomic<std::int64_t> cameraPosition_{0};
    Guarded<std::shared_ptr<void>> avPreviewLayer_;
    std::atomic<bool> recordingMicrophone_{false}, recordingCamera_{false}, sessionInProgress_{false},
        micInterrupted_{false};
    Guarded<std::optional<Date>> lastMicAudioDate_;
    Guarded<MediaTime> micInterruptionPresentationTimeStamp_{kInvalidMediaTime};
};

/// A run of silent sound, as after a resume and after an interruption: `seconds` of it, `presentation` its time. Its
/// samples are counted at 44100 a second, deliberately whatever the format says. Null for a format of no frames per
/// packet, and for a length that is not above zero or beyond ten minutes.
SampleRef makeSilentSample(const AudioFormat& format, double seconds, MediaTime presentation);

}  // namespace lumacast
