#pragma once

#include <cstdint>
#include <string_view>

#include "examples/scene/Picture.h"

namespace lumacast::scene {

/// A glyph is 5 x 7 units with one unit of space to its right; a unit is `scale` pixels.
inline constexpr int kGlyphAdvance = 6;
inline constexpr int kGlyphHeight = 7;

/// Draws digits, ':', '.' and '#' (anything else is a space) with the top left corner of the first at (x, y). The text
/// must lie within the picture. Pure, any lane.
void drawDigits(const Picture& picture, int x, int y, int scale, std::string_view text, std::uint32_t colour);

}  // namespace lumacast::scene
