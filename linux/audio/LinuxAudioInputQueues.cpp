#include "linux/audio/LinuxAudioInputQueues.h"

#include "linux/audio/LinuxAudioInputQueue.h"
#include "linux/audio/TapFormat.h"
#include "platform/RefusedAudioInputQueue.h"

namespace lumacast {

AudioInputQueues::Made LinuxAudioInputQueues::makeInputQueue(const AudioFormat& format,
                                                             AudioInputQueue::InputCallback callback,
                                                             std::uint32_t flags) {
    const auto refused = [](std::int32_t status) {
        return Made{status, std::make_shared<RefusedAudioInputQueue>(status)};
    };
    if (flags != kCaptureProcessOutput) return refused(AudioStatus::kBadFlags);
    const auto whole = sound::completed(format);
    if (!whole) return refused(AudioStatus::kBadFormat);
    auto core = std::make_shared<TapCore>(TapServices{source_, clock_}, *whole, std::move(callback));
    return {AudioStatus::kSuccess, std::make_shared<LinuxAudioInputQueue>(std::move(core))};
}

}  // namespace lumacast
