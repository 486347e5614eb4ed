#include "capture/LCCaptureManager.h"

#include <utility>

namespace lumacast {

namespace {

/// 16-bit mono PCM, deliberately big-endian.
constexpr AudioFormat kBasicDescription{.sampleRate = 44100,
                                        .formatID = kAudioFormatLinearPCM,
                                        .formatFlags = AudioFormat::kFlagSignedInteger | AudioFormat::kFlagPacked |
                                                       AudioFormat::kFlagBigEndian,
                                        .bytesPerPacket = 2,
                                        .framesPerPacket = 1,
                                        .bytesPerFrame = 2,
                                        .channelsPerFrame = 1,
                                        .bitsPerChannel = 16,
                                        .reserved = 0};

}  // namespace

LCCaptureManager::LCCaptureManager(const Platform& platform)
    : platform_(platform),
      log_(platform.log),
      audioDispatchQueue_(platform.scheduler.serialQueue("com.orvane.Lumacast.CaptureQueue")),
      sessionSampleBufferQueue_(platform.scheduler.serialQueue("com.orvane.lumacast.capture.session")),
      audioBasicDescription_(kBasicDescription) {}

std::shared_ptr<LCCaptureManager> LCCaptureManager::init(const Platform& platform) {
    std::shared_ptr<LCCaptureManager> manager(new LCCaptureManager(platform));
    AudioSession& audioSession = platform.deviceCapture.sharedAudioSession();
    manager->interruptions_ =
        audioSession.observeInterruptions([weak = std::weak_ptr(manager)](std::uint64_t type) {
            if (const auto self = weak.lock()) self->handleAudioSessionInterruption(type);
        });
    // The result is deliberately not looked at.
    audioSession.setCategory(AudioSession::kPlayAndRecord,
                             AudioSession::kMixWithOthers | AudioSession::kAllowBluetoothHandsFree);
    return manager;
}

void LCCaptureManager::startCaptureSession() {
    log_.line("LCCaptureManager: startCaptureSession");
    if (sessionInProgress_.exchange(true)) return;
    setCaptureSession(platform_.deviceCapture.makeSession());
}

void LCCaptureManager::stopCaptureSession() {
    log_.line("LCCaptureManager: stopDeviceCaptureSessionWithFinishHandler");
    if (!sessionInProgress_.exchange(false)) return;
    const auto session = captureSession();
    if (!session) return;
    // Deliberately another key path than the observed one: it fails, and nobody minds.
    session->removeObserver(this, "isRunning");
    session->stopRunning();
}

void LCCaptureManager::setCaptureSession(std::shared_ptr<DeviceCaptureSession> session) {
    if (const auto old = captureSession()) old->removeObserver(this, DeviceCaptureSession::kRunning);
    captureSession_.set(std::move(session));
}

void LCCaptureManager::startMicrophoneCaptureWithOutput(SampleHandler outputHandler, Handler didStartHandler) {
    audioDispatchQueue_->async([self = shared_from_this(), outputHandler = std::move(outputHandler),
                                didStartHandler = std::move(didStartHandler)]() mutable {
        self->startMicrophone(std::move(outputHandler), std::move(didStartHandler));
    });
}

void LCCaptureManager::startMicrophone(SampleHandler outputHandler, Handler didStartHandler) {
    if (recordingMicrophone_) return;
    log_.line("LCCaptureManager: setAudioCaptureEnabled: YES");
    startCaptureSession();
    const auto session = captureSession();
    session->setUsesApplicationAudioSession(true);
    session->setAutomaticallyConfiguresApplicationAudioSession(false);
    if (outputHandler) microphoneOutputHandler_.set(std::move(outputHandler));
    recordingMicrophone_ = true;

    const auto input = platform_.deviceCapture.defaultAudioInput();
    captureDeviceAudioInput_.set(input);
    if (session->canAddInput(input)) session->addInput(input);
    const auto output = platform_.deviceCapture.makeAudioDataOutput();
    captureSessionAudioDataOutput_.set(output);
    output->setSampleBufferDelegate(weak_from_this(), sessionSampleBufferQueue_);
    if (session->canAddOutput(output)) session->addOutput(output);

    micDidStartHandler_.set(std::move(didStartHandler));
    if (session->isRunning()) {
        tellMicrophoneStarted();
        return;
    }
    session->addObserver(weak_from_this(), DeviceCaptureSession::kRunning);
    session->startRunning();
}

void LCCaptureManager::tellMicrophoneStarted() {
    Handler handler;
    micDidStartHandler_.update([&](Handler& kept) { std::swap(kept, handler); });
    if (handler) handler();
}

void LCCaptureManager::observeValueForKeyPath(std::string_view keyPath) {
    if (keyPath != DeviceCaptureSession::kRunning) return;
    tellMicrophoneStarted();
    // Added under "running" and deliberately removed under "isRunning", which fails.
    if (const auto session = captureSession()) session->removeObserver(this, "isRunning");
}

void LCCaptureManager::stopMicrophoneCapture() {
    audioDispatchQueue_->sync([this] {
        if (!recordingMicrophone_) return;
        log_.line("LCCaptureManager: setAudioCaptureEnabled: NO");
        recordingMicrophone_ = false;
        // The session deliberately goes on running.
        const auto session = captureSession();
        if (!session) return;
        session->removeInput(captureDeviceAudioInput());
        session->removeOutput(captureSessionAudioDataOutput());
    });
}

void LCCaptureManager::stopAllCapture() {
    stopCaptureSession();
    stopMicrophoneCapture();
    // A microphone whose start was still under way has begun a session since.
    if (sessionInProgress_) stopCaptureSession();
    stopAppAudioCapture();
    cameraOutputHandler_.set(nullptr);
    microphoneOutputHandler_.set(nullptr);
    appAudioOutputHandler_.set(nullptr);
    captureStartTime_.set(kInvalidMediaTime);
    lastAudioDate_.set(std::nullopt);
    lastMicAudioDate_.set(std::nullopt);
}

void LCCaptureManager::captureOutputDidOutputSampleBuffer(const std::shared_ptr<CaptureOutput>& output,
                                                          const SampleRef& sample) {
    if (!output || !sample) return;
    if (output == captureSessionAudioDataOutput()) {
        if (!microphoneOutputHandler()) return;
        checkAndHandleMicInterruption();
        lastMicAudioDate_.set(
            Date{platform_.clock.now().secondsSince1970 + sample->duration().seconds()});
        micInterruptionPresentationTimeStamp_.set(add(sample->presentationTime(), sample->duration()));
        microphoneOutputHandler_.call(sample);
    } else if (output == captureSessionVideoDataOutput()) {
        cameraOutputHandler_.call(sample);
    }
}

void LCCaptureManager::handleAudioSessionInterruption(std::uint64_t type) {
    if (type == AudioSession::kInterruptionBegan) {
        log_.line("LCCaptureManager: SoundRouteInterruptionTypeBegan");
        micInterrupted_ = true;
    } else if (type == AudioSession::kInterruptionEnded) {
        log_.line("LCCaptureManager: SoundRouteInterruptionTypeEnded");
    }
}

void LCCaptureManager::checkAndHandleMicInterruption() {
    if (!micInterrupted_ || !microphoneOutputHandler()) return;
    micInterrupted_ = false;
    const auto last = lastMicAudioDate();
    if (!last) return;
    const double gap = secondsBetween(*last, platform_.clock.now());
    if (!(gap > 0.0)) return;
    log_.line("gap since last mic tap, filling with empty sample buffer");
    const SampleRef silence = makeSilence(gap, micInterruptionPresentationTimeStamp());
    if (silence) microphoneOutputHandler_.call(silence);
}

SampleRef LCCaptureManager::makeSilence(double seconds, MediaTime presentation) const {
    return makeSilentSample(audioBasicDescription(), seconds, presentation);
}

SampleRef makeSilentSample(const AudioFormat& format, double seconds, MediaTime presentation) {
    constexpr double kRate = 44100.0;
    constexpr std::int32_t kTimescale = 44100;
    constexpr double kLongest = 600;
    constexpr std::uint32_t kLargestSample = 64;
    if (format.framesPerPacket == 0 || !(seconds > 0) || seconds > kLongest) return nullptr;
    const std::uint32_t sampleSize = format.bytesPerFrame == 0 ? 1 : format.bytesPerPacket;
    if (sampleSize > kLargestSample) return nullptr;
    const auto count = static_cast<std::int64_t>(seconds * kRate / format.framesPerPacket);
    // Memory comes cleared; nothing is written to it.
    return SampleBuffer::makeAudio(
        format, Data(static_cast<std::size_t>(count) * sampleSize), count,
        {MediaTime::fromSeconds(seconds, kTimescale), presentation, kInvalidMediaTime});
}

}  // namespace lumacast
