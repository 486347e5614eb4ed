// The pictures of windows on X11: covered, moved, resized, scaled.

#include <gtest/gtest.h>

#include <chrono>
#include <memory>
#include <random>
#include <utility>

#include "linux/display/CaptureStatus.h"
#include "tests/contract/CapturedFrames.h"
#include "tests/contract/Colours.h"
#include "tests/contract/TestWindow.h"
#include "tests/contract/X11CaptureFixture.h"

namespace lumacast::test {
namespace {

using Frames = CapturedFrames::Frames;
using Look = TestWindow::Look;

TEST_F(X11Capture, ShowsTheRightPixels) {
    TestWindow window(display.name(), {.place = {30, 40, 320, 240}, .colour = kRed, .border = 3, .repaints = false});
    frames->keepPlanes = true;
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForColour(kRed));
    window.paintPart({0, 0, 20, 10}, kGreen);
    window.paintPart({310, 236, 10, 4}, kBlue);
    window.paintPart({100, 100, 5, 5}, kBlue);
    const auto hasSpot = [](const Frames& got) { return colourAt(*got.back().plane, 104, 104) == kBlue; };
    ASSERT_TRUE(frames->waitFor(hasSpot));
    const auto plane = frames->frames().back().plane;
    EXPECT_EQ(colourAt(*plane, 0, 0), kGreen);
    EXPECT_EQ(colourAt(*plane, 19, 9), kGreen);
    EXPECT_EQ(colourAt(*plane, 20, 9), kRed);
    EXPECT_EQ(colourAt(*plane, 99, 100), kRed);
    EXPECT_EQ(colourAt(*plane, 105, 100), kRed);
    EXPECT_EQ(colourAt(*plane, 319, 239), kBlue);
    EXPECT_EQ(colourAt(*plane, 309, 239), kRed);
}

TEST_F(X11Capture, RecordsACoveredWindowThatMoves) {
    TestWindow window(display.name(), {.colour = kRed});
    TestWindow cover(display.name(), {.place = {-10, -10, 600, 500}, .colour = kBlue});
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForColour(kRed));
    window.paint(kGreen);
    ASSERT_TRUE(frames->waitForColour(kGreen));
    for (const CapturedFrame& frame : frames->frames()) {
        EXPECT_TRUE(frame.oneColour) << "a picture that is half covered or half blank";
        EXPECT_NE(frame.colour, kBlue) << "somebody else's picture";
    }
}

TEST_F(X11Capture, ShowsACoveredStillWindowAndNothingBlankBefore) {
    for (const std::int64_t background : {Look::kNone, std::int64_t{kGreen}}) {
        TestWindow window(display.name(), {.colour = kRed, .background = background});
        TestWindow cover(display.name(), {.place = {-10, -10, 600, 500}, .colour = kBlue});
        frames->clear();
        const std::uint64_t before = window.repaints();
        const auto made = startOn(window, 320, 240);
        ASSERT_TRUE(frames->waitForCount(1));
        EXPECT_EQ(frames->frames()[0].colour, kRed) << "background " << background;
        EXPECT_TRUE(frames->frames()[0].oneColour);
        EXPECT_GT(window.repaints(), before) << "the server asked the application to paint";
    }
}

// The memory that the server gives a redirected window begins with what is on the screen at its place.
TEST_F(X11Capture, NeverShowsWhatCoversAWindowThatIsNotRepainted) {
    for (const std::int64_t background : {Look::kNone, std::int64_t{kGreen}}) {
        TestWindow window(display.name(), {.colour = kRed, .background = background, .repaints = false});
        TestWindow cover(display.name(), {.place = {-10, -10, 600, 500}, .colour = kBlue});
        frames->clear();
        const auto made = startOn(window, 320, 240);
        ASSERT_TRUE(frames->waitForCount(1));
        EXPECT_EQ(frames->frames()[0].colour, background == Look::kNone ? 0 : kGreen);
        EXPECT_TRUE(frames->frames()[0].oneColour);
        window.paint(kRed);
        EXPECT_TRUE(frames->waitForColour(kRed));
        for (const CapturedFrame& frame : frames->frames()) EXPECT_NE(frame.colour, kBlue);
    }
}

// What had covered it stays on the screen until the application has painted, which it may do after the recording has begun.
TEST_F(X11Capture, NeverShowsWhatHadCoveredAWindowThatIsBeingRepainted) {
    TestWindow window(display.name(), {.colour = kRed, .isSlow = true});
    window.paint(kRed);
    {
        TestWindow cover(display.name(), {.place = {-10, -10, 600, 500}, .colour = kBlue});
        cover.paint(kBlue);
        cover.unmap();
    }
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForCount(1));
    EXPECT_EQ(frames->frames()[0].colour, kRed);
    EXPECT_TRUE(frames->frames()[0].oneColour);
}

TEST_F(X11Capture, TakesAWindowAsItIsThatDoesNotAnswerWhenItIsAskedToRepaint) {
    TestWindow window(display.name(), {.colour = kRed, .repaints = false});
    window.paint(kRed);
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForCount(1));
    EXPECT_EQ(frames->frames()[0].colour, kRed) << "nothing was painted over";
    EXPECT_TRUE(frames->frames()[0].oneColour);
}

TEST_F(X11Capture, FollowsAResizeWithoutBlankOrTornPictures) {
    TestWindow window(display.name(), {.place = {0, 0, 320, 240}, .colour = kRed, .background = kRed});
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForColour(kRed));
    window.resize(640, 480);
    window.paint(kGreen);
    ASSERT_TRUE(frames->waitForColour(kGreen));
    window.resize(160, 120);
    window.paint(kBlue);
    ASSERT_TRUE(frames->waitForColour(kBlue));
    for (const CapturedFrame& frame : frames->frames()) {
        EXPECT_EQ(frame.width, 320);
        EXPECT_EQ(frame.height, 240);
        EXPECT_TRUE(frame.oneColour) << "window and frame have one shape: there is no border to show";
    }
}

TEST_F(X11Capture, KeepsTheShapeAndLeavesTheRestBlack) {
    TestWindow window(display.name(), {.place = {0, 0, 320, 240}, .colour = kRed, .background = kRed});
    frames->keepPlanes = true;
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForColour(kRed));
    window.resize(100, 240);
    window.paint(kGreen);
    const auto narrow = [](const Frames& got) {
        const SharedPlane& plane = *got.back().plane;
        return colourAt(plane, 160, 120) == kGreen && colourAt(plane, 5, 5) == 0;
    };
    ASSERT_TRUE(frames->waitFor(narrow));
    const auto plane = frames->frames().back().plane;
    EXPECT_EQ(colourAt(*plane, 109, 0), 0u);
    EXPECT_EQ(colourAt(*plane, 110, 0), kGreen);
    EXPECT_EQ(colourAt(*plane, 209, 239), kGreen);
    EXPECT_EQ(colourAt(*plane, 210, 239), 0u);
    // Back to the frame's own size: the borders go.
    window.resize(320, 240);
    window.paint(kBlue);
    ASSERT_TRUE(frames->waitForColour(kBlue));
}

TEST_F(X11Capture, ScalesWhatChangesJustAsItScalesTheWhole) {
    for (const auto& [width, height] : {std::pair{200, 150}, std::pair{500, 375}, std::pair{317, 413}}) {
        TestWindow window(display.name(), {.place = {0, 0, 320, 240}, .colour = kRed, .repaints = false});
        frames->clear();
        frames->keepPlanes = true;
        const auto made = startOn(window, width, height, 1000);
        ASSERT_TRUE(frames->waitForCount(1));
        std::mt19937 random(5);
        for (std::uint32_t i = 1; i <= 40; ++i) {
            const int x = static_cast<int>(random() % 300), y = static_cast<int>(random() % 220);
            const std::size_t before = frames->count();
            window.paintPart({x, y, 1 + static_cast<int>(random() % 20), 1 + static_cast<int>(random() % 20)},
                             random() & 0xFFFFFF);
            ASSERT_TRUE(frames->waitForCount(before + 1));
            if (i % 4 == 0) frames->clear();
        }
        // One that begins now reads and scales everything.
        const auto whole = std::make_shared<CapturedFrames>();
        whole->keepPlanes = true;
        const auto other =
            capture.makeSource({static_cast<double>(width), static_cast<double>(height)}, MediaTime::make(1, 60));
        other->setDelegate(whole);
        other->openGate();
        other->start();
        ASSERT_TRUE(whole->waitForCount(1));
        const auto expected = whole->frames().back().plane;
        const auto same = [&](const Frames& got) {
            if (got.empty() || !got.back().plane) return false;
            const auto a = got.back().plane->pixels(), b = expected->pixels();
            return std::equal(a.begin(), a.end(), b.begin(), b.end());
        };
        EXPECT_TRUE(frames->waitFor(same, std::chrono::seconds(5))) << width << "x" << height;
    }
}

TEST_F(X11Capture, TakesOddSizes) {
    TestWindow window(display.name(), {.place = {0, 0, 317, 231}, .colour = kRed, .repaints = false});
    frames->keepPlanes = true;
    const auto made = startOn(window, 317, 231);
    ASSERT_TRUE(frames->waitForColour(kRed));
    window.paintPart({313, 228, 3, 2}, kGreen);
    ASSERT_TRUE(frames->waitFor([](const Frames& got) { return colourAt(*got.back().plane, 313, 228) == kGreen; }));
    const auto plane = frames->frames().back().plane;
    EXPECT_EQ(plane->width(), 317);
    EXPECT_EQ(plane->height(), 231);
    EXPECT_EQ(plane->stride() % 64, 0u);
    EXPECT_EQ(colourAt(*plane, 315, 229), kGreen);
    EXPECT_EQ(colourAt(*plane, 316, 229), kRed);
    EXPECT_EQ(colourAt(*plane, 315, 230), kRed);
    EXPECT_EQ(colourAt(*plane, 312, 229), kRed);
}

TEST_F(X11Capture, CutsOffFractionsOfTheSize) {
    TestWindow window(display.name(), {.colour = kRed});
    capture.setContexts({window.context()});
    capture.setMirroringMode(DisplayCloneControl::kCloneContexts);
    const auto made = capture.makeSource({320.9, 240.2}, MediaTime::make(1, 60));
    made->setDelegate(frames);
    made->openGate();
    made->start();
    ASSERT_TRUE(frames->waitForCount(1));
    EXPECT_EQ(frames->frames()[0].width, 320);
    EXPECT_EQ(frames->frames()[0].height, 240);
}

TEST_F(X11Capture, IsNotDisturbedByMoves) {
    TestWindow window(display.name(), {.colour = kRed});
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForColour(kRed));
    window.move(1000, 900);
    window.move(-200, -100);
    window.paint(kGreen);
    ASSERT_TRUE(frames->waitForColour(kGreen));
    for (const CapturedFrame& frame : frames->frames()) EXPECT_TRUE(frame.oneColour);
}

TEST_F(X11Capture, RefusesSizesThatNoFrameHas) {
    capture.setMirroringMode(DisplayCloneControl::kMirrorDisplay);
    for (const Size size : {Size{0, 240}, Size{320, -1}, Size{1e9, 10}}) {
        const auto failed = std::make_shared<CapturedFrames>();
        const auto made = capture.makeSource(size, MediaTime::make(1, 60));
        made->setDelegate(failed);
        made->openGate();
        made->start();
        EXPECT_EQ(failed->waitForFailure(), CaptureStatus::kNotSupported);
    }
}

}  // namespace
}  // namespace lumacast::test
