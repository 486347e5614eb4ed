#pragma once
#include <atomic>
#include <memory>
#include <mutex>

#include "platform/DeviceCapture.h"

namespace lumacast::sound {

/// An audio data output: hands samples to its delegate on the delegate's queue. Thread-safe.
class DeviceAudioOutput final : public CaptureOutput, public std::enable_shared_from_this<DeviceAudioOutput> {
public:
    /// Samples that wait for the delegate, at most: some two seconds of them. Later ones are dropped.
    static constexpr int kMostWaiting = 100;

    void setSampleBufferDelegate(std::weak_ptr<CaptureOutputDelegate> delegate,
                                 std::shared_ptr<SerialQueue> queue) override;
    /// Returns at once. Nothing without a delegate.
    void deliver(SampleRef sample);

private:
    std::mutex mutex_;
    std::weak_ptr<CaptureOutputDelegate> delegate_;
    std::shared_ptr<SerialQueue> queue_;
    std::atomic<int> waiting_{0};
};

}  // namespace lumacast::sound
