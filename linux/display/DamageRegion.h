#pragma once
// Sets of rectangles: what has changed. Pure.

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>

#include "writer/media/PixelBuffer.h"

namespace lumacast::x11 {

bool isEmpty(const PixelRect& rect);
bool contains(const PixelRect& outer, const PixelRect& inner);
PixelRect intersection(const PixelRect& a, const PixelRect& b);
/// The smallest rectangle around both; the other one when one is empty.
PixelRect bounds(const PixelRect& a, const PixelRect& b);
std::int64_t area(const PixelRect& rect);

/// What has changed, as few rectangles: it covers everything that was added and possibly more (near rectangles are
/// merged), never less. A value without memory of its own; not thread-safe.
class DamageRegion {
public:
    static constexpr std::size_t kMaximumRects = 12;

    void add(PixelRect rect);
    void add(const DamageRegion& other);
    void clear() { count_ = 0; }

    bool empty() const { return count_ == 0; }
    std::span<const PixelRect> rects() const { return {rects_.data(), count_}; }
    /// Whether every pixel of `rect` is in the region.
    bool covers(const PixelRect& rect) const;

private:
    void remove(std::size_t index) { rects_[index] = rects_[--count_]; }
    std::size_t cheapestPartner(const PixelRect& rect) const;

    std::array<PixelRect, kMaximumRects> rects_{};
    std::size_t count_ = 0;
};

}  // namespace lumacast::x11
