#pragma once
// Which part of a canvas shows what. Pure.

#include <cstddef>
#include <cstdint>
#include <vector>

#include "linux/display/DamageRegion.h"

namespace lumacast::x11 {

/// Windows one above the other, and the part of the screen that shows them all. All rectangles are in the screen's
/// coordinates.
struct Arrangement {
    /// One window: `index` is whatever the owner knows it by.
    struct Part {
        std::size_t index = 0;
        PixelRect place;
        std::uint64_t layout = 0;  ///< of the window's own picture
        bool visible = false;      ///< a hidden one keeps its place, which shows what is below
        bool operator==(const Part&) const = default;
    };
    std::vector<Part> parts;  ///< the lowest first; none that was never visible
    PixelRect box;            ///< around all parts, as far as they are on the screen; empty when none is
    bool operator==(const Arrangement&) const = default;

    /// The box around the parts there are.
    void enclose(const PixelRect& screen);
    /// Whether a visible window above the part covers all of `rect`.
    bool isCovered(std::size_t part, const PixelRect& rect) const;
    /// The lowest part that can be seen in `rect`: the highest that covers all of it, else parts.size(), and then what
    /// no window covers is black.
    std::size_t floorOf(const PixelRect& rect) const;
};

}  // namespace lumacast::x11
