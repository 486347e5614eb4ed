#include "linux/display/Fit.h"

#include <algorithm>
#include <utility>

#include "linux/display/DamageRegion.h"

namespace lumacast::x11 {
namespace {

// a * b / c, to the nearest, at least 1.
std::int32_t scaled(std::int32_t a, std::int32_t b, std::int32_t c) {
    return static_cast<std::int32_t>(std::max<std::int64_t>(1, (2 * static_cast<std::int64_t>(a) * b + c) / (2 * c)));
}

// First and last pixel (exclusive) of the frame touched by [at, at + length) of the source. A scaler's filter reaches
// one source pixel to each side, and its rounding one pixel of the frame.
struct Span {
    std::int32_t begin, end;
};
Span touched(std::int32_t at, std::int32_t length, std::int32_t source, std::int32_t frame) {
    const std::int64_t begin = (static_cast<std::int64_t>(at) - 1) * frame / source - 1;
    const std::int64_t end = (static_cast<std::int64_t>(at) + length + 1) * frame / source + 2;
    return {static_cast<std::int32_t>(std::clamp<std::int64_t>(begin, 0, frame)),
            static_cast<std::int32_t>(std::clamp<std::int64_t>(end, 0, frame))};
}

}  // namespace

Fit fit(std::int32_t sourceWidth, std::int32_t sourceHeight, std::int32_t frameWidth, std::int32_t frameHeight,
        Turn turn) {
    if (turn == Turn::Counterclockwise) std::swap(frameWidth, frameHeight);
    const std::int64_t wide = static_cast<std::int64_t>(sourceWidth) * frameHeight;
    const std::int64_t high = static_cast<std::int64_t>(frameWidth) * sourceHeight;
    PixelRect target{0, 0, frameWidth, frameHeight};
    if (wide > high) {
        target.height = scaled(sourceHeight, frameWidth, sourceWidth);
        target.y = (frameHeight - target.height) / 2;
    } else if (wide < high) {
        target.width = scaled(sourceWidth, frameHeight, sourceHeight);
        target.x = (frameWidth - target.width) / 2;
    }
    return {sourceWidth, sourceHeight, target, turn, frameWidth};
}

PixelRect Fit::toFrame(const PixelRect& rect) const {
    if (isEmpty(rect)) return {};
    if (exact()) return turned(rect);
    const Span x = touched(rect.x, rect.width, sourceWidth, target.width);
    const Span y = touched(rect.y, rect.height, sourceHeight, target.height);
    return turned({target.x + x.begin, target.y + y.begin, x.end - x.begin, y.end - y.begin});
}

PixelRect Fit::turned(const PixelRect& rect) const {
    if (turn == Turn::None) return rect;
    return {rect.y, uprightWidth - rect.x - rect.width, rect.height, rect.width};
}

PixelRect Fit::upright(const PixelRect& rect) const {
    if (turn == Turn::None) return rect;
    return {uprightWidth - rect.y - rect.height, rect.x, rect.height, rect.width};
}

}  // namespace lumacast::x11
