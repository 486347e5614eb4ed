#pragma once
// The clocks of the movies that these tests write.

#include <cstdint>

#include "linux/media/mp4/TrackDescription.h"

namespace lumacast::mp4 {

inline constexpr std::int64_t kSecond = kDefaultVideoTimescale;  // of a picture track, ticks
inline constexpr std::int64_t kRate = 48000;                     // of a sound track, frames a second

}  // namespace lumacast::mp4
