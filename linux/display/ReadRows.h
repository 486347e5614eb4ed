#pragma once
// Rows of a picture that the display server keeps, into shared memory.

#include <xcb/xcb.h>

#include <cstdint>
#include <span>

#include "linux/display/DamageRegion.h"
#include "linux/display/SharedMemory.h"
#include "linux/display/X11Connection.h"

namespace lumacast::x11 {

/// Rows of a picture, over its full width.
struct Strip {
    std::int32_t y = 0, height = 0;
};

/// Whether every row was read, and the number of the last request that read some (0 when there was none).
struct RowsRead {
    bool complete = false;
    std::uint32_t lastRequest = 0;
};

/// Reads strips, DamageRegion::kMaximumRects at most, of `part` of the drawable; each is written where it
/// is in a picture with rows of the part's width and nothing between them. All requests go out
/// before the first answer is waited for.
RowsRead readRows(X11Connection& connection, xcb_drawable_t drawable, const PixelRect& part, const SharedMemory& memory,
                  std::span<const Strip> strips);

/// Request numbers wrap around.
inline bool before(std::uint32_t a, std::uint32_t b) {
    return static_cast<std::int32_t>(a - b) < 0;
}

}  // namespace lumacast::x11
