#include "session/LCRecordingSession.h"

#include <algorithm>
#include <cstdio>

namespace lumacast {

namespace {

// Frames per second, without and with a broadcast extension.
constexpr int kCaptureRate = 60, kBroadcastCaptureRate = 30;

/// "MM-dd-yyyy HH:mm:ss" with every ":" replaced by "-".
std::string dateInFileName(const CalendarFields& f) {
    char text[64];
    std::snprintf(text, sizeof text, "%02d-%02d-%04d %02d-%02d-%02d", f.month, f.day, f.year, f.hour, f.minute,
                  f.second);
    return text;
}

}  // namespace

LCRecordingSession::LCRecordingSession(const SessionServices& services, BundleIdentifier bundleID)
    : services_(services),
      log_(services.platform.log),
      bundleID_(std::move(bundleID)),
      broadcastServiceInfoQueue_(services.platform.scheduler.serialQueue("com.orvane.lumacastd.ServiceInfoQueue")),
      resetQueue_(services.platform.scheduler.serialQueue("com.orvane.lumacastd.MediaServicesReset")),
      startQueue_(services.platform.scheduler.serialQueue("com.orvane.lumacastd.BroadcastStart")),
      shouldStopLock_(services.platform.scheduler.ownerlessLock()) {}

void LCRecordingSession::setWindowSize(Size size) {
    originalWindowSize_ = size;
    windowSize_.set(_maximumSizeWithSize(size));
}

std::string LCRecordingSession::outputPath() const {
    const Clock& clock = services_.platform.clock;
    if (broadcastExtension()) {
        char rest[96];
        std::snprintf(rest, sizeof rest, "_%f_%lli.mp4", clock.now().secondsSince1970,
                      static_cast<long long>(broadcastFragmentIndex_.load()));
        return services_.tempStore.pathFor("LCMovie_" + bundleID_.text() + rest);
    }
    if (systemRecording_) {
        return services_.tempStore.pathFor("ScreenRecording_" + dateInFileName(clock.localCalendar(clock.now())) +
                                           ".mp4");
    }
    const auto name = services_.localization._lcLocalizedAppNameFromBundleID(bundleID_);
    return services_.tempStore.pathFor(name.value_or("(null)") + ".mp4");
}

std::string LCRecordingSession::trimmedOutputPath() const {
    const auto name = services_.localization._lcLocalizedAppNameFromBundleID(bundleID_);
    return services_.tempStore.pathFor(name.value_or("(null)") + "_trimmed.mp4");
}

void LCRecordingSession::forgetTimes() {
    lastSampleTimestamp_.set(kInvalidMediaTime);
    sampleTimeOffset_.set(kZeroMediaTime);
}

void LCRecordingSession::startSessionWithHandler(Handler handler) {
    log_.line("LCRecordingSession: startSession");
    if (const auto source = screenCaptureController()) source->closeGate(GateWait::UntilDelivered);
    // A stop does not wait for the frame that is being delivered, which may leave its times after the finish has forgotten
    // them. Deliberately only after a finish: what a discarded recording leaves is the next one's.
    if (std::exchange(finishForgetsTimes_, false)) forgetTimes();
    services_.platform.clock.startCaptureClock();
    paused_ = false;
    reportingAgent_.set(
        std::make_shared<LCReportingAgent>(log_, services_.platform.telemetry, _serviceNameForReporting()));
    auto [width, height] = windowSize_.get();
    if (systemRecording_) {
        log_.line("Before windowSize w:%f h:%f", width, height);
        if (isNativeScreenOrientationPortrait() ? width > height : width <= height) std::swap(width, height);
        log_.line("After windowSize w:%f h:%f", width, height);
    }
    startIsPending_ = true;
    startWriter({width, height}, [self = shared_from_this(), start = ++starts_, stops = stops_.load(),
                                  handler = std::move(handler)] { self->continueStart(start, stops, handler); });
}

void LCRecordingSession::startWriter(Size size, Handler continuation) {
    Handler onLane = [lane = services_.requestLane, continuation = std::move(continuation)] {
        if (lane)
            lane->async(continuation);
        else
            continuation();
    };
    if (broadcastProcessMode_ != static_cast<std::int64_t>(BroadcastProcessMode::MovieClips)) {
        movieWriter_.set(nullptr);
        _notifyExtensionOfAction(ExtensionAction::Start, std::move(onLane));
        return;
    }
    const auto writer = std::make_shared<LCMovieWriter>(services_.platform, services_.tempStore, size, outputPath());
    writer->setBroadcastConfig(broadcastConfiguration_.get());
    writer->setSystemRecording(systemRecording_);
    pathClaim_ = services_.tempStore.claimPath(writer->outputPath());
    writer->setPathClaim(pathClaim_);
    movieWriter_.update([&](std::shared_ptr<LCMovieWriter>& current) {
        current = writer;
        movieIsFinishing_ = false;
    });
    writer->startWritingHandler(std::move(onLane));
}

int LCRecordingSession::captureRate() const { return broadcastExtension() ? kBroadcastCaptureRate : kCaptureRate; }

void LCRecordingSession::continueStart(std::uint64_t start, std::uint64_t stops, const Handler& handler) {
    // The outcome of the writer's start is deliberately not looked at: capture begins all the same.
    if (start == starts_) {
        startIsPending_ = false;
        if (stops == stops_ && !paused_) _resumeOrStartSession();
    }
    handler();
}

void LCRecordingSession::_resumeOrStartSession() {
    DisplayCloneControl& clone = services_.platform.displayCloneControl;
    if (systemRecording_) {
        log_.line("mirror mode");
        clone.setMirroringMode(DisplayCloneControl::kMirrorDisplay);
    } else {
        log_.line("app window mode");
        clone.setContexts({contextIDs_.begin(), contextIDs_.end()});
        clone.setMirroringMode(DisplayCloneControl::kCloneContexts);
    }
    const int rate = captureRate();
    if (const auto agent = reportingAgent())
        agent->update([&](UsageMetrics& metrics) {
            metrics.videoCaptureSize = windowSize_.get();
            metrics.videoCaptureRate = rate;
        });
    auto source = screenCaptureController();
    if (!source) {
        source = services_.platform.displayCapture.makeSource(windowSize_.get(), MediaTime::make(1, rate));
        screenCaptureController_.set(source);
    }
    source->setDelegate(weak_from_this());
    source->openGate();
    setupMicTapIfWanted();
    startAppAudioThenCapture();
    captureStartTime_.set(services_.platform.clock.now());
}

void LCRecordingSession::pauseSession() {
    if (paused_) return;
    if (const auto source = screenCaptureController()) source->closeGate(GateWait::UntilDelivered);
    paused_ = true;
    log_.line("LCRecordingSession: pauseSession");
    stopAllCapture();
    if (broadcastExtension()) _notifyExtensionOfAction(ExtensionAction::Pause, [] {});
}

void LCRecordingSession::resumeSessionWithContextID(ContextID contextID) {
    if (!paused_) return;
    log_.line("LCRecordingSession: resumeSessionWithContextID:");
    contextIDs_ = {contextID};
    sessionWasResumed_ = true;
    paused_ = false;
    if (broadcastExtension()) _notifyExtensionOfAction(ExtensionAction::Resume, [] {});
    if (!startIsPending_) _resumeOrStartSession();
}

double LCRecordingSession::activeDuration() const {
    const auto agent = reportingAgent();
    if (!agent) return 0;
    const auto started = captureStartTime();
    const bool running = isRecording() && !paused_ && !startIsPending_ && started;
    return agent->metrics().activeDuration + (running ? secondsBetween(*started, services_.platform.clock.now()) : 0);
}

void LCRecordingSession::stopAllCapture() {
    log_.line("LCRecordingSession: stopAllCapture");
    const auto agent = reportingAgent();
    const auto started = captureStartTime();
    if (agent && started) {
        // The start time deliberately stays: a stop while paused counts the first stretch again.
        const double stretch = secondsBetween(*started, services_.platform.clock.now());
        agent->update([&](UsageMetrics& metrics) { metrics.activeDuration += stretch; });
    }
    if (const auto source = screenCaptureController()) {
        source->stop();
        source->setDelegate({});
    }
    services_.captureManager.stopAllCapture();
    log_.line("Stop mirroring");
    services_.platform.displayCloneControl.setMirroringMode(DisplayCloneControl::kOff);
    haveMicTap_ = false;
}

void LCRecordingSession::stopRecordingWithNotification(bool notification, const std::optional<Error>& error) {
    // The frame lane and the request lane may both stop: whoever has the flag looks, so that one stop is one stop.
    if (stopIsRunning_.exchange(true)) return;
    std::uint64_t state = recordingState_;
    if (!(state & 1)) {
        stopIsRunning_ = false;
        return;
    }
    // Of this recording: the next one may have begun when the delegate has been told.
    const auto agent = reportingAgent();
    log_.line("LCRecordingSession: stop");
    ++stops_;
    if (const auto source = screenCaptureController()) source->closeGate(GateWait::No);
    stopAllCapture();
    if (recordingState_.compare_exchange_strong(state, state & ~std::uint64_t{1})) isBroadcasting_ = false;
    stopIsRunning_ = false;
    if (notification)
        if (const auto delegate = delegate_.get().lock())
            delegate->recordingSessionStoppedWithError(shared_from_this(), error);
    reportSummaryEvent(agent, error ? error->code() : 0);
}

void LCRecordingSession::finishSessionWithStartClipDuration(double startClipDuration, double endClipDuration,
                                                            FinishHandler handler) {
    if (!isRecording()) return;
    log_.line("LCRecordingSession: finishSessionWithHandler");
    stopRecordingWithNotification(false, std::nullopt);
    forgetTimes();
    finishForgetsTimes_ = true;
    if (broadcastProcessMode_ == static_cast<std::int64_t>(BroadcastProcessMode::SampleBuffers)) {
        // The link stays until the extension has answered, though a newer broadcast may have a link of its own by then.
        _notifyExtensionOfAction(ExtensionAction::Finish, [weak = weak_from_this(), link = broadcastUploadExtensionProxy(),
                                                           handler = std::move(handler)] {
            handler(std::nullopt, std::nullopt);
            if (link) link->invalidateConnection();
            const auto self = weak.lock();
            if (!self || !link) return;
            if (self->broadcastUploadExtensionProxy() == link) self->setBroadcastUploadExtensionProxy(nullptr);
            // It may have taken note of the end and never of the beginning.
            const auto error = self->services_.errors._lcUserErrorForCode(RecordingErrorCode::InvalidBroadcastSession);
            const auto delegate = self->delegate_.get().lock();
            if (delegate) delegate->broadcastExtensionFailed(self, link, error);
        });
    } else if (broadcastProcessMode_ == static_cast<std::int64_t>(BroadcastProcessMode::MovieClips)) {
        finishMovie(startClipDuration, endClipDuration, std::move(handler));
    }
    // In any other mode nothing further happens: the handler is deliberately never called.
}

void LCRecordingSession::finishMovie(double startClipDuration, double endClipDuration, FinishHandler handler) {
    std::shared_ptr<LCMovieWriter> writer;
    movieWriter_.update([&](const std::shared_ptr<LCMovieWriter>& current) {
        writer = current;
        movieIsFinishing_ = true;
    });
    if (!writer) return;
    writer->finishWritingWithHandler([weak = weak_from_this(), writer, startClipDuration, endClipDuration,
                                      handler = std::move(handler)](std::optional<URL> url) {
        const auto self = weak.lock();
        if (!self) return;
        self->log_.line("LCRecordingSession: finishWritingWithHandler");
        if (self->broadcastExtension()) {
            // Without a movie too: there is no token for it then.
            self->_notifyBroadcastExtensionOfCompletedMovieWithURL(url.value_or(URL()), true);
            handler(std::nullopt, std::nullopt);
        } else if (!url) {
            if (self->captureRecording_)
                handler(std::nullopt, std::nullopt);
            else
                handler(std::nullopt, self->services_.errors._lcUserErrorForCode(RecordingErrorCode::FailedToSave));
        } else if (startClipDuration > 0 && endClipDuration > 0) {
            self->log_.line("trimming");
            writer->trimMovieWithURL(*url, startClipDuration, endClipDuration, self->trimmedOutputURL(),
                                     [self, handler](URL trimmed) {
                                         self->log_.line("finished trimming");
                                         handler(std::move(trimmed), std::nullopt);
                                     });
        } else {
            handler(std::move(url), std::nullopt);
        }
    });
}

void LCRecordingSession::finishAndCleanupSessionFilesWithHandler(Handler handler) {
    log_.line("LCRecordingSession: cleanupSessionFiles");
    stopRecordingWithNotification(false, std::nullopt);
    services_.tempStore.removeFileOfClaim(
        outputURL(), pathClaim_, [self = shared_from_this(), handler = std::move(handler)](std::optional<Error> error) {
            if (error) self->log_.line("error removing file with code: %i", error->code());
            if (handler) handler();
        });
}

std::uint64_t LCRecordingSession::getRecordedFileSize() {
    const auto agent = reportingAgent();
    return agent ? getRecordedFileSize(*agent) : 0;
}

std::uint64_t LCRecordingSession::getRecordedFileSize(const LCReportingAgent& agent) {
    if (agent.serviceName() != "SystemRecording" && agent.serviceName() != "InAppRecording") return 0;
    const auto answer = services_.platform.fileSystem.attributes(outputURL().path());
    if (const auto* attributes = std::get_if<FileAttributes>(&answer)) {
        log_.line("recordedFileSize for URL %lu bytes", attributes->size);
        return attributes->size;
    }
    log_.line("error getting recordedFileSize :%ld", std::get<Error>(answer).code());
    return 0;
}

void LCRecordingSession::notifyRecordingMayBeStopped() {
    if (const auto writer = movieWriter()) writer->notifyRecordingMayBeStopped();
}

void LCRecordingSession::notifyRecordingResumed() {
    if (const auto writer = movieWriter()) writer->notifyRecordingResumed();
}

std::string LCRecordingSession::_serviceNameForReporting() const {
    if (systemRecording_ && isBroadcasting_) return "SystemBroadcast";
    if (systemRecording_) return "SystemRecording";
    if (isBroadcasting_) return "InAppBroadcast";
    if (captureRecording_) return "InAppCapture";
    return "InAppRecording";
}

void LCRecordingSession::reportSummaryEvent(const std::shared_ptr<LCReportingAgent>& agent, std::int64_t endReason) {
    if (!agent) return;
    const std::uint64_t size = getRecordedFileSize(*agent);
    agent->update([&](UsageMetrics& metrics) {
        metrics.recordedFileSize = size;
        metrics.endReason = endReason;
    });
    agent->reportEventWithType(LCReportingAgent::kSummaryEvent, agent->collectSummaryEventMetrics());
    reportingAgent_.update([&](std::shared_ptr<LCReportingAgent>& current) {
        if (current == agent) current = nullptr;
    });
}

void LCRecordingSession::sessionReportCameraUsage(std::int32_t cameraPosition) {
    constexpr std::int32_t kBack = 1, kFront = 2;
    const auto agent = reportingAgent();
    if (!agent) return;
    agent->update([&](UsageMetrics& metrics) {
        // The back camera deliberately sets the front flag too.
        if (cameraPosition == kBack && !metrics.backCameraUsed) metrics.frontCameraUsed = true;
        if (cameraPosition == kFront && !metrics.frontCameraUsed) metrics.frontCameraUsed = true;
    });
}

void LCRecordingSession::screenCaptureControllerDidFailWithStatus(DisplayCaptureSource&, std::int32_t status) {
    log_.line("LCRecordingSession: screenCaptureController: didFailWithStatus:");
    log_.debug("screen capture status: %d", status);
    stopRecordingWithNotification(true, services_.errors._lcUserErrorForCode(RecordingErrorCode::MediaServicesFailed));
}

void LCRecordingSession::screenCaptureControllerWasPreempted(DisplayCaptureSource&) {
    log_.line("LCRecordingSession: screenCaptureControllerWasPreempted");
    stopRecordingWithNotification(true, services_.errors._lcUserErrorForCode(RecordingErrorCode::Interrupted));
}

void LCRecordingSession::screenCaptureControllerMediaServicesWereReset(DisplayCaptureSource&) {
    log_.line("LCRecordingSession: screenCaptureControllerMediaServicesWereReset");
    // The lock may be held for ever by a frame of a pause, so it is waited for where nobody else waits. Only the flag is
    // set under it: the stop may wait for the source, and a frame may wait for the lock.
    resetQueue_->async([self = shared_from_this()] {
        self->shouldStopLock_->lock();
        self->shouldStop_ = true;
        self->shouldStopLock_->unlock();
        const Task stop = [self] {
            self->stopRecordingWithNotification(
                true, self->services_.errors._lcUserErrorForCode(RecordingErrorCode::MediaServicesFailed));
        };
        if (self->services_.requestLane)
            self->services_.requestLane->async(stop);
        else
            stop();
    });
}

}  // namespace lumacast
