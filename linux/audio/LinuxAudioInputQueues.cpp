#include "linux/audio/LinuxAudioInputQueues.h"

#include "platform/RefusedAudioInputQueue.h"

namespace lumacast {

AudioInputQueues::Made LinuxAudioInputQueues::makeInputQueue(const AudioFormat&, AudioInputQueue::InputCallback,
                                                             std::uint32_t) {
    return {AudioStatus::kNoResources, std::make_shared<RefusedAudioInputQueue>(AudioStatus::kNoResources)};
}

}  // namespace lumacast
