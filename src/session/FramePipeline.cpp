// The road of one screen frame through the session: dropped, re-timed or not, and delivered. Runs on the frame lane.

#include <cmath>
#include <functional>
#include <limits>

#include "platform/PreferenceKeys.h"
#include "session/FrameGeometry.h"
#include "session/LCRecordingSession.h"

namespace lumacast {

void LCRecordingSession::screenCaptureControllerDidReceiveSampleBuffer(DisplayCaptureSource&, const SampleRef& sample,
                                                                       std::uint32_t transformFlags) {
    if (!sample) return;
    const auto& image = sample->image();
    log_.sample("Screen sampled at w:%zu h:%zu", image ? image->width() : std::size_t{0},
                image ? image->height() : std::size_t{0});
    if (compare(firstSampleTimestamp_.get(), kZeroMediaTime) == 0)
        firstSampleTimestamp_.set(sample->presentationTime());
    updateDuartionWithSample(sample);
    if (broadcastExtension())
        _processSampleBufferForStreaming(sample, transformFlags);
    else
        _processSampleBuffer(sample, transformFlags);
}

void LCRecordingSession::_processSampleBufferForStreaming(const SampleRef& sample, std::uint32_t transformFlags) {
    _processSampleBuffer(sample, transformFlags);
}

void LCRecordingSession::updateDuartionWithSample(const SampleRef& sample) {
    // Deliberately raw ticks, and paused time is not taken out.
    const MediaTime pts = sample->presentationTime();
    const MediaTime duration = MediaTime::make(pts.value - firstSampleTimestamp_.get().value, pts.timescale);
    if (const auto delegate = delegate_.get().lock())
        delegate->broadcastSessionDidUpdateDuration(*this, duration.seconds());
}

void LCRecordingSession::_processSampleBuffer(const SampleRef& sample, std::uint32_t transformFlags) {
    log_.sample("LCRecordingSession:screenCaptureController:didReceiveSampleBuffer:transformFlags:");
    shouldStopLock_->lock();
    if (shouldStop_) {
        shouldStopLock_->unlock();
        return;
    }
    if (paused_) {
        // The lock deliberately stays held on this path only; the capture gate keeps frames of a pause away from here.
        log_.sample("session is paused discard sample");
        return;
    }
    const MediaTime pts = sample->presentationTime();
    if (sessionWasResumed_.exchange(false)) {
        // The last time stays that of the last frame before the pause.
        const MediaTime gap = MediaTime::make(pts.value - lastSampleTimestamp_.get().value, pts.timescale);
        const MediaTime offset = sampleTimeOffset_.get();
        sampleTimeOffset_.set(compare(offset, kZeroMediaTime) != 0
                                  ? MediaTime::make(offset.value + gap.value, gap.timescale)
                                  : gap);
    } else {
        lastSampleTimestamp_.set(pts);
    }
    const auto deliverIt = [&](const SampleRef& retimed) { deliver(retimed, transformFlags, pts); };
    _updateSampleBufferWithOffset(sample, std::cref(deliverIt));  // a reference takes no memory
    shouldStopLock_->unlock();
}

void LCRecordingSession::_updateSampleBufferWithOffset(const SampleRef& sample,
                                                       const std::function<void(const SampleRef&)>& handler) {
    const MediaTime offset = sampleTimeOffset_.get();
    if (compare(offset, kZeroMediaTime) == 0) {
        handler(sample);
        return;
    }
    const MediaTime pts = sample->presentationTime();
    const SampleRef copy =
        _copySampleBufferFromSourceBuffer(sample, MediaTime::make(pts.value - offset.value, pts.timescale));
    if (!copy) {
        handler(sample);
        return;
    }
    services_.captureManager.setCaptureStartTime(pts);
    handler(copy);
}

SampleRef LCRecordingSession::_copySampleBufferFromSourceBuffer(const SampleRef& sample, MediaTime updatedTimeStamp) {
    const std::uint64_t entries = sample->timing().size();
    if (entries > std::numeric_limits<std::uint64_t>::max() / sizeof(SampleTiming)) {
        log_.line("LCRecordingSession: _copySampleBufferFromSourceBuffer: Overflow detected");
        return nullptr;
    }
    std::vector<SampleTiming> timing(sample->timing().begin(), sample->timing().end());
    for (SampleTiming& entry : timing) {
        entry.presentation = updatedTimeStamp;
        entry.decode = kInvalidMediaTime;
    }
    return sample->copyWithTiming(std::move(timing));
}

void LCRecordingSession::deliver(const SampleRef& sample, std::uint32_t transformFlags, MediaTime originalTime) {
    if (compare(services_.captureManager.captureStartTime(), kInvalidMediaTime) == 0)
        services_.captureManager.setCaptureStartTime(originalTime);
    AffineTransform transform;
    if (systemRecording_) transform = frameTransformFromFlags(log_, transformFlags);
    if (broadcastProcessMode_ == static_cast<std::int64_t>(BroadcastProcessMode::SampleBuffers)) {
        _notifyExtensionOfVideoSampleBuffer(sample, SampleType::Video, orientationFromFrameTransform(transformFlags));
    } else if (captureRecording_) {
        packageVideoSampleBufferForCapture(sample);
    } else if (const auto writer = movieWriter(); !writer || !writer->appendVideoSampleBuffer(sample, transform)) {
        log_.line("LCRecordingSession: failed to start writer when appending video sample");
        stopRecordingWithNotification(true, services_.errors._lcUserErrorForCode(RecordingErrorCode::FailedToSave));
    }
    // A session without a writer has stopped itself, and the agent is gone by then.
    if (const auto agent = reportingAgent()) agent->update([](UsageMetrics& metrics) { ++metrics.videoFrameCount; });
}

Size LCRecordingSession::_maximumSizeWithSize(Size size) {
    if (hasFullResolution()) {
        log_.line("full res capture enabled");
        return size;
    }
    return cappedSize(size);
}

bool LCRecordingSession::canCaptureSize(Size size) {
    const auto isSide = [](double length) { return std::isfinite(length) && length >= 1; };
    if (!isSide(size.width) || !isSide(size.height)) return false;
    const Size captured = hasFullResolution() ? size : cappedSize(size);
    return isSide(captured.width) && isSide(captured.height);
}

bool LCRecordingSession::hasFullResolution() const {
    return isTrue(services_.platform.preferences.value(kPreferenceDomain, kFullResCaptureKey));
}

Size LCRecordingSession::cappedSize(Size size) {
    constexpr std::int64_t kTabletIdiom = 1;
    constexpr double kLimit = 1920, kReducedLimit = 1600;
    const DeviceInfo& device = services_.platform.deviceInfo;
    const bool reduced = device.userInterfaceIdiom() == kTabletIdiom && chipId() == device.reducedCaptureChipID();
    return fittedWithin(size, reduced ? kReducedLimit : kLimit);
}

std::int64_t LCRecordingSession::chipId() {
    if (chipId_ == 0) chipId_ = services_.platform.deviceInfo.chipID().value_or(0);
    return chipId_;
}

}  // namespace lumacast
