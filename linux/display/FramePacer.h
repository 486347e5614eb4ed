#pragma once
// When the next frame may be taken. Pure: times come in.

#include <algorithm>
#include <cstdint>
#include <limits>

#include "writer/media/MediaTime.h"

namespace lumacast::x11 {

/// Keeps frames the minimum interval apart without losing one of a steady stream. Each frame has a slot; the next slot
/// begins one interval after the later of this slot and this frame. A frame may come up to half an interval before its
/// slot, so that one that came late doesn't push all later ones back: in the long run frames are never faster than the
/// interval, and two never closer than half of it. All times are nanoseconds of one steady clock. Not thread-safe.
class FramePacer {
public:
    static constexpr std::int64_t kNever = std::numeric_limits<std::int64_t>::max();
    /// A still picture is repeated before the second is over, however late the machine wakes us.
    static constexpr std::int64_t kRepeatAfter = 900'000'000;

    explicit FramePacer(std::int64_t interval) : interval_(std::max<std::int64_t>(interval, 1)) {}
    /// Intervals as a source may be asked for, within what makes sense: a millisecond to an hour.
    explicit FramePacer(const MediaTime& interval)
        : FramePacer(static_cast<std::int64_t>(std::clamp(interval.seconds(), 0.001, 3600.0) * 1e9)) {}

    /// The next frame is due at once.
    void restart() {
        last_ = kNever;
        slot_ = std::numeric_limits<std::int64_t>::min();
    }

    /// The earliest time for a frame with something new.
    std::int64_t nextChange() const { return last_ == kNever ? slot_ : slot_ - interval_ / 2; }
    /// When the current picture is to be repeated; never before the first frame.
    std::int64_t nextRepeat() const { return last_ == kNever ? kNever : last_ + std::max(kRepeatAfter, interval_); }

    /// A frame was taken, or given up.
    void taken(std::int64_t now) {
        slot_ = std::max(now, slot_) + interval_;
        last_ = now;
    }

    std::int64_t interval() const { return interval_; }

private:
    std::int64_t interval_;
    std::int64_t last_ = kNever;
    std::int64_t slot_ = std::numeric_limits<std::int64_t>::min();
};

}  // namespace lumacast::x11
