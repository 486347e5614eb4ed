#include "linux/display/Fit.h"

#include <gtest/gtest.h>

namespace lumacast::x11 {
namespace {

TEST(Fit, CopiesWhenTheSizesAreEqual) {
    const Fit same = fit(1279, 719, 1279, 719);
    EXPECT_TRUE(same.exact());
    EXPECT_EQ(same.toFrame({3, 4, 5, 6}), (PixelRect{3, 4, 5, 6}));
}

TEST(Fit, FillsTheFrameWhenTheShapeIsTheSame) {
    const Fit half = fit(1920, 1080, 1280, 720);
    EXPECT_FALSE(half.exact());
    EXPECT_EQ(half.target, (PixelRect{0, 0, 1280, 720}));
}

TEST(Fit, KeepsTheShapeAndCentres) {
    EXPECT_EQ(fit(1000, 500, 1280, 720).target, (PixelRect{0, 40, 1280, 640}));
    EXPECT_EQ(fit(500, 1000, 1280, 720).target, (PixelRect{460, 0, 360, 720}));
}

TEST(Fit, NeverVanishes) {
    EXPECT_EQ(fit(30000, 1, 100, 100).target.height, 1);
    EXPECT_EQ(fit(1, 30000, 100, 100).target.width, 1);
}

TEST(Fit, MapsDamageWithTheReachOfTheFilterAndStaysInside) {
    const Fit half = fit(200, 200, 100, 100);
    const PixelRect mapped = half.toFrame({100, 100, 2, 2});
    EXPECT_LE(mapped.x, 49);
    EXPECT_GE(mapped.x + mapped.width, 52);
    EXPECT_EQ(half.toFrame({0, 0, 200, 200}), (PixelRect{0, 0, 100, 100}));
    EXPECT_EQ(half.toFrame({10, 10, 0, 5}), PixelRect{});
}

}  // namespace
}  // namespace lumacast::x11
