#pragma once
// Frames of sound, and when they were heard.

#include <cmath>
#include <cstdint>

#include "base/Date.h"

namespace lumacast::sound {

/// Counts frames from a moment: frame n is what was heard n / rate seconds after `origin`. A value.
struct SoundTimeline {
    HostTime origin;
    double rate = 44100;  ///< frames per second

    HostTime momentOf(std::int64_t frame) const {
        return HostTime{origin.nanoseconds + std::llround(static_cast<double>(frame) / rate * 1e9)};
    }
    std::int64_t frameAt(HostTime moment) const {
        return static_cast<std::int64_t>(
            std::floor(static_cast<double>(moment.nanoseconds - origin.nanoseconds) * rate / 1e9));
    }
};

}  // namespace lumacast::sound
