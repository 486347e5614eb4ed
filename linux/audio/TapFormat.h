#pragma once
// The formats a tap delivers.

#include <cstdint>
#include <optional>
#include <span>

#include "writer/media/AudioFormat.h"

namespace lumacast::sound {

/// The format with what follows from its other fields, or none for one that no queue delivers (see
/// AudioInputQueues::makeInputQueue).
std::optional<AudioFormat> completed(AudioFormat format);

/// Writes samples (full scale is 1; what is beyond is limited to it) in a format that completed() answered. `bytes` has
/// room for all of them.
void writePcm(const AudioFormat& format, std::span<const float> samples, std::uint8_t* bytes);

}  // namespace lumacast::sound
