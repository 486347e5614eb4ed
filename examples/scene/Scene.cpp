#include "examples/scene/Scene.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <numbers>

#include "examples/scene/Digits.h"
#include "examples/scene/FramePattern.h"

namespace lumacast::scene {
namespace {

constexpr int kRainbows = 8;
constexpr int kTextLength = 21;  // 12:34:56.789#00000123
constexpr std::uint32_t kFooterColour = 0x101820;
constexpr std::uint32_t kTextColour = 0xF0F0F0;
constexpr std::uint32_t kSmallBallColour = 0xFF9020;

struct Ball {
    int speedX, speedY;    // steps per frame, in thousandths of the room
    int offsetX, offsetY;  // where it is in frame 0, in thousandths
    int size;              // radius in thousandths of the scene's height
    std::uint32_t colour;
};

constexpr std::array<Ball, 5> kBalls{{{7, 11, 0, 100, 110, 0xE83030},
                                      {5, 8, 900, 400, 80, 0x30C050},
                                      {11, 5, 300, 700, 60, 0x3060F0},
                                      {13, 17, 600, 0, 45, 0xF8E040},
                                      {3, 4, 1500, 1200, 140, 0xC050E0}}};

// Goes from 0 to `room` and back while step runs from 0 to 2000.
int bounce(std::uint32_t step, int room) {
    const int place = static_cast<int>(step % 2000);
    return static_cast<int>(static_cast<long long>(place <= 1000 ? place : 2000 - place) * room / 1000);
}

std::uint32_t colourOf(double red, double green, double blue) {
    const auto byte = [](double value) { return static_cast<std::uint32_t>(std::clamp(value, 0.0, 1.0) * 255 + 0.5); };
    return byte(red) << 16 | byte(green) << 8 | byte(blue);
}

// A hue that runs once round the circle while position goes from 0 to 1.
std::uint32_t hue(double position, double brightness) {
    const auto channel = [&](double shift) {
        return brightness * (0.55 + 0.45 * std::cos(2 * std::numbers::pi * (position + shift)));
    };
    return colourOf(channel(0), channel(1 / 3.0), channel(2 / 3.0));
}

void drawBall(const Picture& picture, int centreX, int centreY, int radius, std::uint32_t colour) {
    for (int dy = -radius; dy <= radius; ++dy) {
        const int half = static_cast<int>(std::sqrt(static_cast<double>(radius * radius - dy * dy)));
        // The upper third is lit, the rest plain.
        const std::uint32_t shade = dy < -radius / 3 ? (colour >> 1 & 0x7F7F7F) + 0x7F7F7F : colour;
        std::fill_n(picture.row(centreY + dy) + centreX - half, 2 * half + 1, shade);
    }
}

}  // namespace

Scene::Scene(int width, int height, Motion motion)
    : width_(std::max(width, kMinimumWidth)),
      height_(std::max(height, kMinimumHeight)),
      motion_(motion),
      unit_(std::min(width_ / kMinimumWidth, height_ / kMinimumHeight)),
      stripTop_(framePatternArea(width_, height_).y),
      footer_{0, stripTop_ - 11 * unit_, width_, 11 * unit_},
      plateSize_(std::min(width_, height_) / 3) {
    for (int index = 0; index < kRainbows; ++index) {
        std::vector<std::uint32_t> line(static_cast<std::size_t>(width_) * 2);
        const double brightness = 0.65 + 0.35 * std::sin(2 * std::numbers::pi * index / kRainbows);
        for (int x = 0; x < 2 * width_; ++x) line[static_cast<std::size_t>(x)] = hue(x / double(width_), brightness);
        rainbows_.push_back(std::move(line));
    }
    plate_.resize(static_cast<std::size_t>(plateSize_) * static_cast<std::size_t>(plateSize_));
    for (int y = 0; y < plateSize_; ++y) {
        for (int x = 0; x < plateSize_; ++x) {
            // Rings that get finer outwards, down to about four pixels.
            const double dx = x - plateSize_ / 2.0, dy = y - plateSize_ / 2.0;
            const double wave = 0.5 + 0.5 * std::cos(std::numbers::pi * (dx * dx + dy * dy) / (2.0 * plateSize_));
            plate_[static_cast<std::size_t>(y * plateSize_ + x)] = colourOf(wave, wave, 0.3 + 0.7 * wave);
        }
    }
}

std::vector<Rect> Scene::draw(const Picture& picture, std::uint32_t number, const WallTime& time, Mark mark) {
    const bool whole = motion_ == Motion::Everywhere || drawnInto_ != picture.pixels || drawnMark_ != mark;
    const bool upperRowChanged = (drawnNumber_ ^ number) >> 8 != 0;
    drawnInto_ = picture.pixels;
    drawnNumber_ = number;
    drawnMark_ = mark;
    if (whole) {
        const std::uint32_t phase = motion_ == Motion::Everywhere ? number : 0;
        drawBackground(picture, phase, {0, 0, width_, footer_.y});
        drawZonePlate(picture);
        drawBalls(picture, phase);
        if (mark == Mark::Border) drawMark(picture, footer_.y);
    }
    drawFooter(picture, number, time);
    drawFrameNumber(picture, number);
    if (whole) return {{0, 0, width_, height_}};
    return {footer_, upperRowChanged ? framePatternArea(width_, height_) : framePatternLowerRow(width_, height_)};
}

void Scene::drawBackground(const Picture& picture, std::uint32_t phase, const Rect& area) const {
    const auto width = static_cast<std::uint32_t>(width_);
    const std::uint32_t step = std::max(1U, width / 320);
    const auto band = static_cast<std::uint32_t>(std::max(1, height_ / 48));
    for (int y = area.y; y < area.y + area.height; ++y) {
        const auto line = static_cast<std::uint32_t>(y);
        const std::size_t shift = (phase * step + line / 2) % width;
        const auto& rainbow = rainbows_[(line + phase * step) / band % kRainbows];
        std::memcpy(picture.row(y) + area.x, rainbow.data() + shift, static_cast<std::size_t>(area.width) * 4);
    }
}

void Scene::drawZonePlate(const Picture& picture) const {
    const int left = width_ - plateSize_ - width_ / 20;
    const int top = height_ / 15;
    for (int y = 0; y < plateSize_; ++y)
        std::memcpy(picture.row(top + y) + left, plate_.data() + static_cast<std::size_t>(y * plateSize_),
                    static_cast<std::size_t>(plateSize_) * 4);
}

void Scene::drawBalls(const Picture& picture, std::uint32_t phase) const {
    const int roomY = footer_.y;
    for (const Ball& ball : kBalls) {
        const int radius = std::max(2, ball.size * std::min(roomY, width_) / 1000);
        const auto step = [&](int offset, int speed) {
            return static_cast<std::uint32_t>(offset) + phase * static_cast<std::uint32_t>(speed);
        };
        const int x = radius + bounce(step(ball.offsetX, ball.speedX), width_ - 1 - 2 * radius);
        const int y = radius + bounce(step(ball.offsetY, ball.speedY), roomY - 1 - 2 * radius);
        drawBall(picture, x, y, radius, ball.colour);
    }
}

void Scene::drawFooter(const Picture& picture, std::uint32_t number, const WallTime& time) const {
    for (int y = footer_.y; y < footer_.y + footer_.height; ++y) std::fill_n(picture.row(y), width_, kFooterColour);
    std::array<char, 64> text{};
    std::snprintf(text.data(), text.size(), "%02d:%02d:%02d.%03d#%08u", time.hour, time.minute, time.second,
                  time.millisecond, number & kFrameNumberMask);
    drawDigits(picture, 2 * unit_, footer_.y + 2 * unit_, unit_, std::string_view(text.data(), kTextLength),
               kTextColour);
    const int radius = 4 * unit_;
    const int left = (kTextLength * kGlyphAdvance + 4) * unit_ + radius;
    drawBall(picture, left + bounce(number * 20, width_ - 1 - radius - left), footer_.y + footer_.height / 2, radius,
             kSmallBallColour);
}

}  // namespace lumacast::scene
