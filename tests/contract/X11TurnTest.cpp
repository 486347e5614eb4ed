#include <gtest/gtest.h>

#include <random>
#include <utility>
#include <vector>

#include "linux/display/Fit.h"
#include "linux/display/Turn.h"

namespace lumacast::x11 {
namespace {

struct Buffer {
    Buffer(std::int32_t ofWidth, std::int32_t ofHeight, std::int32_t spare)
        : width(ofWidth),
          height(ofHeight),
          stride(ofWidth + spare),
          pixels(static_cast<std::size_t>(stride) * static_cast<std::size_t>(height), 0xDEADBEEF) {}
    std::uint32_t& at(std::int32_t x, std::int32_t y) {
        return pixels[static_cast<std::size_t>(y) * static_cast<std::size_t>(stride) + static_cast<std::size_t>(x)];
    }
    std::uint8_t* bytes(std::int32_t x, std::int32_t y) { return reinterpret_cast<std::uint8_t*>(&at(x, y)); }
    std::size_t strideBytes() const { return static_cast<std::size_t>(stride) * 4; }

    std::int32_t width, height, stride;
    std::vector<std::uint32_t> pixels;
};

TEST(X11Turn, PutsEveryPixelInItsPlaceAndWritesNoOther) {
    std::mt19937 random(3);
    for (const auto& [width, height] : {std::pair{1, 1},
                                        {1, 9},
                                        {9, 1},
                                        {3, 2},
                                        {4, 4},
                                        {8, 8},
                                        {16, 33},
                                        {33, 16},
                                        {67, 131},
                                        {131, 67},
                                        {64, 64},
                                        {65, 63},
                                        {200, 100}}) {
        Buffer from(width, height, 5), to(height, width, 3);
        for (std::uint32_t& pixel : from.pixels) pixel = static_cast<std::uint32_t>(random());
        Buffer expected = to;
        for (std::int32_t y = 0; y < height; ++y)
            for (std::int32_t x = 0; x < width; ++x) expected.at(y, width - 1 - x) = from.at(x, y);
        turnCounterclockwise(from.bytes(0, 0), from.strideBytes(), to.bytes(0, 0), to.strideBytes(), width, height);
        EXPECT_EQ(to.pixels, expected.pixels) << width << "x" << height;
    }
}

// Only what changed, again and again, gives the picture that turning the whole gives.
TEST(X11Turn, TurnsPartsJustAsItTurnsTheWhole) {
    std::mt19937 random(4);
    const auto below = [&](int limit) { return static_cast<int>(random() % static_cast<unsigned>(limit)); };
    const Fit turned = fit(203, 117, 117, 203, Turn::Counterclockwise);
    ASSERT_TRUE(turned.exact());
    Buffer screen(203, 117, 0), frame(117, 203, 11), whole(117, 203, 11);
    for (std::uint32_t& pixel : screen.pixels) pixel = 0;
    turnCounterclockwise(screen.bytes(0, 0), screen.strideBytes(), frame.bytes(0, 0), frame.strideBytes(), 203, 117);
    for (int change = 0; change < 2000; ++change) {
        const int x = below(203), y = below(117);
        const PixelRect rect{x, y, 1 + below(203 - x), 1 + below(117 - y)};
        for (std::int32_t row = rect.y; row < rect.y + rect.height; ++row)
            for (std::int32_t column = rect.x; column < rect.x + rect.width; ++column)
                screen.at(column, row) = static_cast<std::uint32_t>(random());
        const PixelRect place = turned.toFrame(rect);
        EXPECT_EQ(turned.upright(place), rect);
        turnCounterclockwise(screen.bytes(rect.x, rect.y), screen.strideBytes(), frame.bytes(place.x, place.y),
                             frame.strideBytes(), rect.width, rect.height);
    }
    turnCounterclockwise(screen.bytes(0, 0), screen.strideBytes(), whole.bytes(0, 0), whole.strideBytes(), 203, 117);
    EXPECT_EQ(frame.pixels, whole.pixels);
}

TEST(X11Turn, FitsThePictureIntoTheFrameTurnedBack) {
    const Fit half = fit(1920, 1080, 540, 960, Turn::Counterclockwise);
    EXPECT_EQ(half.target, (PixelRect{0, 0, 960, 540}));
    EXPECT_EQ(half.toFrame({0, 0, 1920, 1080}), (PixelRect{0, 0, 540, 960}));
    // A portrait picture in a frame that is turned: black on its sides, which are the frame's top and bottom.
    const Fit portrait = fit(300, 400, 300, 400, Turn::Counterclockwise);
    EXPECT_EQ(portrait.target, (PixelRect{87, 0, 225, 300}));
    EXPECT_EQ(portrait.turned(portrait.target), (PixelRect{0, 88, 300, 225}));
}

}  // namespace
}  // namespace lumacast::x11
