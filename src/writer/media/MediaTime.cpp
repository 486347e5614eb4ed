#include "writer/media/MediaTime.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <numeric>

namespace lumacast {

namespace {

constexpr std::uint32_t kNotFinite =
    MediaTime::kPositiveInfinity | MediaTime::kNegativeInfinity | MediaTime::kIndefinite;

/// GCC and Clang both have it; pedantic mode wants to be told that this is on purpose.
__extension__ typedef __int128 Wide;

constexpr MediaTime special(std::uint32_t flag) { return {0, 0, MediaTime::kValid | flag, 0}; }

/// Order among the special kinds: where a time stands before its value is looked at.
int rank(const MediaTime& time) {
    if (!time.isValid()) return 4;
    if (time.flags & MediaTime::kNegativeInfinity) return 0;
    if (time.flags & MediaTime::kIndefinite) return 2;
    if (time.flags & MediaTime::kPositiveInfinity) return 3;
    return 1;
}

Wide divideRounding(Wide number, Wide by) {
    const Wide half = by / 2;
    return number >= 0 ? (number + half) / by : -((-number + half) / by);
}

MediaTime sum(const MediaTime& a, const MediaTime& b, int sign) {
    if (!a.isValid() || !b.isValid()) return kInvalidMediaTime;
    if ((a.flags | b.flags) & kNotFinite) {
        const auto direction = [](const MediaTime& time, int factor) {
            return factor * (time.flags & MediaTime::kPositiveInfinity   ? 1
                             : time.flags & MediaTime::kNegativeInfinity ? -1
                                                                         : 0);
        };
        const int total = direction(a, 1) + direction(b, sign);
        if ((a.flags | b.flags) & MediaTime::kIndefinite || total == 0) return special(MediaTime::kIndefinite);
        return special(total > 0 ? MediaTime::kPositiveInfinity : MediaTime::kNegativeInfinity);
    }
    const Wide scaleA = std::max(a.timescale, 1), scaleB = std::max(b.timescale, 1);
    const Wide multiple =
        scaleA / std::gcd(static_cast<std::int64_t>(scaleA), static_cast<std::int64_t>(scaleB)) * scaleB;
    const bool exact = multiple <= std::numeric_limits<std::int32_t>::max();
    const Wide scale = exact ? multiple : std::max(scaleA, scaleB);
    // Two 95-bit products; their sum stays below 2^97.
    const Wide valueA = exact ? a.value * (scale / scaleA) : divideRounding(a.value * scale, scaleA);
    const Wide valueB = exact ? b.value * (scale / scaleB) : divideRounding(b.value * scale, scaleB);
    const Wide value = valueA + sign * valueB;
    if (value > std::numeric_limits<std::int64_t>::max()) return special(MediaTime::kPositiveInfinity);
    if (value < std::numeric_limits<std::int64_t>::min()) return special(MediaTime::kNegativeInfinity);
    const std::uint32_t rounded = ((a.flags | b.flags) & MediaTime::kRounded) | (exact ? 0 : MediaTime::kRounded);
    return {static_cast<std::int64_t>(value), static_cast<std::int32_t>(scale), MediaTime::kValid | rounded, 0};
}

}  // namespace

MediaTime MediaTime::fromSeconds(double seconds, std::int32_t timescale) {
    if (timescale < 1) return kInvalidMediaTime;
    if (std::isnan(seconds)) return special(kIndefinite);
    const double ticks = std::round(seconds * timescale);  // halves away from zero
    constexpr double kLimit = 9223372036854775808.0;       // 2^63
    if (ticks >= kLimit) return special(kPositiveInfinity);
    if (ticks < -kLimit) return special(kNegativeInfinity);
    const bool rounded = ticks != seconds * timescale;
    return {static_cast<std::int64_t>(ticks), timescale, kValid | (rounded ? kRounded : 0), 0};
}

double MediaTime::seconds() const {
    if (!isValid() || (flags & kIndefinite)) return 0.0;
    if (flags & kPositiveInfinity) return std::numeric_limits<double>::infinity();
    if (flags & kNegativeInfinity) return -std::numeric_limits<double>::infinity();
    return timescale == 0 ? 0.0 : static_cast<double>(value) / timescale;
}

int compare(const MediaTime& a, const MediaTime& b) {
    const int rankA = rank(a), rankB = rank(b);
    if (rankA != rankB) return rankA < rankB ? -1 : 1;
    if (rankA != 1) return 0;
    const Wide left = static_cast<Wide>(a.value) * std::max(b.timescale, 1);
    const Wide right = static_cast<Wide>(b.value) * std::max(a.timescale, 1);
    return left < right ? -1 : left > right ? 1 : 0;
}

MediaTime add(const MediaTime& a, const MediaTime& b) { return sum(a, b, 1); }
MediaTime subtract(const MediaTime& a, const MediaTime& b) { return sum(a, b, -1); }

}  // namespace lumacast
