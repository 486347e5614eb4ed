#pragma once
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <memory>
#include <mutex>
#include <optional>
#include <span>
#include <vector>

#include "linux/audio/TapMix.h"
#include "linux/audio/TapSource.h"
#include "platform/AudioInputQueue.h"
#include "platform/Clock.h"

namespace lumacast {

/// What a queue needs of the port.
struct TapServices {
    std::shared_ptr<sound::TapSource> source;
    Clock& clock;  ///< asked only at a start
};

/// What a queue's owner and its thread share. The thread lives from the first start until dispose; it goes by the clock,
/// not by who plays, and wakes fifty times a second while there are buffers to fill; when there has been nothing to hear
/// for two seconds five times, and about once where silence may come late. Thread-safe.
class TapCore final : public std::enable_shared_from_this<TapCore> {
public:
    TapCore(TapServices services, const AudioFormat& format, AudioInputQueue::InputCallback callback);

    std::int32_t setProcessTap(ProcessID pid);
    std::int32_t streamFormat(AudioFormat& format) const;
    std::int32_t maximumOutputPacketSize(std::uint32_t& bytes) const;
    std::int32_t allocateBuffer(std::uint32_t bytes, AudioQueueBufferRef& buffer);
    std::int32_t enqueueBuffer(const AudioQueueBufferRef& buffer);
    void allowLateSilence();
    std::int32_t freeBuffer(const AudioQueueBufferRef& buffer);
    std::int32_t setIsRunningListener(AudioInputQueue::IsRunningListener listener);
    std::int32_t start();
    std::int32_t stop();
    std::int32_t dispose();

private:
    struct Allocated {
        AudioQueueBufferRef buffer;
        bool isEnqueued = false, wasEnqueued = false;
    };
    struct Filled {
        AudioQueueBufferRef buffer;
        AudioTimeStamp start;
    };
    using Lock = std::unique_lock<std::mutex>;

    Allocated* findLocked(const AudioQueueBufferRef& buffer);
    std::int32_t whyNoNewTapLocked() const;
    void stopLocked();
    bool openTapLocked();
    void closeTapLocked();

    // The queue's thread.
    void run();
    void tellRunning(Lock& lock);
    void rest(Lock& lock);
    void streamComes();
    double pieceFramesLocked() const;
    bool isDryLocked(HostTime now) const;
    void fillLocked();
    void keepLocked(std::int64_t frame, std::span<const float> samples);
    void endPieceLocked();
    void takeFrontLocked();
    void handOver(Lock& lock);

    const TapServices services_;
    const AudioFormat format_;

    mutable std::mutex mutex_;
    std::condition_variable changed_;
    std::shared_ptr<const AudioInputQueue::InputCallback> callback_;
    std::shared_ptr<const AudioInputQueue::IsRunningListener> listener_;
    std::shared_ptr<sound::TappedProcess> process_;
    std::vector<Allocated> allocated_;
    std::deque<AudioQueueBufferRef> enqueued_;
    std::deque<Filled> filled_;    ///< to be handed over; still the queue's
    bool hasThread_ = false, running_ = false, disposed_ = false, cameBack_ = false;
    bool silenceMayBeLate_ = false;
    bool streamCame_ = false;      ///< since the thread looked last
    int changesToTell_ = 0;        ///< of running, to the listener
    std::uint64_t run_ = 0;        ///< counts starts and stops
    std::shared_ptr<CaptureClock> clock_;
    std::shared_ptr<sound::TapMix> mix_;
    std::unique_ptr<sound::Listening> tap_;
    AudioTimeStamp firstStamp_;    ///< of the buffer that is being filled
    std::optional<HostTime> drySince_;
    std::vector<float> samples_;
};

/// The port's queue: letting go of it disposes of what it shares with its thread.
class LinuxAudioInputQueue final : public AudioInputQueue {
public:
    explicit LinuxAudioInputQueue(std::shared_ptr<TapCore> core) : core_(std::move(core)) {}
    ~LinuxAudioInputQueue() override { core_->dispose(); }

    std::int32_t setProcessTap(ProcessID pid) override { return core_->setProcessTap(pid); }
    std::int32_t streamFormat(AudioFormat& format) const override { return core_->streamFormat(format); }
    std::int32_t maximumOutputPacketSize(std::uint32_t& bytes) const override {
        return core_->maximumOutputPacketSize(bytes);
    }
    std::int32_t allocateBuffer(std::uint32_t bytes, AudioQueueBufferRef& buffer) override {
        return core_->allocateBuffer(bytes, buffer);
    }
    std::int32_t enqueueBuffer(const AudioQueueBufferRef& buffer) override { return core_->enqueueBuffer(buffer); }
    void allowLateSilence() override { core_->allowLateSilence(); }
    std::int32_t freeBuffer(const AudioQueueBufferRef& buffer) override { return core_->freeBuffer(buffer); }
    std::int32_t addIsRunningListener(IsRunningListener listener) override {
        return core_->setIsRunningListener(std::move(listener));
    }
    std::int32_t removeIsRunningListener() override { return core_->setIsRunningListener(nullptr); }
    std::int32_t start() override { return core_->start(); }
    std::int32_t stop() override { return core_->stop(); }
    std::int32_t dispose() override { return core_->dispose(); }

private:
    const std::shared_ptr<TapCore> core_;
};

}  // namespace lumacast
