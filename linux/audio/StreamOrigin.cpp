#include "linux/audio/StreamOrigin.h"

#include <algorithm>

namespace lumacast::sound {

namespace {

HostTime earlierOf(HostTime one, HostTime other) { return HostTime{std::min(one.nanoseconds, other.nanoseconds)}; }

}  // namespace

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
