#include "linux/display/Turn.h"

#include <libyuv/rotate_argb.h>

#include <algorithm>

namespace lumacast::x11 {
namespace {

// A tile's rows stay in the nearest cache while they are read column by column: a third of the time.
constexpr std::int32_t kTileRows = 32, kTileColumns = 128;

}  // namespace

void turnCounterclockwise(const std::uint8_t* from, std::size_t fromStride, std::uint8_t* to, std::size_t toStride,
                          std::int32_t width, std::int32_t height) {
    for (std::int32_t top = 0; top < height; top += kTileRows) {
        const std::int32_t rows = std::min(kTileRows, height - top);
        for (std::int32_t left = 0; left < width; left += kTileColumns) {
            const std::int32_t columns = std::min(kTileColumns, width - left);
            libyuv::ARGBRotate(
                from + static_cast<std::size_t>(top) * fromStride + static_cast<std::size_t>(left) * 4,
                static_cast<int>(fromStride),
                to + static_cast<std::size_t>(width - left - columns) * toStride + static_cast<std::size_t>(top) * 4,
                static_cast<int>(toStride), columns, rows, libyuv::kRotateCounterClockwise);
        }
    }
}

}  // namespace lumacast::x11
