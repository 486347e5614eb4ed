#pragma once
// Pictures turned by a quarter. Pure.

#include <cstddef>
#include <cstdint>

namespace lumacast::x11 {

/// How a picture goes into a frame.
enum class Turn : bool {
    None,
    Counterclockwise,  ///< its right edge becomes the frame's top; turned clockwise again, it is upright
};

/// Copies a picture of width x height 32-bit pixels, turned by a quarter counterclockwise: it is height x width then,
/// and the pixel (x, y) at (y, width - 1 - x). `fromStride` and `toStride` are bytes from one row to the next; the two
/// pictures don't overlap.
void turnCounterclockwise(const std::uint8_t* from, std::size_t fromStride, std::uint8_t* to, std::size_t toStride,
                          std::int32_t width, std::int32_t height);

}  // namespace lumacast::x11
