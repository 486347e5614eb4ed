#pragma once
// Which part of which plane is out of date. Pure.

#include <cstddef>
#include <vector>

#include "linux/display/DamageRegion.h"

namespace lumacast::x11 {

/// Planes take turns, so each holds an older picture: everything that changes is noted for each of them and for the
/// picture that was delivered last. Not thread-safe.
class DamageTracker {
public:
    DamageTracker(std::size_t planes, std::int32_t width, std::int32_t height)
        : whole_{0, 0, width, height}, stale_(planes) {
        addAll();
    }

    /// `rect` of the picture has changed; what lies outside of it is cut off.
    void add(const PixelRect& rect) {
        const PixelRect inside = intersection(rect, whole_);
        for (DamageRegion& region : stale_) region.add(inside);
        sinceDelivery_.add(inside);
    }
    void addAll() { add(whole_); }

    /// What has to be read before the plane holds the current picture.
    const DamageRegion& ofPlane(std::size_t plane) const { return stale_[plane]; }
    /// What differs from the picture that was delivered last; the whole picture before the first.
    const DamageRegion& sinceDelivery() const { return sinceDelivery_; }

    /// Its memory is given back; whatever it is next holds nothing yet.
    void planeIsGone(std::size_t plane) { stale_[plane].add(whole_); }
    void planeIsCurrent(std::size_t plane) { stale_[plane].clear(); }
    void delivered() { sinceDelivery_.clear(); }
    /// The next picture goes to somebody who has seen none.
    void nothingDelivered() { sinceDelivery_.add(whole_); }

private:
    const PixelRect whole_;
    std::vector<DamageRegion> stale_;
    DamageRegion sinceDelivery_;
};

}  // namespace lumacast::x11
