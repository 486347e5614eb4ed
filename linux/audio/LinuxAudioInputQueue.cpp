#include "linux/audio/LinuxAudioInputQueue.h"

#include <algorithm>
#include <chrono>
#include <cmath>

#include "linux/audio/TapFormat.h"
#include "linux/system/LinuxClock.h"
#include "linux/system/Threads.h"

namespace lumacast {

namespace {

using sound::TapMix;

/// How much a buffer holds when it is handed over.
constexpr double kPieceSeconds = 0.02;
/// The same while there is nothing to hear: silence is worth few wake-ups.
constexpr double kQuietPieceSeconds = 0.2;
/// And where it may come late. Longer than a still picture stands before it is repeated, so that each picture of a movie
/// takes along one piece at most; less than the second of sound that a movie's fragment holds.
constexpr double kLatePieceSeconds = 0.95;
/// How many buffers are handed over only when full, until one has come back.
constexpr std::size_t kKeptForLater = 5;
/// Without a buffer to fill for so long, the stream goes back to the server.
constexpr std::int64_t kDryNanoseconds = 1'000'000'000;
/// How exactly sound is cut where the capture clock began or ceased to run.
constexpr std::int64_t kCutFrames = 32;

}  // namespace

TapCore::TapCore(TapServices services, const AudioFormat& format, AudioInputQueue::InputCallback callback)
    : services_(std::move(services)),
      format_(format),
      callback_(std::make_shared<const AudioInputQueue::InputCallback>(std::move(callback))) {}

std::int32_t TapCore::setProcessTap(ProcessID pid) {
    {
        const std::lock_guard lock(mutex_);
        if (const std::int32_t refused = whyNoNewTapLocked(); refused != AudioStatus::kSuccess) return refused;
    }
    // Without the lock: the source may have to look for what the process is. Meanwhile everything may have changed.
    auto process = services_.source->hold(pid);
    if (!process) return AudioStatus::kNoSuchProcess;
    const std::lock_guard lock(mutex_);
    if (const std::int32_t refused = whyNoNewTapLocked(); refused != AudioStatus::kSuccess) return refused;
    std::swap(process_, process);
    return AudioStatus::kSuccess;
}

std::int32_t TapCore::whyNoNewTapLocked() const {
    if (disposed_) return AudioStatus::kDisposed;
    return running_ ? AudioStatus::kBadState : AudioStatus::kSuccess;
}

std::int32_t TapCore::streamFormat(AudioFormat& format) const {
    const std::lock_guard lock(mutex_);
    if (disposed_) return AudioStatus::kDisposed;
    format = format_;
    return AudioStatus::kSuccess;
}

std::int32_t TapCore::maximumOutputPacketSize(std::uint32_t& bytes) const {
    const std::lock_guard lock(mutex_);
    if (disposed_) return AudioStatus::kDisposed;
    bytes = format_.bytesPerPacket;
    return AudioStatus::kSuccess;
}

std::int32_t TapCore::allocateBuffer(std::uint32_t bytes, AudioQueueBufferRef& buffer) {
    const std::lock_guard lock(mutex_);
    if (disposed_) return AudioStatus::kDisposed;
    if (bytes < 1 || bytes > AudioInputQueue::kMostBufferBytes) return AudioStatus::kBadSize;
    if (allocated_.size() >= AudioInputQueue::kMostBuffers) return AudioStatus::kTooManyBuffers;
    auto made = std::make_shared<AudioQueueBuffer>();
    made->bytes.resize(bytes);
    allocated_.push_back({made});
    buffer = std::move(made);
    return AudioStatus::kSuccess;
}

TapCore::Allocated* TapCore::findLocked(const AudioQueueBufferRef& buffer) {
    const auto found = std::find_if(allocated_.begin(), allocated_.end(),
                                    [&buffer](const Allocated& one) { return one.buffer == buffer; });
    return found == allocated_.end() ? nullptr : &*found;
}

std::int32_t TapCore::enqueueBuffer(const AudioQueueBufferRef& buffer) {
    const std::lock_guard lock(mutex_);
    if (disposed_) return AudioStatus::kDisposed;
    Allocated* const found = findLocked(buffer);
    if (!found || found->isEnqueued) return AudioStatus::kBadBuffer;
    if (found->wasEnqueued) cameBack_ = true;
    found->isEnqueued = found->wasEnqueued = true;
    buffer->byteSize = 0;
    enqueued_.push_back(buffer);
    // Else the thread looks by itself in a moment.
    if (enqueued_.size() == 1 && running_) changed_.notify_all();
    return AudioStatus::kSuccess;
}

void TapCore::allowLateSilence() {
    const std::lock_guard lock(mutex_);
    silenceMayBeLate_ = true;
}

std::int32_t TapCore::freeBuffer(const AudioQueueBufferRef& buffer) {
    const std::lock_guard lock(mutex_);
    if (disposed_) return AudioStatus::kDisposed;
    Allocated* const found = findLocked(buffer);
    if (!found) return AudioStatus::kBadBuffer;
    std::erase(enqueued_, buffer);
    std::erase_if(filled_, [&buffer](const Filled& one) { return one.buffer == buffer; });
    allocated_.erase(allocated_.begin() + (found - allocated_.data()));
    return AudioStatus::kSuccess;
}

std::int32_t TapCore::setIsRunningListener(AudioInputQueue::IsRunningListener listener) {
    std::shared_ptr<const AudioInputQueue::IsRunningListener> other;
    if (listener) other = std::make_shared<const AudioInputQueue::IsRunningListener>(std::move(listener));
    // What is replaced is let go of after the lock: it may refer to the queue.
    const std::lock_guard lock(mutex_);
    if (disposed_) return AudioStatus::kDisposed;
    std::swap(listener_, other);
    return AudioStatus::kSuccess;
}

bool TapCore::openTapLocked() {
    // Nobody's sound needs no server.
    if (!process_ || tap_) return true;
    tap_ = process_->listen(mix_);
    return tap_ != nullptr;
}

void TapCore::closeTapLocked() { tap_.reset(); }

std::int32_t TapCore::start() {
    const std::lock_guard lock(mutex_);
    if (disposed_) return AudioStatus::kDisposed;
    if (running_) return AudioStatus::kSuccess;
    if (!hasThread_) hasThread_ = startDetachedThread([self = shared_from_this()] { self->run(); });
    if (!hasThread_) return AudioStatus::kNoResources;
    mix_ = std::make_shared<TapMix>(format_.sampleRate, format_.channelsPerFrame, LinuxClock::currentHostTime());
    mix_->whenStreamComes([weak = weak_from_this()] {
        if (const auto self = weak.lock()) self->streamComes();
    });
    if (!openTapLocked()) return AudioStatus::kNoResources;
    clock_ = services_.clock.captureClock();
    drySince_.reset();
    running_ = true;
    ++run_;
    ++changesToTell_;
    changed_.notify_all();
    return AudioStatus::kSuccess;
}

void TapCore::stopLocked() {
    running_ = false;
    ++run_;
    ++changesToTell_;
    // What was filled and not handed over is still enqueued.
    for (; !filled_.empty(); filled_.pop_back()) enqueued_.push_front(std::move(filled_.back().buffer));
    for (const AudioQueueBufferRef& buffer : enqueued_) buffer->byteSize = 0;
    closeTapLocked();
    changed_.notify_all();
}

std::int32_t TapCore::stop() {
    const std::lock_guard lock(mutex_);
    if (disposed_) return AudioStatus::kDisposed;
    if (running_) stopLocked();
    return AudioStatus::kSuccess;
}

std::int32_t TapCore::dispose() {
    // Let go of after the lock: what they refer to may refer to the queue.
    std::shared_ptr<const AudioInputQueue::InputCallback> callback;
    std::shared_ptr<const AudioInputQueue::IsRunningListener> listener;
    const std::lock_guard lock(mutex_);
    if (disposed_) return AudioStatus::kDisposed;
    if (running_) stopLocked();
    disposed_ = true;
    std::swap(callback_, callback);
    std::swap(listener_, listener);
    allocated_.clear();
    enqueued_.clear();
    process_.reset();
    changed_.notify_all();
    return AudioStatus::kSuccess;
}

void TapCore::run() {
    Lock lock(mutex_);
    while (!disposed_) {
        if (changesToTell_ > 0) {
            tellRunning(lock);
        } else if (!running_) {
            changed_.wait(lock);
        } else {
            rest(lock);
            if (!running_ || disposed_ || changesToTell_ > 0) continue;
            fillLocked();
            handOver(lock);
        }
    }
}

void TapCore::tellRunning(Lock& lock) {
    --changesToTell_;
    auto listener = listener_;
    if (!listener) return;
    lock.unlock();
    (*listener)();
    listener.reset();  // the same
    lock.lock();
}

/// On the sound thread: the silence up to now goes before what will be heard.
void TapCore::streamComes() {
    const std::lock_guard lock(mutex_);
    streamCame_ = true;
    changed_.notify_all();
}

double TapCore::pieceFramesLocked() const {
    const double quiet = silenceMayBeLate_ ? kLatePieceSeconds : kQuietPieceSeconds;
    return format_.sampleRate * (mix_->isQuiet() ? quiet : kPieceSeconds);
}

/// Waits until there is something to fill into a buffer, or a buffer, or less to do.
void TapCore::rest(Lock& lock) {
    const auto run = run_;
    if (isDryLocked(LinuxClock::currentHostTime()) && !tap_) {
        changed_.wait(lock, [&] { return run_ != run || !enqueued_.empty(); });
    } else {
        const auto piece = static_cast<std::int64_t>(std::ceil(pieceFramesLocked()));
        const std::int64_t begun =
            enqueued_.empty() ? 0 : std::min<std::int64_t>(enqueued_.front()->byteSize / format_.bytesPerFrame, piece - 1);
        const std::chrono::steady_clock::time_point moment{
            std::chrono::nanoseconds(mix_->readableFrom(piece - begun).nanoseconds)};
        changed_.wait_until(lock, moment, [&] { return run_ != run || streamCame_; });
    }
    streamCame_ = false;
}

bool TapCore::isDryLocked(HostTime now) const {
    return enqueued_.empty() && drySince_ && now.nanoseconds - drySince_->nanoseconds >= kDryNanoseconds;
}

void TapCore::fillLocked() {
    const HostTime now = LinuxClock::currentHostTime();
    if (enqueued_.empty()) {
        if (!drySince_) drySince_ = now;
        if (isDryLocked(now)) closeTapLocked();
        mix_->skipTo(mix_->position() + mix_->readable(now));
        return;
    }
    if (drySince_ && now.nanoseconds - drySince_->nanoseconds >= kDryNanoseconds) {
        // What passed meanwhile is gone. Without a thread for the server it stays silent until the next dry second.
        mix_->skipTo(mix_->position() + mix_->readable(now));
        (void)openTapLocked();
    }
    drySince_.reset();
    const auto most = static_cast<std::int64_t>(std::ceil(format_.sampleRate * kPieceSeconds));
    for (std::int64_t left = mix_->readable(now); left > 0;) {
        const std::int64_t frames = std::min(left, most);
        left -= frames;
        samples_.resize(static_cast<std::size_t>(frames) * format_.channelsPerFrame);
        const std::int64_t first = mix_->position();
        mix_->read(samples_);
        if (!clock_) continue;
        // In one piece where the clock ran all the time, else in small ones.
        const auto before = clock_->at(mix_->momentOf(first)), after = clock_->at(mix_->momentOf(first + frames));
        const bool isWhole = before && after &&
                             after->value - before->value ==
                                 mix_->momentOf(first + frames).nanoseconds - mix_->momentOf(first).nanoseconds;
        const std::int64_t step = isWhole ? frames : kCutFrames;
        for (std::int64_t done = 0; done < frames; done += step) {
            const auto part = static_cast<std::size_t>(std::min(step, frames - done)) * format_.channelsPerFrame;
            const auto skipped = static_cast<std::size_t>(done) * format_.channelsPerFrame;
            keepLocked(first + done, std::span<const float>(samples_).subspan(skipped, part));
        }
    }
    endPieceLocked();
}

/// What has been read is handed over, if there is enough of it for a piece. All of it in few buffers: there may be much
/// after a stall, or behind a silence.
void TapCore::endPieceLocked() {
    if (enqueued_.empty() || (!cameBack_ && enqueued_.size() <= kKeptForLater)) return;
    // A piece of silence may be longer than a buffer. Its rest is not kept for the next one.
    const double enough = mix_->isQuiet() ? 1 : format_.sampleRate * kPieceSeconds;
    if (enqueued_.front()->byteSize / format_.bytesPerFrame >= enough) takeFrontLocked();
}

void TapCore::takeFrontLocked() {
    filled_.push_back({std::move(enqueued_.front()), firstStamp_});
    enqueued_.pop_front();
}

void TapCore::keepLocked(std::int64_t frame, std::span<const float> samples) {
    const std::uint32_t channels = format_.channelsPerFrame;
    while (!samples.empty() && !enqueued_.empty()) {
        AudioQueueBuffer& buffer = *enqueued_.front();
        const auto heard = clock_->at(mix_->momentOf(frame));
        if (!heard) return;
        if (buffer.byteSize == 0)
            firstStamp_ = {static_cast<double>(frame), static_cast<std::uint64_t>(heard->value), 1,
                           AudioTimeStamp::kSampleTimeValid | AudioTimeStamp::kHostTimeValid |
                               AudioTimeStamp::kRateScalarValid};
        const std::size_t room = (buffer.bytes.size() - buffer.byteSize) / format_.bytesPerFrame;
        const std::size_t frames = std::min(room, samples.size() / channels);
        sound::writePcm(format_, samples.first(frames * channels), buffer.bytes.data() + buffer.byteSize);
        buffer.byteSize += static_cast<std::uint32_t>(frames * format_.bytesPerFrame);
        samples = samples.subspan(frames * channels);
        frame += static_cast<std::int64_t>(frames);
        if (buffer.bytes.size() - buffer.byteSize < format_.bytesPerFrame) takeFrontLocked();
    }
}

void TapCore::handOver(Lock& lock) {
    while (!filled_.empty()) {
        const Filled one = std::move(filled_.front());
        filled_.pop_front();
        Allocated* const found = findLocked(one.buffer);
        if (!found) continue;  // freed meanwhile
        found->isEnqueued = false;
        auto callback = callback_;
        const std::uint32_t packets = one.buffer->byteSize / format_.bytesPerFrame;
        lock.unlock();
        if (*callback) (*callback)(one.buffer, one.start, packets, {});
        callback.reset();  // the last reference may be what owns the queue, whose end needs the lock
        lock.lock();
    }
}

}  // namespace lumacast
