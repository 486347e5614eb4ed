#pragma once
// Colours of test windows: 0xRRGGBB, far from each other, so that a turned or shifted picture is noticed.

#include <cstdint>

namespace lumacast::test {

inline constexpr std::uint32_t kRed = 0xC01020, kGreen = 0x10B030, kBlue = 0x2030D0;

}  // namespace lumacast::test
