#include "linux/audio/DeviceAudioOutput.h"

#include <utility>

namespace lumacast::sound {

void DeviceAudioOutput::setSampleBufferDelegate(std::weak_ptr<CaptureOutputDelegate> delegate,
                                                std::shared_ptr<SerialQueue> queue) {
    // What is replaced is let go of after the lock.
    const std::lock_guard lock(mutex_);
    delegate_.swap(delegate);
    queue_.swap(queue);
}

void DeviceAudioOutput::deliver(SampleRef sample) {
    std::weak_ptr<CaptureOutputDelegate> delegate;
    std::shared_ptr<SerialQueue> queue;
    {
        const std::lock_guard lock(mutex_);
        delegate = delegate_;
        queue = queue_;
    }
    if (!queue || delegate.expired()) return;
    if (waiting_.fetch_add(1) >= kMostWaiting) {
        --waiting_;
        return;
    }
    queue->async([self = shared_from_this(), delegate = std::move(delegate), sample = std::move(sample)] {
        --self->waiting_;
        if (const auto told = delegate.lock()) told->captureOutputDidOutputSampleBuffer(self, sample);
    });
}

}  // namespace lumacast::sound
