// The whole screen as frames: portrait, and upright when turned as their flags say.

#include <gtest/gtest.h>

#include <algorithm>
#include <random>
#include <utility>

#include "tests/contract/Colours.h"
#include "tests/contract/MirrorWorld.h"

namespace lumacast::test {
namespace {

using namespace std::chrono_literals;
using Frames = CapturedFrames::Frames;
using PointerLook = TestScreen::PointerLook;

TEST_F(LandscapeMirror, IsTurnedIntoAPortraitFrameWhateverTheCaptureSize) {
    TestWindow corner(display.name(), {.place = {0, 0, 40, 20}, .colour = kGreen});
    TestWindow other(display.name(), {.place = {390, 280, 10, 20}, .colour = kBlue});
    for (const auto& [width, height] : {std::pair{400, 300}, std::pair{300, 400}}) {
        frames->clear();
        const auto made = start(width, height);
        ASSERT_TRUE(frames->waitForCount(1));
        const CapturedFrame first = frames->frames()[0];
        EXPECT_EQ(first.width, 300);
        EXPECT_EQ(first.height, 400);
        EXPECT_EQ(first.transformFlags, kRotateClockwise);
        // The top of the screen is the frame's left edge.
        EXPECT_EQ(colourAt(*first.plane, 0, 399), kGreen);
        EXPECT_EQ(colourAt(*first.plane, 19, 360), kGreen);
        EXPECT_EQ(colourAt(*first.plane, 20, 360), kRed);
        EXPECT_EQ(colourAt(*first.plane, 19, 359), kRed);
        EXPECT_EQ(colourAt(*first.plane, 280, 9), kBlue);
        EXPECT_EQ(colourAt(*first.plane, 279, 9), kRed);
        EXPECT_EQ(colourAt(*first.plane, 280, 10), kRed);
        EXPECT_EQ(upright(first), screen.withoutPointer());
        EXPECT_EQ(first.damage, (std::vector<PixelRect>{{0, 0, 300, 400}}));
    }
}

TEST_F(PortraitMirror, IsShownAsItIs) {
    TestWindow corner(display.name(), {.place = {0, 0, 40, 20}, .colour = kGreen});
    for (const auto& [width, height] : {std::pair{400, 300}, std::pair{300, 400}}) {
        frames->clear();
        const auto made = start(width, height);
        ASSERT_TRUE(frames->waitForCount(1));
        const CapturedFrame first = frames->frames()[0];
        EXPECT_EQ(first.width, 300);
        EXPECT_EQ(first.height, 400);
        EXPECT_EQ(first.transformFlags, 0u);
        EXPECT_EQ(colourAt(*first.plane, 39, 19), kGreen);
        EXPECT_EQ(upright(first), screen.withoutPointer());
    }
}

TEST_F(LandscapeMirror, TellsTheDamageWhereItIsInTheFrame) {
    const auto made = start(400, 300);
    ASSERT_TRUE(frames->waitForCount(1));
    back.paintPart({100, 200, 30, 20}, kGreen);
    ASSERT_TRUE(frames->waitFor([](const Frames& got) {
        return got.back().damage == std::vector<PixelRect>{{200, 270, 20, 30}};
    }));
    ASSERT_TRUE(frames->waitForCount(frames->count() + 1));
    EXPECT_TRUE(frames->frames().back().damage.empty());
    // A repeat lies as its picture does.
    for (const CapturedFrame& frame : frames->frames()) EXPECT_EQ(frame.transformFlags, kRotateClockwise);
}

// Little by little, with a pointer that wanders and changes, a source must come to the very picture that another one
// reads, turns and scales whole.
struct Shape {
    int screenWidth, screenHeight, captureWidth, captureHeight;
};
class X11MirrorOfManyChanges : public ::testing::TestWithParam<Shape> {};

TEST_P(X11MirrorOfManyChanges, IsThePictureOfOneThatBeginsNow) {
    const Shape& shape = GetParam();
    MirrorWorld world(shape.screenWidth, shape.screenHeight);
    TestWindow back(world.display.name(),
                    {.place = {0, 0, shape.screenWidth, shape.screenHeight}, .colour = kRed, .repaints = false});
    std::mt19937 random(7);
    const auto below = [&](int limit) { return static_cast<int>(random() % static_cast<unsigned>(limit)); };
    const auto made = world.start(shape.captureWidth, shape.captureHeight, 1000);
    ASSERT_TRUE(world.frames->waitForCount(1));
    PointerLook look = world.nothing;
    int x = 0, y = 0;
    for (int i = 1; i <= 120; ++i) {
        const std::size_t before = world.frames->count();
        back.paintPart({below(shape.screenWidth - 1), below(shape.screenHeight - 1), 1 + below(60), 1 + below(60)},
                       random() & 0xFFFFFF);
        // At last it rests, and other planes than the one that it was drawn into take their turns.
        const bool rests = i > 110;
        if (!rests && i % 2 == 0)
            x = below(shape.screenWidth), y = below(shape.screenHeight), world.screen.movePointer(x, y);
        if (!rests && i % 10 == 0) {
            const auto side = static_cast<std::uint16_t>(1 + below(40));
            look = TestScreen::square(side, 0x80000000u | (random() & 0x7F7F7F));
            look.pixels[0] = 0xFFFFFFFF;
            look.hotX = static_cast<std::uint16_t>(below(side));
            world.screen.setPointer(look);
        }
        ASSERT_TRUE(world.frames->waitForCount(before + 1)) << i;
        if (i % 4 == 0) world.frames->clear();
    }
    const auto whole = std::make_shared<CapturedFrames>();
    whole->keepPlanes = true;
    const auto other = world.start(whole, shape.captureWidth, shape.captureHeight);
    ASSERT_TRUE(whole->waitForCount(1));
    const CapturedFrame expected = whole->frames()[0];
    EXPECT_EQ(expected.width, std::min(shape.captureWidth, shape.captureHeight));
    EXPECT_TRUE(world.shows(world.upright(expected), 5s));
    const bool exact =
        std::minmax(shape.screenWidth, shape.screenHeight) == std::minmax(shape.captureWidth, shape.captureHeight);
    if (exact) {
        EXPECT_EQ(world.upright(expected), world.screen.withPointer(look, x, y));
    }
}

INSTANTIATE_TEST_SUITE_P(Shapes, X11MirrorOfManyChanges,
                         ::testing::Values(Shape{400, 300, 400, 300}, Shape{400, 300, 320, 240},
                                           Shape{317, 231, 231, 317}, Shape{317, 231, 500, 377},
                                           Shape{320, 480, 480, 320}, Shape{300, 400, 120, 200},
                                           Shape{300, 300, 200, 340}));

TEST_F(LandscapeMirror, LeavesThePointerAndTheTurnOutOfWindows) {
    const PointerLook look = TestScreen::square(30, 0xFF00FF00);
    screen.setPointer(look);
    screen.movePointer(150, 100);
    capture.setContexts({back.context()});
    capture.setMirroringMode(DisplayCloneControl::kCloneContexts);
    frames->checkEvery = 1;
    const auto made = start(400, 300);
    ASSERT_TRUE(frames->waitForColour(kRed));
    screen.movePointer(200, 100);
    screen.saveScreen(true);
    const std::size_t before = frames->count();
    ASSERT_TRUE(frames->waitForCount(before + 2));
    EXPECT_TRUE(frames->frames().back().damage.empty());
    EXPECT_EQ(frames->frames().back().transformFlags, 0u);
    EXPECT_EQ(frames->frames().back().width, 400);
    EXPECT_TRUE(frames->frames().back().oneColour);
    EXPECT_EQ(frames->preemptions(), 0u) << "a window is recorded though the screen is dark";
    // The same source, but now of the screen: another size, turned, with the pointer.
    screen.saveScreen(false);
    capture.setMirroringMode(DisplayCloneControl::kMirrorDisplay);
    ASSERT_TRUE(shows(screen.withPointer(look, 200, 100)));
    EXPECT_EQ(frames->frames().back().width, 300);
    capture.setMirroringMode(DisplayCloneControl::kCloneContexts);
    back.paint(kGreen);
    ASSERT_TRUE(frames->waitForColour(kGreen));
    EXPECT_EQ(frames->frames().back().width, 400);
    EXPECT_EQ(frames->frames().back().transformFlags, 0u);
}

Pixels centred(const Pixels& picture, int width, int height) {
    Pixels frame{width, height,
                 std::vector<std::uint32_t>(static_cast<std::size_t>(width) * static_cast<std::size_t>(height))};
    for (int y = 0; y < picture.height; ++y)
        for (int x = 0; x < picture.width; ++x)
            frame.colours[static_cast<std::size_t>((y + (height - picture.height) / 2) * width + x +
                                                   (width - picture.width) / 2)] = picture.at(x, y);
    return frame;
}

TEST_F(LandscapeMirror, KeepsTheRecordingsOrientationWhenTheScreenChangesItsSize) {
    const PointerLook look = TestScreen::square(10, 0xFF00FF00);
    screen.setPointer(look);
    const auto made = start(400, 300);
    ASSERT_TRUE(shows(screen.withPointer(look, 0, 0)));
    // Portrait now, and as high as the frame is, turned back: nothing is scaled.
    screen.resize(200, 300);
    screen.movePointer(20, 30);
    back.paintPart({0, 0, 100, 150}, kGreen);
    ASSERT_TRUE(shows(centred(screen.withPointer(look, 20, 30), 400, 300)));
    EXPECT_EQ(frames->frames().back().width, 300);
    EXPECT_EQ(frames->frames().back().transformFlags, kRotateClockwise);
    back.paintPart({100, 150, 100, 150}, kBlue);
    ASSERT_TRUE(shows(centred(screen.withPointer(look, 20, 30), 400, 300)));
    // After a pause it is still the same recording.
    made->closeGate(GateWait::UntilDelivered);
    made->openGate();
    const std::size_t before = frames->count();
    made->start();
    ASSERT_TRUE(frames->waitForCount(before + 2));
    for (const CapturedFrame& frame : frames->frames()) EXPECT_EQ(frame.transformFlags, kRotateClockwise);
    // Another one looks anew.
    made->closeGate(GateWait::UntilDelivered);
    frames->clear();
    clock.startCaptureClock();
    made->openGate();
    made->start();
    ASSERT_TRUE(frames->waitForCount(1));
    EXPECT_EQ(frames->frames()[0].transformFlags, 0u);
    // As high as the frame.
    EXPECT_TRUE(sameColour(colourAt(*frames->frames()[0].plane, 120, 150), kGreen));
    EXPECT_TRUE(sameColour(colourAt(*frames->frames()[0].plane, 250, 350), kBlue));
    EXPECT_EQ(colourAt(*frames->frames()[0].plane, 10, 200), 0u);
    screen.resize(400, 300);
    back.paint(kRed);
    ASSERT_TRUE(frames->waitFor([](const Frames& got) {
        const SharedPlane& plane = *got.back().plane;
        return sameColour(colourAt(plane, 5, 200), kRed) && colourAt(plane, 150, 50) == 0;
    }));
    EXPECT_EQ(frames->frames().back().transformFlags, 0u);
    EXPECT_TRUE(frames->failures().empty());
}

}  // namespace
}  // namespace lumacast::test
