#pragma once
#include "platform/AudioInputQueue.h"

namespace lumacast {

/// The queue that could not be made: every operation answers why.
class RefusedAudioInputQueue final : public AudioInputQueue {
public:
    explicit RefusedAudioInputQueue(std::int32_t status) : status_(status) {}

    std::int32_t setProcessTap(ProcessID) override { return status_; }
    std::int32_t streamFormat(AudioFormat&) const override { return status_; }
    std::int32_t maximumOutputPacketSize(std::uint32_t&) const override { return status_; }
    std::int32_t allocateBuffer(std::uint32_t, AudioQueueBufferRef&) override { return status_; }
    std::int32_t enqueueBuffer(const AudioQueueBufferRef&) override { return status_; }
    std::int32_t freeBuffer(const AudioQueueBufferRef&) override { return status_; }
    std::int32_t addIsRunningListener(IsRunningListener) override { return status_; }
    std::int32_t removeIsRunningListener() override { return status_; }
    std::int32_t start() override { return status_; }
    std::int32_t stop() override { return status_; }
    std::int32_t dispose() override { return status_; }

private:
    const std::int32_t status_;
};

}  // namespace lumacast
