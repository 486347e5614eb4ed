#include "headless/display/Painter.h"

#include <algorithm>
#include <chrono>
#include <ctime>

#include "examples/scene/FramePattern.h"
#include "headless/Show.h"

namespace lumacast::headless {

namespace {

scene::WallTime wallTime() {
    const auto now = std::chrono::system_clock::now();
    const std::time_t seconds = std::chrono::system_clock::to_time_t(now);
    const auto whole = std::chrono::time_point_cast<std::chrono::milliseconds>(now).time_since_epoch().count();
    std::tm local{};
    ::localtime_r(&seconds, &local);
    return {local.tm_hour, local.tm_min, local.tm_sec, static_cast<int>(whole % 1000)};
}

void fill(const scene::Picture& picture, const scene::Rect& rect, std::uint32_t colour) {
    for (int y = rect.y; y < std::min(rect.y + rect.height, picture.height); ++y)
        for (int x = rect.x; x < std::min(rect.x + rect.width, picture.width); ++x) picture.row(y)[x] = colour;
}

}  // namespace

std::uint32_t colourOf(ContextID window) {
    // Neighbouring numbers are far apart; neither black nor white.
    const std::uint32_t mixed = (number(window) + 1) * 2654435761U;
    return (mixed >> 8 & 0x7F7F7F) + 0x404040;
}

Painter::Painter(std::int32_t width, std::int32_t height, x11::Turn turn)
    : width_(turn == x11::Turn::None ? width : height), height_(turn == x11::Turn::None ? height : width), turn_(turn) {
    if (width_ >= scene::kMinimumWidth && height_ >= scene::kMinimumHeight)
        scene_.emplace(width_, height_, scene::Motion::Everywhere);
    if (turn_ == x11::Turn::Counterclockwise)
        upright_.resize(static_cast<std::size_t>(width_) * static_cast<std::size_t>(height_));
}

void Painter::paint(PlaneMemory& memory, std::int64_t number, const std::vector<std::uint32_t>& colours) {
    if (turn_ == x11::Turn::None)
        return paintUpright({memory.pixels(), width_, height_, memory.stride()}, number, colours);
    const std::size_t stride = static_cast<std::size_t>(width_) * sizeof(std::uint32_t);
    auto* const pixels = reinterpret_cast<std::uint8_t*>(upright_.data());
    paintUpright({pixels, width_, height_, stride}, number, colours);
    x11::turnCounterclockwise(pixels, stride, memory.pixels(), memory.stride(), width_, height_);
}

void Painter::paintUpright(const scene::Picture& picture, std::int64_t number,
                           const std::vector<std::uint32_t>& colours) {
    if (!scene_) return fill(picture, {0, 0, picture.width, picture.height}, colours.front());
    scene_->draw(picture, static_cast<std::uint32_t>(number) & scene::kFrameNumberMask, wallTime(),
                 Show::isMarked(number) ? scene::Mark::Border : scene::Mark::None);
    const int side = picture.height / 8;
    int left = side;
    for (const std::uint32_t colour : colours) {
        fill(picture, {left, side, side, side}, colour);
        left += 2 * side;
    }
}

}  // namespace lumacast::headless
