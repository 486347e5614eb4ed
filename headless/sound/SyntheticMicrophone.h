#pragma once
#include <atomic>
#include <memory>

#include "linux/audio/TapSource.h"

namespace lumacast::headless {

/// A microphone that hears a steady tone, other than those of the applications. Openings of it are independent of one
/// another; each has a thread of its own. Thread-safe.
class SyntheticMicrophone final {
public:
    static constexpr double kTone = 440;  ///< Hz
    static constexpr double kAmplitude = 0.3;

    std::unique_ptr<sound::Listening> open(sound::MicrophoneListener listener) const;
    /// While it is taken, as by a call, it is interrupted and nothing is heard of it.
    void setTaken(bool isTaken) { *isTaken_ = isTaken; }

private:
    const std::shared_ptr<std::atomic<bool>> isTaken_ = std::make_shared<std::atomic<bool>>(false);
};

}  // namespace lumacast::headless
