// The daemon without ears: the same in everything but its taps, which run and hear nothing. What compare_sound measures the
// daemon against.

#include <cstdlib>
#include <memory>
#include <mutex>

#include "daemon/Process.h"

namespace {

using namespace lumacast;

/// A tap that says that it runs, and never fills a buffer.
class DeafQueue final : public AudioInputQueue, public std::enable_shared_from_this<DeafQueue> {
public:
    DeafQueue(Scheduler& scheduler, const AudioFormat& format) : scheduler_(scheduler), format_(format) {}

    std::int32_t setProcessTap(ProcessID) override { return AudioStatus::kSuccess; }
    std::int32_t streamFormat(AudioFormat& format) const override {
        format = format_;
        return AudioStatus::kSuccess;
    }
    std::int32_t maximumOutputPacketSize(std::uint32_t& bytes) const override {
        bytes = format_.bytesPerPacket;
        return AudioStatus::kSuccess;
    }
    std::int32_t allocateBuffer(std::uint32_t bytes, AudioQueueBufferRef& buffer) override {
        buffer = std::make_shared<AudioQueueBuffer>();
        buffer->bytes.resize(bytes);
        return AudioStatus::kSuccess;
    }
    std::int32_t enqueueBuffer(const AudioQueueBufferRef&) override { return AudioStatus::kSuccess; }
    std::int32_t freeBuffer(const AudioQueueBufferRef&) override { return AudioStatus::kSuccess; }
    std::int32_t addIsRunningListener(IsRunningListener listener) override {
        const std::lock_guard lock(mutex_);
        listener_ = std::move(listener);
        return AudioStatus::kSuccess;
    }
    std::int32_t removeIsRunningListener() override {
        IsRunningListener old;
        const std::lock_guard lock(mutex_);
        std::swap(old, listener_);
        return AudioStatus::kSuccess;
    }
    std::int32_t start() override {
        scheduler_.globalQueue(QueuePriority::Default).async([self = shared_from_this()] {
            IsRunningListener listener;
            {
                const std::lock_guard lock(self->mutex_);
                listener = self->listener_;
            }
            if (listener) listener();
        });
        return AudioStatus::kSuccess;
    }
    std::int32_t stop() override { return AudioStatus::kSuccess; }
    std::int32_t dispose() override { return AudioStatus::kSuccess; }

private:
    Scheduler& scheduler_;
    const AudioFormat format_;
    std::mutex mutex_;
    IsRunningListener listener_;
};

class DeafQueues final : public AudioInputQueues {
public:
    explicit DeafQueues(Scheduler& scheduler) : scheduler_(scheduler) {}
    Made makeInputQueue(const AudioFormat& format, AudioInputQueue::InputCallback, std::uint32_t) override {
        return {AudioStatus::kSuccess, std::make_shared<DeafQueue>(scheduler_, format)};
    }

private:
    Scheduler& scheduler_;
};

Platform withQueues(const Platform& other, AudioInputQueues& queues) {
    return {other.log, other.scheduler, other.clock, other.ipc, other.bundles, other.renderServer, other.appStateMonitor,
            other.displayCapture, other.displayCloneControl, queues, other.deviceCapture, other.containerWriters,
            other.movieExporters, other.photoLibrary, other.fileSystem, other.preferences, other.deviceInfo,
            other.telemetry, other.keepAlive, other.admin, other.storagePurge,
            other.userAlerts, other.systemSounds, other.screenReader, other.storeLookup, other.networkReachability,
            other.appExtensions, other.keyedArchive};
}

}  // namespace

int main() {
    const auto owner = makePlatform();
    if (!owner) return EXIT_FAILURE;
    DeafQueues queues(owner->platform().scheduler);
    const Platform platform = withQueues(owner->platform(), queues);
    Process process(platform);
    process.start();
    platform.scheduler.runMainLoop();
    return -1;
}
