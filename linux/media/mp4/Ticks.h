#pragma once

#include <cstdint>

namespace lumacast::mp4 {

inline constexpr std::uint32_t kNanosecondTimescale = 1'000'000'000;

// `ticks` of `from` per second as ticks of `to` per second, to the nearest, halves upwards. Neither timescale may be 0.
// Exact without wider integers: whole seconds and the rest are converted apart. The result fits while the time is below
// 2^31 seconds.
[[nodiscard]] constexpr std::int64_t rescale(std::int64_t ticks, std::uint32_t from, std::uint32_t to) {
    const auto scale = static_cast<std::int64_t>(from);
    std::int64_t seconds = ticks / scale;
    std::int64_t rest = ticks % scale;
    if (rest < 0) {
        rest += scale;
        seconds -= 1;
    }
    const std::uint64_t product = static_cast<std::uint64_t>(rest) * to;
    const std::uint64_t whole = product / from;
    const std::uint64_t remainder = product % from;
    const std::uint64_t rounded = whole + (remainder >= from - remainder ? 1 : 0);
    return seconds * static_cast<std::int64_t>(to) + static_cast<std::int64_t>(rounded);
}

}  // namespace lumacast::mp4
