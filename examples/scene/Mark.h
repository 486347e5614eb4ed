#pragma once

#include <cstddef>
#include <cstdint>

#include "examples/scene/Picture.h"

/// The mark on a frame: a white border that people and machines see at once. It runs along the top of the picture and
/// down both sides as far as `bottom`; at the top it is one twentieth of the picture's height, at the sides as wide.
namespace lumacast::scene {

enum class Mark { None, Border };

/// Draws the border down to row `bottom`. Pure, any lane.
void drawMark(const Picture& picture, int bottom);

/// Whether a luma plane (8 bits, full or limited range, any size) has the border, read from its middle half along the
/// top: white everywhere, which nothing else in the scene is there. Pure, any lane.
[[nodiscard]] bool hasMark(const std::uint8_t* luma, int width, int height, std::size_t stride);

}  // namespace lumacast::scene
