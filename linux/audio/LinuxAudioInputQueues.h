#pragma once
#include <memory>

#include "linux/audio/TapSource.h"
#include "platform/AudioInputQueue.h"
#include "platform/Clock.h"

namespace lumacast {

/// Taps of what a source knows processes to play. Callable from any lane; waits for nobody.
class LinuxAudioInputQueues final : public AudioInputQueues {
public:
    /// `clock` outlives this and every queue.
    LinuxAudioInputQueues(std::shared_ptr<sound::TapSource> source, Clock& clock) : source_(std::move(source)), clock_(clock) {}

    /// Ends the source, which queues may outlive.
    ~LinuxAudioInputQueues() override { source_->end(); }
    LinuxAudioInputQueues(const LinuxAudioInputQueues&) = delete;
    LinuxAudioInputQueues& operator=(const LinuxAudioInputQueues&) = delete;

    Made makeInputQueue(const AudioFormat& format, AudioInputQueue::InputCallback callback,
                        std::uint32_t flags) override;

private:
    const std::shared_ptr<sound::TapSource> source_;
    Clock& clock_;
};

}  // namespace lumacast
