#pragma once
// Pictures turned by a quarter. Pure.

#include <cstddef>
#include <cstdint>

#include "platform/DisplayCapture.h"

namespace lumacast::x11 {

/// How a picture goes into a frame.
enum class Turn : bool {
    None,
    Counterclockwise,  ///< its right edge becomes the frame's top; turned clockwise again, it is upright
};

/// What turns such a frame upright again.
inline std::uint32_t transformFlagsOf(Turn turn) {
    return turn == Turn::Counterclockwise ? std::uint32_t{kRotateClockwise} : 0;
}

/// Copies a picture of width x height 32-bit pixels, turned by a quarter counterclockwise: it is height x width then,
/// and the pixel (x, y) at (y, width - 1 - x). `fromStride` and `toStride` are bytes from one row to the next; the two
/// pictures don't overlap.
void turnCounterclockwise(const std::uint8_t* from, std::size_t fromStride, std::uint8_t* to, std::size_t toStride,
                          std::int32_t width, std::int32_t height);

}  // namespace lumacast::x11
