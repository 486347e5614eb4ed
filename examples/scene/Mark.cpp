#include "examples/scene/Mark.h"

#include <algorithm>

namespace lumacast::scene {
namespace {

constexpr std::uint32_t kWhite = 0xFFFFFF;
constexpr int kPart = 20;           // of the height
constexpr int kLeastLuma = 190;     // white is 235 or 255, the brightest of the scene's background about 150
constexpr double kWhiteShare = 0.95;  // of the pixels, what a low bit rate leaves

int thickness(int height) {
    return std::max(2, height / kPart);
}

}  // namespace

void drawMark(const Picture& picture, int bottom) {
    const int border = thickness(picture.height);
    for (int y = 0; y < std::min(bottom, picture.height); ++y) {
        std::uint32_t* const row = picture.row(y);
        if (y < border) {
            std::fill_n(row, picture.width, kWhite);
        } else {
            std::fill_n(row, border, kWhite);
            std::fill_n(row + picture.width - border, border, kWhite);
        }
    }
}

bool hasMark(const std::uint8_t* luma, int width, int height, std::size_t stride) {
    if (luma == nullptr || width < 1 || height < kPart) return false;
    const int border = thickness(height);
    const int first = border / 4, end = std::max(first + 1, border * 3 / 4);
    std::int64_t white = 0;
    for (int y = first; y < end; ++y)
        for (int x = 0; x < width; ++x)
            white += luma[static_cast<std::size_t>(y) * stride + static_cast<std::size_t>(x)] >= kLeastLuma ? 1 : 0;
    return static_cast<double>(white) >= kWhiteShare * width * (end - first);
}

}  // namespace lumacast::scene
