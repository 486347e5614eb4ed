// The application's sound: the life of its tap, and the road of one buffer.

#include <algorithm>
#include <cmath>
#include <utility>
#include <vector>

#include "capture/LCCaptureManager.h"

namespace lumacast {

namespace {

constexpr double kBufferSeconds = 1.0;
constexpr double kMostBufferBytes = 57344;

/// The sample of a filled buffer, with the packet count that came with it; null when it can't be made.
SampleRef makeTappedSample(const SampleMaker& maker, const AudioFormat& format, const AudioQueueBuffer& buffer,
                           std::uint32_t packetCount, MediaTime presentation,
                           const std::vector<AudioPacketDescription>& descriptions) {
    if (buffer.byteSize > buffer.bytes.size() || !(format.sampleRate > 0)) return nullptr;
    if (!descriptions.empty() && descriptions.size() != packetCount) return nullptr;
    std::uint64_t frames = std::uint64_t{packetCount} * format.framesPerPacket;
    if (!descriptions.empty() && format.framesPerPacket == 0) frames = 0;
    for (const AudioPacketDescription& packet : descriptions) {
        if (packet.startOffset < 0 || packet.startOffset > buffer.byteSize ||
            packet.byteSize > buffer.byteSize - static_cast<std::uint64_t>(packet.startOffset))
            return nullptr;
        if (format.framesPerPacket == 0) frames += packet.framesInPacket;
    }
    const auto rate = static_cast<std::int32_t>(std::clamp(std::round(format.sampleRate), 1.0, 1e9));
    return maker.audio(format, Data(buffer.bytes.begin(), buffer.bytes.begin() + buffer.byteSize), packetCount,
                       {MediaTime::make(static_cast<std::int64_t>(frames), rate), presentation, kInvalidMediaTime});
}

}  // namespace

void LCCaptureManager::startAppAudioCaptureForProcessID(ProcessID pid, SampleHandler outputHandler,
                                                        Handler didStartHandler, SoundUse use) {
    audioDispatchQueue_->async([self = shared_from_this(), pid, outputHandler = std::move(outputHandler),
                                didStartHandler = std::move(didStartHandler), use]() mutable {
        self->startTap(pid, std::move(outputHandler), std::move(didStartHandler), use);
    });
}

void LCCaptureManager::resumeAppAudioCaptureForProcessID(ProcessID pid, SampleHandler outputHandler,
                                                         SoundUse use) {
    resumed_ = true;
    startAppAudioCaptureForProcessID(pid, std::move(outputHandler), nullptr, use);
}

void LCCaptureManager::stopAppAudioCapture() {
    audioDispatchQueue_->sync([this] { stopTap(); });
}

void LCCaptureManager::logStartError(std::int32_t status) {
    // The start deliberately goes on.
    if (status != AudioStatus::kSuccess) log_.line("LCRecordingManager: startAudioCapture error: %i", status);
}

void LCCaptureManager::startTap(ProcessID pid, SampleHandler outputHandler, Handler didStartHandler,
                                SoundUse use) {
    appAudioOutputHandler_.set(std::move(outputHandler));

    const auto recorder = std::make_shared<AudioRecorderState>();
    const auto replaced = audioRecorderQueue();
    audioRecorderQueue_.set(recorder);
    recorder->format = audioBasicDescription();
    auto made = platform_.audioInputQueues.makeInputQueue(
        recorder->format,
        [weak = weak_from_this(), recorder](const AudioQueueBufferRef& buffer, const AudioTimeStamp& start,
                                            std::uint32_t packetCount,
                                            std::span<const AudioPacketDescription> descriptions) {
            if (const auto self = weak.lock())
                self->handleInputBuffer(recorder, buffer, start, packetCount, descriptions);
        },
        AudioInputQueues::kCaptureProcessOutput);
    recorder->queue = std::move(made.queue);
    AudioInputQueue& queue = *recorder->queue;
    logStartError(made.status);
    // Deliberately said whatever the status is, here and below.
    log_.line("LCRecordingManager: startAudioCapture: Created Audio Queue Input");
    logStartError(queue.setProcessTap(pid));
    log_.line("LCRecordingManager: startAudioCapture: Successfully set Audio Queue to PID");
    logStartError(queue.streamFormat(recorder->format));
    if (use == SoundUse::Movie) queue.allowLateSilence();

    std::uint32_t packetBytes = recorder->format.bytesPerPacket;
    if (packetBytes == 0) (void)queue.maximumOutputPacketSize(packetBytes);
    const double bytes = std::min(packetBytes * recorder->format.sampleRate * kBufferSeconds, kMostBufferBytes);
    recorder->bufferByteSize = bytes > 0 ? static_cast<std::uint32_t>(bytes) : 0;
    for (AudioQueueBufferRef& buffer : recorder->buffers) {
        (void)queue.allocateBuffer(recorder->bufferByteSize, buffer);
        if (queue.enqueueBuffer(buffer) == AudioStatus::kSuccess) ++recorder->buffersInRotation;
    }
    recorder->currentPacket = 0;
    recorder->isRunning = true;
    queue.addIsRunningListener([weak = weak_from_this(), weakRecorder = std::weak_ptr(recorder)] {
        const auto self = weak.lock();
        const auto told = weakRecorder.lock();
        if (!self || !told) return;
        self->audioDispatchQueue_->async([self, told] {
            if (!told->isRunning) return;
            if (const Handler handler = self->appTapDidStartHandler()) handler();
        });
        told->queue->removeIsRunningListener();
    });
    logStartError(queue.start());
    log_.line("LCRecordingManager: startAudioCapture: Successfully started Audio Queue Recording");
    // Last: the listener's task comes behind this one.
    appTapDidStartHandler_.set(std::move(didStartHandler));
    // What was replaced ends by itself when its last buffer has come and gone, with the next stop at the latest.
    if (!replaced) return;
    if (replaced->buffersInRotation == 0)
        replaced->queue->dispose();
    else
        formerTaps_.push_back(replaced);
}

void LCCaptureManager::leaveRotation(const std::shared_ptr<AudioRecorderState>& recorder) {
    if (--recorder->buffersInRotation == 0 && !isCurrent(recorder)) recorder->queue->dispose();
}

void LCCaptureManager::handleInputBuffer(const std::shared_ptr<AudioRecorderState>& recorder,
                                         const AudioQueueBufferRef& buffer, const AudioTimeStamp& start,
                                         std::uint32_t packetCount,
                                         std::span<const AudioPacketDescription> descriptions) {
    // On the queue's own thread. Without a start time the buffer deliberately leaves the rotation.
    if (compare(captureStartTime(), kInvalidMediaTime) == 0) {
        leaveRotation(recorder);
        return;
    }
    audioDispatchQueue_->async([self = shared_from_this(), recorder, buffer, start, packetCount,
                                packets = std::vector(descriptions.begin(), descriptions.end())] {
        if (!self->isCurrent(recorder)) {
            self->leaveRotation(recorder);
            return;
        }
        const MediaTime presentation =
            MediaTime::make(static_cast<std::int64_t>(start.hostTime), CaptureClock::kTimescale);
        self->fillGapAfterResume();
        if (!recorder->isRunning) {
            self->log_.line("recorder is not running, ignoring audio data");
            self->leaveRotation(recorder);
            return;
        }
        const AudioFormat& format = recorder->format;
        std::int64_t packetsReceived = packetCount;
        if (packetCount == 0 && format.bytesPerPacket != 0) packetsReceived = buffer->byteSize / format.bytesPerPacket;
        // With the callback's own count, deliberately not the one just computed.
        if (const SampleRef sample =
                makeTappedSample(self->tappedSamples_, format, *buffer, packetCount, presentation, packets)) {
            self->lastAudioDate_.set(
                Date{self->platform_.clock.now().secondsSince1970 + sample->duration().seconds()});
            self->appAudioOutputHandler_.call(sample);
        }
        recorder->currentPacket += packetsReceived;
        if (recorder->queue->enqueueBuffer(buffer) == AudioStatus::kSuccess)
            self->log_.sample("LCRecordingManager: HandleInputBuffer: Successfully enqueued the audio buffer");
        else
            self->leaveRotation(recorder);
    });
}

void LCCaptureManager::fillGapAfterResume() {
    if (!resumed_.exchange(false)) return;
    const auto last = lastAudioDate();
    if (!last) return;
    const double gap = secondsBetween(*last, platform_.clock.now());
    if (!(gap > 0.0)) return;
    log_.line("gap since last audio tap, filling with empty sample buffer");
    const SampleRef silence = makeSilence(gap, kZeroMediaTime);
    // A resume always brings a handler; it may have been cleared by a stop of everything meanwhile.
    if (silence) appAudioOutputHandler_.call(silence);
}

LCCaptureManager::~LCCaptureManager() {
    disposeOfFormerTaps();
    if (const auto recorder = audioRecorderQueue()) recorder->queue->dispose();
}

void LCCaptureManager::disposeOfFormerTaps() {
    for (const auto& weak : std::exchange(formerTaps_, {}))
        if (const auto former = weak.lock()) former->queue->dispose();
}

void LCCaptureManager::stopTap() {
    disposeOfFormerTaps();  // their buffers may never be filled once the recording's clock stands
    const auto recorder = audioRecorderQueue();
    if (!recorder) return;
    AudioInputQueue& queue = *recorder->queue;
    if (recorder->isRunning) {
        if (const std::int32_t status = queue.stop()) {
            log_.line("LCRecordingManager:stopAudioCapture:error: %i", status);
            formerTaps_.push_back(recorder);  // deliberately neither freed nor disposed of now
        } else {
            log_.line("LCRecordingManager:stopAudioCapture: Audio Queue successfully stopped");
            recorder->isRunning = false;
            for (const AudioQueueBufferRef& buffer : recorder->buffers) {
                if (const std::int32_t freed = queue.freeBuffer(buffer))
                    log_.line("LCRecordingManager: error: %i", freed);
                else
                    log_.line("LCRecordingManager: Audio Queue buffer released");
            }
            if (const std::int32_t disposed = queue.dispose())
                log_.line("LCRecordingManager: error: %i", disposed);
            else
                log_.line("LCRecordingManager: Audio Queue has been disposed");
        }
    }
    queue.removeIsRunningListener();
    recorder->isRunning = false;
    audioRecorderQueue_.set(nullptr);
}

}  // namespace lumacast
