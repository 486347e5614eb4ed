#pragma once
// Taps whose sound the test decides on.

#include <atomic>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <vector>

#include "platform/AudioInputQueue.h"
#include "platform/Clock.h"
#include "platform/Scheduler.h"
#include "tests/fakes/FaultPlan.h"

namespace lumacast {

/// What the queues of one FakeAudioInputQueues share.
struct FakeSoundSettings {
    Scheduler& scheduler;
    Clock& clock;
    FaultPlan& faults;
    std::mutex mutex;
    std::map<ProcessID, std::uint8_t> playing;  ///< the byte that a process plays, over and over
    std::atomic<std::uint32_t> maximumPacketSize{0};  ///< what is answered instead of the format's, when not 0
};

/// One queue. Its thread is a serial queue of its own; it fills buffers when the test says that something was heard, and
/// with the clock, stamps and last five buffers of the contract. A failing call ("AudioInputQueue.<operation>") answers
/// kFailed and does nothing. Thread-safe.
class FakeAudioInputQueue final : public AudioInputQueue, public std::enable_shared_from_this<FakeAudioInputQueue> {
public:
    static constexpr std::int32_t kFailed = -99;

    FakeAudioInputQueue(std::shared_ptr<FakeSoundSettings> settings, const AudioFormat& format, InputCallback callback);

    std::int32_t setProcessTap(ProcessID pid) override;
    std::int32_t streamFormat(AudioFormat& format) const override;
    std::int32_t maximumOutputPacketSize(std::uint32_t& bytes) const override;
    std::int32_t allocateBuffer(std::uint32_t bytes, AudioQueueBufferRef& buffer) override;
    std::int32_t enqueueBuffer(const AudioQueueBufferRef& buffer) override;
    void allowLateSilence() override { lateSilence_ = true; }
    std::int32_t freeBuffer(const AudioQueueBufferRef& buffer) override;
    std::int32_t addIsRunningListener(IsRunningListener listener) override;
    std::int32_t removeIsRunningListener() override;
    std::int32_t start() override;
    std::int32_t stop() override;
    std::int32_t dispose() override;

    /// The process has played `frames` more frames, up to now.
    void hear(std::uint32_t frames);
    /// Hands a buffer over as if it had come from the server: with these bytes and this stamp, the format's packets
    /// or `packets` of them with `descriptions`. False where no buffer is enqueued or the queue does not run.
    bool deliver(const Data& bytes, std::uint64_t hostTime, std::optional<std::uint32_t> packets = {},
                 std::vector<AudioPacketDescription> descriptions = {});

    ProcessID process() const;
    bool isRunning() const;
    bool isDisposed() const;
    std::size_t allocatedBuffers() const;
    std::size_t enqueuedBuffers() const;
    std::uint32_t bufferBytes() const;  ///< of the first buffer ever allocated
    bool hasListener() const;
    bool mayBeLateWithSilence() const { return lateSilence_; }
    SerialQueue& lane() { return *lane_; }

private:
    std::int32_t checkLocked(const char* call) const;
    /// What hands the buffer over, for the queue's lane: submitted when the lock has been released.
    [[nodiscard]] Task handOverLocked(AudioQueueBufferRef buffer, const AudioTimeStamp& start, std::uint32_t packets,
                                      std::vector<AudioPacketDescription> descriptions);
    /// Fills buffers; what hands them over is for the lane.
    void fill(std::uint32_t frames, std::vector<Task>& tasks);
    void tellRunning();

    const std::shared_ptr<FakeSoundSettings> settings_;
    AudioFormat format_;
    const std::shared_ptr<SerialQueue> lane_;
    std::atomic<bool> lateSilence_{false};

    mutable std::mutex mutex_;
    InputCallback callback_;
    IsRunningListener listener_;
    std::shared_ptr<CaptureClock> clock_;
    ProcessID pid_{0};
    bool running_ = false, disposed_ = false, cameBack_ = false;
    std::uint64_t run_ = 0;
    std::uint64_t samples_ = 0;
    std::uint32_t bufferBytes_ = 0;
    std::vector<AudioQueueBufferRef> allocated_;
    std::vector<const AudioQueueBuffer*> handedOver_;
    std::deque<AudioQueueBufferRef> enqueued_;
    std::deque<AudioQueueBufferRef> filled_;  ///< submitted to the lane, and still the queue's
};

/// A failing call ("AudioInputQueues.makeInputQueue") makes a queue that refuses everything with kNoResources.
class FakeAudioInputQueues final : public AudioInputQueues {
public:
    FakeAudioInputQueues(Scheduler& scheduler, Clock& clock, FaultPlan& faults)
        : settings_(std::shared_ptr<FakeSoundSettings>(new FakeSoundSettings{scheduler, clock, faults, {}, {}, {}})) {}

    Made makeInputQueue(const AudioFormat& format, AudioInputQueue::InputCallback callback,
                        std::uint32_t flags) override;

    /// From now on this process plays this byte, over and over; 0 is silence.
    void play(ProcessID pid, std::uint8_t byte);
    void setMaximumPacketSize(std::uint32_t bytes) { settings_->maximumPacketSize = bytes; }
    /// Every running queue has heard `frames` more frames, up to now.
    void hear(std::uint32_t frames);
    /// Every running queue hears all the time, a buffer each `milliseconds`, on a timer of the scheduler.
    void hearAllTheTime(int milliseconds);
    /// The queues that live, oldest first.
    std::vector<std::shared_ptr<FakeAudioInputQueue>> queues() const;
    /// The newest one that lives, or null.
    std::shared_ptr<FakeAudioInputQueue> lastQueue() const;
    /// How many were ever made, and the flags of the last.
    std::uint64_t made() const;
    std::uint32_t lastFlags() const;

private:
    const std::shared_ptr<FakeSoundSettings> settings_;
    mutable std::mutex mutex_;
    std::vector<std::weak_ptr<FakeAudioInputQueue>> queues_;
    std::uint64_t made_ = 0;
    std::uint32_t lastFlags_ = 0;
    std::unique_ptr<Timer> timer_;
};

}  // namespace lumacast
