#include "linux/display/Arrangement.h"

#include <gtest/gtest.h>

namespace lumacast::x11 {
namespace {

Arrangement::Part part(std::size_t index, PixelRect place, bool visible = true) {
    return {index, place, 1, visible};
}

TEST(Arrangement, EnclosesItsPartsAsFarAsTheyAreOnTheScreen) {
    const PixelRect screen{0, 0, 800, 600};
    Arrangement some{{part(0, {100, 50, 30, 20}), part(1, {200, 10, 5, 300}, false)}, {}};
    some.enclose(screen);
    EXPECT_EQ(some.box, (PixelRect{100, 10, 105, 300})) << "a hidden one keeps its place";
    some.parts.push_back(part(2, {-50, 580, 60, 100}));
    some.parts.push_back(part(3, {900, 700, 60, 100}));
    some.enclose(screen);
    EXPECT_EQ(some.box, (PixelRect{0, 10, 205, 590}));
    some.parts = {part(3, {900, 700, 60, 100})};
    some.enclose(screen);
    EXPECT_TRUE(isEmpty(some.box));
}

TEST(Arrangement, KnowsWhatOneVisibleWindowAboveCovers) {
    const Arrangement some{{part(0, {0, 0, 100, 100}), part(1, {20, 20, 20, 20}), part(2, {0, 0, 90, 90}, false)}, {}};
    EXPECT_TRUE(some.isCovered(0, {20, 20, 20, 20}));
    EXPECT_TRUE(some.isCovered(0, {25, 30, 3, 3}));
    EXPECT_FALSE(some.isCovered(0, {19, 20, 3, 3}));
    EXPECT_FALSE(some.isCovered(0, {60, 60, 3, 3})) << "a hidden one covers nothing";
    EXPECT_FALSE(some.isCovered(1, {20, 20, 20, 20})) << "nor does one below, or itself";
}

TEST(Arrangement, BeginsWithTheHighestThatCoversEverything) {
    const Arrangement some{{part(0, {0, 0, 100, 100}), part(1, {20, 20, 20, 20}), part(2, {0, 0, 90, 90}, false)}, {}};
    EXPECT_EQ(some.floorOf({20, 20, 20, 20}), 1u);
    EXPECT_EQ(some.floorOf({20, 20, 21, 20}), 0u);
    EXPECT_EQ(some.floorOf({90, 90, 11, 11}), 3u) << "none";
}

}  // namespace
}  // namespace lumacast::x11
