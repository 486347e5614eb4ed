#pragma once
// Rational time stamps.

#include <cstdint>

namespace lumacast {

/// A time of `value` ticks at `timescale` ticks a second. Plain data: this is also its layout in memory handed to
/// clients (value int64, timescale int32, flags uint32, epoch int64; 24 bytes).
struct MediaTime {
    static constexpr std::uint32_t kValid = 1u << 0;
    static constexpr std::uint32_t kRounded = 1u << 1;
    static constexpr std::uint32_t kPositiveInfinity = 1u << 2;
    static constexpr std::uint32_t kNegativeInfinity = 1u << 3;
    static constexpr std::uint32_t kIndefinite = 1u << 4;

    std::int64_t value = 0;
    std::int32_t timescale = 0;
    std::uint32_t flags = 0;
    std::int64_t epoch = 0;  ///< always 0 in this system

    /// A valid time of `value` ticks.
    static constexpr MediaTime make(std::int64_t value, std::int32_t timescale) {
        return {value, timescale, kValid, 0};
    }

    /// The nearest tick to `seconds`, halves away from zero. Seconds that are not finite give the infinities or the
    /// indefinite time; seconds beyond the range of ticks give an infinity; a timescale below 1 the invalid time.
    static MediaTime fromSeconds(double seconds, std::int32_t timescale);

    constexpr bool isValid() const { return (flags & kValid) != 0; }

    /// value / timescale. 0 for a timescale of 0 and for invalid and indefinite times; the infinities for infinite
    /// ones.
    double seconds() const;
};
static_assert(sizeof(MediaTime) == 24);

inline constexpr MediaTime kInvalidMediaTime{};
inline constexpr MediaTime kZeroMediaTime = MediaTime::make(0, 1);

/// -1, 0 or +1. Negative infinity < finite < indefinite < positive infinity; every time whose valid bit is clear equals
/// the invalid time and is unequal to (and above) every valid one. Finite times are compared exactly.
int compare(const MediaTime& a, const MediaTime& b);

/// Exact sums and differences. The result has the operands' timescale, or their least common multiple where that fits
/// 32 bits, otherwise the larger of the two, rounded and flagged so. An invalid operand gives the invalid time;
/// infinities win over finite times, and opposite infinities give the indefinite time.
MediaTime add(const MediaTime& a, const MediaTime& b);
MediaTime subtract(const MediaTime& a, const MediaTime& b);

struct MediaTimeRange {
    MediaTime start;
    MediaTime duration;
};

}  // namespace lumacast
