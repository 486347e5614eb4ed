#pragma once
// The encoding settings of a recording's movie.

#include <cstdint>

#include "broadcast/LCBroadcastConfiguration.h"
#include "platform/Platform.h"

namespace lumacast {

/// The average bit rate of the picture for a window of this size, in bits per second: by the device's class and the
/// window's size, or what the preference "LCBitRateOverride" says.
std::int64_t averageVideoBitRate(const Preferences& preferences, const DeviceInfo& device, Size windowSize);

/// A length in pixels as the encoder takes it: truncated, then rounded up to the next even number.
double evenLength(double pixels);

/// The settings of the picture track. Logs the bit rate, and whether `config` brings compression properties of its own,
/// which are merged over ours.
Dictionary videoSettings(const Platform& platform, Size windowSize,
                         const std::optional<LCBroadcastConfiguration>& config);

/// The settings of both sound tracks: AAC, stereo, 44.1 kHz, 128 kbit/s.
Dictionary audioSettings();

}  // namespace lumacast
