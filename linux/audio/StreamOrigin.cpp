#include "linux/audio/StreamOrigin.h"

#include <algorithm>
#include <cmath>

namespace lumacast::sound {

namespace {

/// In microseconds; what a server says beyond it is nonsense.
constexpr std::uint64_t kLongestLatency = 10'000'000, kLongestAge = 60'000'000;
/// Years of sound, at any rate.
constexpr std::int64_t kMostFrames = std::int64_t{1} << 44;

HostTime earlierOf(HostTime one, HostTime other) { return HostTime{std::min(one.nanoseconds, other.nanoseconds)}; }

std::int64_t nanosecondsOf(std::uint64_t microseconds, std::uint64_t most) {
    return static_cast<std::int64_t>(std::min(microseconds, most)) * 1000;
}

}  // namespace

HostTime momentOf(HostTime origin, std::int64_t frame, double rate) {
    const auto since = static_cast<double>(std::clamp<std::int64_t>(frame, 0, kMostFrames)) / rate;
    return HostTime{origin.nanoseconds + std::llround(since * 1e9)};
}

HostTime originBy(const StreamAccount& account, double rate) {
    const std::int64_t counted = momentOf(HostTime{}, account.frames, rate).nanoseconds;
    return HostTime{account.now.nanoseconds - nanosecondsOf(account.age, kLongestAge) - counted -
                    nanosecondsOf(account.latency, kLongestLatency) + nanosecondsOf(account.delay, kLongestLatency)};
}

void StreamOrigin::take(HostTime now, HostTime origin) {
    if (!earliest_) windowBegan_ = now;
    if (now.nanoseconds - windowBegan_.nanoseconds >= kWindow) {
        earliestBefore_ = earliest_;
        earliest_.reset();
        windowBegan_ = now;
    }
    earliest_ = earliest_ ? earlierOf(*earliest_, origin) : origin;
}

std::optional<HostTime> StreamOrigin::origin() const {
    if (!earliest_ || !earliestBefore_) return earliest_;
    return earlierOf(*earliest_, *earliestBefore_);
}

}  // namespace lumacast::sound
