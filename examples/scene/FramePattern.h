#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>

#include "examples/scene/Picture.h"

/// The frame number as black and white cells, made to survive a low bit rate and scaling to half.
///
/// The pattern fills the lowest fifth of the picture over its whole width. Horizontally it is divided into 19 units:
/// half a unit of black, 18 cells, half a unit of black. Vertically into 3 units: half a unit of black, 2 rows of
/// cells, half a unit of black. The first and last cell of the upper row are white and those of the lower row black:
/// they give the two levels, and a picture upside down is refused. The 16 cells between hold, most significant bit
/// first, white = 1:
///   upper row: bits 23..8 of the number;  lower row: bits 7..0 of the number, then its CRC-8.
/// The CRC has the polynomial x^8 + x^2 + x + 1, initial value 0xFF, no reflection, over the three bytes of the number.
namespace lumacast::scene {

/// Numbers wrap at 24 bits.
inline constexpr std::uint32_t kFrameNumberMask = 0xFFFFFF;

/// The part of a picture that the pattern occupies.
[[nodiscard]] Rect framePatternArea(int width, int height);

/// The part of it that changes while only the number's lowest eight bits change: the lower row of cells.
[[nodiscard]] Rect framePatternLowerRow(int width, int height);

/// Draws the lowest 24 bits of `number`. Pure, any lane.
void drawFrameNumber(const Picture& picture, std::uint32_t number);

/// Reads the number back from a luma plane (8 bits, full or limited range) of any size. None when a cell is neither
/// clearly black nor clearly white (two pictures mixed, a smeared pattern), when the frame around the cells isn't
/// quiet, or when the checksum is wrong. Pure, any lane.
[[nodiscard]] std::optional<std::uint32_t> readFrameNumber(const std::uint8_t* luma, int width, int height,
                                                           std::size_t stride);

/// The checksum of a number's lowest 24 bits.
[[nodiscard]] std::uint8_t frameNumberChecksum(std::uint32_t number);

}  // namespace lumacast::scene
