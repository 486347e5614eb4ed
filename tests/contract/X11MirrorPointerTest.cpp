// The pointer on a mirrored screen.

#include <gtest/gtest.h>

#include <utility>

#include "tests/contract/Colours.h"
#include "tests/contract/MirrorWorld.h"

namespace lumacast::test {
namespace {

using Frames = CapturedFrames::Frames;
using PointerLook = TestScreen::PointerLook;

TEST_F(LandscapeMirror, DrawsThePointerWithWhatShinesThrough) {
    const auto made = start(400, 300);
    ASSERT_TRUE(shows(screen.withoutPointer()));
    PointerLook look{4, 3, 1, 2, {}};
    look.pixels = {0xFF0000FF, 0x80402000, 0x00000000, 0xFFFFFFFF, 0x40404040, 0x01000000,
                   0x7F7F0000, 0xFF123456, 0x00000000, 0xFE00FE00, 0x80808080, 0xFF000000};
    screen.movePointer(200, 100);
    screen.setPointer(look);
    EXPECT_TRUE(shows(screen.withPointer(look, 200, 100)));
    EXPECT_EQ(upright(frames->frames().back()).at(199, 98), 0x0000FFu);
    EXPECT_EQ(upright(frames->frames().back()).at(201, 98), kRed);
}

TEST_F(LandscapeMirror, FollowsThePointerThoughNothingElseChanges) {
    const PointerLook look = TestScreen::square(12, 0xFF00FF00);
    screen.setPointer(look);
    const auto made = start(400, 300);
    ASSERT_TRUE(shows(screen.withPointer(look, 0, 0)));
    for (const auto& [x, y] : {std::pair{50, 60}, {399, 299}, {0, 299}, {55, 65}, {60, 65}}) {
        const std::size_t before = frames->count();
        screen.movePointer(x, y);
        ASSERT_TRUE(shows(screen.withPointer(look, x, y))) << x << "," << y;
        EXPECT_EQ(frames->frames()[before].transformFlags, kRotateClockwise);
    }
    // What of it lies beyond the edge is nowhere else.
    screen.movePointer(398, 100);
    back.paintPart({0, 90, 30, 30}, 0x2030D0);
    ASSERT_TRUE(shows(screen.withPointer(look, 398, 100)));
    // Where it was, and where it is.
    frames->clear();
    screen.movePointer(300, 100);
    ASSERT_TRUE(frames->waitFor([](const Frames& got) { return !got.empty() && !got.back().damage.empty(); }));
    const auto damage = frames->frames().back().damage;
    std::int64_t pixels = 0;
    for (const PixelRect& rect : damage) pixels += std::int64_t{rect.width} * rect.height;
    EXPECT_GE(pixels, 2 * 12 * 12);
    EXPECT_LT(pixels, 400 * 300) << "and no more than around both";
}

TEST_F(LandscapeMirror, FollowsThePointersShapeAndItsEnd) {
    PointerLook look = TestScreen::square(12, 0xFF00FF00);
    const auto made = start(400, 300);
    screen.movePointer(100, 100);
    screen.setPointer(look);
    ASSERT_TRUE(shows(screen.withPointer(look, 100, 100)));
    look = TestScreen::square(20, 0xFF0000FF);
    look.hotX = 19;
    screen.setPointer(look);
    ASSERT_TRUE(shows(screen.withPointer(look, 100, 100)));
    screen.setPointer(nothing);
    ASSERT_TRUE(shows(screen.withoutPointer()));
    const std::size_t before = frames->count();
    for (int i = 0; i < 20; ++i) screen.movePointer(100 + i, 100);
    ASSERT_TRUE(frames->waitForCount(before + 1));
    EXPECT_TRUE(frames->frames()[before].damage.empty()) << "moves of what can't be seen are no news";
}

TEST_F(LandscapeMirror, GivesNothingButRepeatsWhileThePointerRests) {
    const PointerLook look = TestScreen::square(12, 0xFF00FF00);
    screen.setPointer(look);
    const auto made = start(400, 300);
    ASSERT_TRUE(frames->waitForCount(4));
    const Frames got = frames->frames();
    for (std::size_t i = 1; i < got.size(); ++i) {
        EXPECT_TRUE(got[i].damage.empty()) << i;
        EXPECT_GT(got[i].stamp.seconds() - got[i - 1].stamp.seconds(), 0.5) << i;
    }
    // However long it has rested.
    screen.movePointer(200, 200);
    EXPECT_TRUE(shows(screen.withPointer(look, 200, 200)));
}

}  // namespace
}  // namespace lumacast::test
