#include "linux/display/DamageRegion.h"

#include <algorithm>
#include <limits>

namespace lumacast::x11 {
namespace {

// Two rectangles are read as one when that costs at most this many pixels that nobody changed: a request to the display
// server costs about as much.
constexpr std::int64_t kCheapWaste = 16 * 1024;

std::int64_t waste(const PixelRect& a, const PixelRect& b) { return area(bounds(a, b)) - area(a) - area(b); }

bool coveredBy(const PixelRect& rect, std::span<const PixelRect> rects) {
    if (isEmpty(rect)) return true;
    if (rects.empty()) return false;
    const auto rest = rects.subspan(1);
    const PixelRect shared = intersection(rect, rects.front());
    if (isEmpty(shared)) return coveredBy(rect, rest);
    const std::int32_t right = shared.x + shared.width, bottom = shared.y + shared.height;
    const std::array<PixelRect, 4> around{
        PixelRect{rect.x, rect.y, rect.width, shared.y - rect.y},
        PixelRect{rect.x, bottom, rect.width, rect.y + rect.height - bottom},
        PixelRect{rect.x, shared.y, shared.x - rect.x, shared.height},
        PixelRect{right, shared.y, rect.x + rect.width - right, shared.height},
    };
    return std::all_of(around.begin(), around.end(), [&](const PixelRect& part) { return coveredBy(part, rest); });
}

}  // namespace

bool isEmpty(const PixelRect& rect) { return rect.width <= 0 || rect.height <= 0; }

std::int64_t area(const PixelRect& rect) {
    return isEmpty(rect) ? 0 : static_cast<std::int64_t>(rect.width) * rect.height;
}

bool contains(const PixelRect& outer, const PixelRect& inner) {
    return inner.x >= outer.x && inner.y >= outer.y && inner.x + inner.width <= outer.x + outer.width &&
           inner.y + inner.height <= outer.y + outer.height;
}

PixelRect intersection(const PixelRect& a, const PixelRect& b) {
    const std::int32_t x = std::max(a.x, b.x), y = std::max(a.y, b.y);
    const PixelRect rect{x, y, std::min(a.x + a.width, b.x + b.width) - x,
                         std::min(a.y + a.height, b.y + b.height) - y};
    return isEmpty(rect) ? PixelRect{} : rect;
}

PixelRect bounds(const PixelRect& a, const PixelRect& b) {
    if (isEmpty(a)) return b;
    if (isEmpty(b)) return a;
    const std::int32_t x = std::min(a.x, b.x), y = std::min(a.y, b.y);
    return {x, y, std::max(a.x + a.width, b.x + b.width) - x, std::max(a.y + a.height, b.y + b.height) - y};
}

std::size_t DamageRegion::cheapestPartner(const PixelRect& rect) const {
    std::size_t best = 0;
    std::int64_t least = std::numeric_limits<std::int64_t>::max();
    for (std::size_t i = 0; i < count_; ++i) {
        const std::int64_t cost = waste(rect, rects_[i]);
        if (cost < least) least = cost, best = i;
    }
    return best;
}

void DamageRegion::add(PixelRect rect) {
    if (isEmpty(rect)) return;
    // Each turn swallows one rectangle, so this ends.
    while (count_ > 0) {
        const std::size_t partner = cheapestPartner(rect);
        if (contains(rects_[partner], rect)) return;
        if (count_ < kMaximumRects && waste(rect, rects_[partner]) > kCheapWaste) break;
        rect = bounds(rect, rects_[partner]);
        remove(partner);
    }
    rects_[count_++] = rect;
}

void DamageRegion::add(const DamageRegion& other) {
    if (&other == this) return;
    for (const PixelRect& rect : other.rects()) add(rect);
}

bool DamageRegion::covers(const PixelRect& rect) const { return coveredBy(rect, rects()); }

}  // namespace lumacast::x11
