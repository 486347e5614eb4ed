#include "examples/scene/Digits.h"

#include <algorithm>
#include <array>
#include <cstddef>

namespace lumacast::scene {
namespace {

// Seven rows of five bits each, the leftmost pixel in bit 4.
using Glyph = std::array<std::uint8_t, kGlyphHeight>;

constexpr std::array<Glyph, 13> kGlyphs{{
    {0x0E, 0x11, 0x13, 0x15, 0x19, 0x11, 0x0E},  // 0
    {0x04, 0x0C, 0x04, 0x04, 0x04, 0x04, 0x0E},  // 1
    {0x0E, 0x11, 0x01, 0x02, 0x04, 0x08, 0x1F},  // 2
    {0x1F, 0x02, 0x04, 0x02, 0x01, 0x11, 0x0E},  // 3
    {0x02, 0x06, 0x0A, 0x12, 0x1F, 0x02, 0x02},  // 4
    {0x1F, 0x10, 0x1E, 0x01, 0x01, 0x11, 0x0E},  // 5
    {0x06, 0x08, 0x10, 0x1E, 0x11, 0x11, 0x0E},  // 6
    {0x1F, 0x01, 0x02, 0x04, 0x08, 0x08, 0x08},  // 7
    {0x0E, 0x11, 0x11, 0x0E, 0x11, 0x11, 0x0E},  // 8
    {0x0E, 0x11, 0x11, 0x0F, 0x01, 0x02, 0x0C},  // 9
    {0x00, 0x04, 0x04, 0x00, 0x04, 0x04, 0x00},  // :
    {0x00, 0x00, 0x00, 0x00, 0x00, 0x0C, 0x0C},  // .
    {0x0A, 0x0A, 0x1F, 0x0A, 0x1F, 0x0A, 0x0A},  // #
}};

const Glyph* glyphFor(char character) {
    constexpr std::string_view kOrder = "0123456789:.#";
    const std::size_t place = kOrder.find(character);
    return place == std::string_view::npos ? nullptr : &kGlyphs[place];
}

}  // namespace

void drawDigits(const Picture& picture, int x, int y, int scale, std::string_view text, std::uint32_t colour) {
    for (const char character : text) {
        const Glyph* glyph = glyphFor(character);
        for (int row = 0; glyph != nullptr && row < kGlyphHeight * scale; ++row) {
            std::uint32_t* line = picture.row(y + row);
            for (int column = 0; column < 5; ++column)
                if (((*glyph)[static_cast<std::size_t>(row / scale)] >> (4 - column) & 1) != 0)
                    std::fill_n(line + x + column * scale, scale, colour);
        }
        x += kGlyphAdvance * scale;
    }
}

}  // namespace lumacast::scene
