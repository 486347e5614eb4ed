#pragma once
#include <memory>

#include "linux/audio/PulseConnection.h"
#include "linux/audio/TapOwner.h"
#include "platform/AudioInputQueue.h"
#include "platform/Clock.h"

namespace lumacast {

/// Taps at the user's sound server, PulseAudio or PipeWire. Callable from any lane; waits for nobody.
class LinuxAudioInputQueues final : public AudioInputQueues {
public:
    /// `clock` outlives this and every queue. `applicationOf` is asked on the sound thread whether a descendant of a
    /// tapped process counts as it; empty: none does.
    LinuxAudioInputQueues(std::shared_ptr<sound::PulseConnection> connection, Clock& clock,
                          sound::ApplicationOf applicationOf)
        : connection_(std::move(connection)), clock_(clock), applicationOf_(std::move(applicationOf)) {}

    /// Ends the connection, for whoever else uses it too: from then on nobody is asked anything.
    ~LinuxAudioInputQueues() override { connection_->end(); }
    LinuxAudioInputQueues(const LinuxAudioInputQueues&) = delete;
    LinuxAudioInputQueues& operator=(const LinuxAudioInputQueues&) = delete;

    Made makeInputQueue(const AudioFormat& format, AudioInputQueue::InputCallback callback,
                        std::uint32_t flags) override;

private:
    const std::shared_ptr<sound::PulseConnection> connection_;
    Clock& clock_;
    const sound::ApplicationOf applicationOf_;
};

}  // namespace lumacast
