#include "linux/display/Turn.h"

#include <libyuv/rotate_argb.h>

#include <algorithm>

namespace lumacast::x11 {
namespace {

// So many rows at a time: their pieces stay in the nearest cache while they are read column by column.
constexpr std::int32_t kBand = 32;

}  // namespace

void turnCounterclockwise(const std::uint8_t* from, std::size_t fromStride, std::uint8_t* to, std::size_t toStride,
                          std::int32_t width, std::int32_t height) {
    for (std::int32_t top = 0; top < height; top += kBand) {
        const std::int32_t rows = std::min(kBand, height - top);
        libyuv::ARGBRotate(from + static_cast<std::size_t>(top) * fromStride, static_cast<int>(fromStride),
                           to + static_cast<std::size_t>(top) * 4, static_cast<int>(toStride), width, rows,
                           libyuv::kRotateCounterClockwise);
    }
}

}  // namespace lumacast::x11
