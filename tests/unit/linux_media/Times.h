#pragma once
// Spans of time in these tests.

#include <cstdint>

namespace lumacast::testing {

inline constexpr std::int64_t kMillisecond = 1'000'000, kSecond = 1'000'000'000;  // nanoseconds
inline constexpr std::int64_t kTick = 1000;                                          // of a file's picture track, nanoseconds

}  // namespace lumacast::testing
