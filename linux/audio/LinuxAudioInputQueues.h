#pragma once
#include "platform/AudioInputQueue.h"

namespace lumacast {

/// There is no tap yet: every queue is refused.
class LinuxAudioInputQueues final : public AudioInputQueues {
public:
    Made makeInputQueue(const AudioFormat& format, AudioInputQueue::InputCallback callback,
                        std::uint32_t flags) override;
};

}  // namespace lumacast
