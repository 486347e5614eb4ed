// A session's sound: whose is captured, and where each buffer goes. The handlers run on the audio capture queue (the
// application's sound) and on the capture manager's sample queue (the microphone), beside the frame lane.

#include "session/LCRecordingSession.h"

namespace lumacast {

void LCRecordingSession::setMicrophoneEnabled(bool enabled) {
    microphoneEnabled_ = enabled;
    // Deliberately system recordings only: another that turns the microphone on gets no new tap.
    if (!haveMicTap_ && systemRecording_ && isRecording() && enabled && hasAudioCaptureDevice()) setupMicTap();
}

void LCRecordingSession::setupMicTap() {
    log_.line("starting mic capture");
    services_.captureManager.startMicrophoneCaptureWithOutput(
        [weak = weak_from_this()](const SampleRef& sample) {
            if (const auto self = weak.lock()) self->takeMicrophoneSample(sample);
        },
        [weak = weak_from_this()] {
            if (const auto self = weak.lock()) self->haveMicTap_ = true;
        });
}

void LCRecordingSession::setupMicTapIfWanted() {
    // An in-app broadcast is sent silence while its microphone is off.
    const bool wanted = microphoneEnabled_ || (!systemRecording_ && broadcastExtension());
    if (wanted && hasAudioCaptureDevice()) setupMicTap();
}

bool LCRecordingSession::hasAudioCaptureDevice() const {
    const CaptureDevices* const devices = services_.captureDevices;
    return devices ? devices->hasAudioCaptureDevice() : services_.captureManager.hasAudioCaptureDevice();
}

void LCRecordingSession::startAppAudioThenCapture() {
    captureHasBegun_ = false;
    const ProcessID pid = frontmostPIDForAudioTap_;
    if (number(pid) < 1) {
        beginCapture();
        return;
    }
    services_.captureManager.startAppAudioCaptureForProcessID(
        pid,
        [weak = weak_from_this()](const SampleRef& sample) {
            if (const auto self = weak.lock()) self->takeAppAudioSample(sample);
        },
        [weak = weak_from_this()] {
            if (const auto self = weak.lock()) self->beginCapture();
        },
        useOfAppAudio());
}

LCCaptureManager::SoundUse LCRecordingSession::useOfAppAudio() const {
    const bool isLive = captureRecording_ || broadcastExtension();
    return isLive ? LCCaptureManager::SoundUse::Live : LCCaptureManager::SoundUse::Movie;
}

void LCRecordingSession::beginCapture() {
    if (captureHasBegun_.exchange(true)) return;
    log_.line("starting capture");
    if (const auto source = screenCaptureController()) source->start();
}

void LCRecordingSession::takeMicrophoneSample(const SampleRef& sample) {
    updateDuartionWithSample(sample);
    if (paused_) return;
    if (!microphoneEnabled_) sample->overwriteDataWithZero();
    if (broadcastProcessMode_ == static_cast<std::int64_t>(BroadcastProcessMode::SampleBuffers))
        _notifyExtensionOfAudioSampleBuffer(sample, SampleType::Microphone);
    else if (!captureRecording_)
        appendAudio(sample, SampleType::Microphone);  // deliberately also while clips are broadcast
    else
        packageAudioSampleBufferForCapture(sample, SampleType::Microphone);
    if (const auto agent = reportingAgent()) agent->update([](UsageMetrics& metrics) { ++metrics.micFrameCount; });
}

void LCRecordingSession::takeAppAudioSample(const SampleRef& sample) {
    updateDuartionWithSample(sample);
    if (paused_) return;
    // Here the mode is looked at first, in the handler of a resume the extension.
    if (broadcastProcessMode_ == static_cast<std::int64_t>(BroadcastProcessMode::SampleBuffers))
        _notifyExtensionOfAudioSampleBuffer(sample, SampleType::AppAudio);
    else if (broadcastProcessMode_ == static_cast<std::int64_t>(BroadcastProcessMode::MovieClips) &&
             broadcastExtension())
        _processAudioSampleBufferForMP4ClipHandler(sample);
    else if (captureRecording_)
        packageAudioSampleBufferForCapture(sample, SampleType::AppAudio);
    else
        appendAudio(sample, SampleType::AppAudio);
    countAppAudio();
}

void LCRecordingSession::takeResumedAppAudioSample(ProcessID pid, const SampleRef& sample) {
    log_.line("resumed audio capture for pid: %i", number(pid));
    updateDuartionWithSample(sample);
    // Deliberately no look at the pause.
    const bool broadcasts = broadcastExtension() != nullptr;
    if (broadcasts && broadcastProcessMode_ == static_cast<std::int64_t>(BroadcastProcessMode::SampleBuffers))
        _notifyExtensionOfAudioSampleBuffer(sample, SampleType::AppAudio);
    else if (broadcasts && broadcastProcessMode_ == static_cast<std::int64_t>(BroadcastProcessMode::MovieClips))
        _processAudioSampleBufferForMP4ClipHandler(sample);
    else if (captureRecording_)
        packageAudioSampleBufferForCapture(sample, SampleType::AppAudio);
    else
        appendAudio(sample, SampleType::AppAudio);
    countAppAudio();
}

void LCRecordingSession::appendAudio(const SampleRef& sample, SampleType type) {
    const auto writer = movieWriter();
    if (!writer) return;
    // What becomes of it is deliberately not looked at: no failure of the sound stops the session.
    if (type == SampleType::Microphone)
        writer->appendAudio2SampleBuffer(sample);
    else
        writer->appendAudio1SampleBuffer(sample);
}

void LCRecordingSession::countAppAudio() {
    if (const auto agent = reportingAgent())
        agent->update([](UsageMetrics& metrics) { ++metrics.appAudioFrameCount; });
}

void LCRecordingSession::updateProcessIDForAudioCaptureWithPID(ProcessID pid) {
    log_.line("updateProcessIDForAudioCaptureWithPID: %i", number(pid));
    if (!isRecording()) return;
    frontmostPIDForAudioTap_ = pid;
    log_.line("stopping audio capture");
    if (number(pid) < 1) {
        // Deliberately nothing is stopped, though the number is the one kept from now on.
        log_.line("invalid pid stopping audio capture");
        return;
    }
    LCCaptureManager& capture = services_.captureManager;
    capture.stopAppAudioCapture();
    log_.line("update foreground app bundleId");
    updateBundleIdForFirstForegroundApp();
    log_.line("resuming audio capture for pid: %i", number(pid));
    capture.resumeAppAudioCaptureForProcessID(
        pid,
        [weak = weak_from_this(), pid](const SampleRef& sample) {
            if (const auto self = weak.lock()) self->takeResumedAppAudioSample(pid, sample);
        },
        useOfAppAudio());
    beginCaptureWithoutTap();
}

void LCRecordingSession::checkAndStopAppAudioForPID(ProcessID pid) {
    if (frontmostPIDForAudioTap_ != pid) return;
    services_.captureManager.stopAppAudioCapture();
    beginCaptureWithoutTap();
}

void LCRecordingSession::beginCaptureWithoutTap() {
    // The tap that was stopped may have been about to start the source.
    if (isRecording() && screenCaptureController() && !startIsPending_ && !paused_) beginCapture();
}

void LCRecordingSession::updateBundleIdForFirstForegroundApp() {
    if (!isBroadcasting_ || bundleIDOfFirstForegroundApp()) return;
    const auto bundle = services_.localization.bundleWithPID(frontmostPIDForAudioTap_);
    const auto identifier = bundle ? bundle->identifier() : std::nullopt;
    if (!identifier) return;
    bundleIDOfFirstForegroundApp_.set(identifier);
    _notifyExtensionOfFrontmostProcessBundleID(*identifier);
}

}  // namespace lumacast
