// What is special about capturing on X11: windows that are covered, hidden, resized, moved and destroyed, and servers that
// hang or die.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>

#include <algorithm>

#include "linux/display/X11DisplayCapture.h"
#include "linux/system/LinuxClock.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/CapturedFrames.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/contract/TestWindow.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast::test {
namespace {

using Frames = CapturedFrames::Frames;
using Look = TestWindow::Look;

constexpr std::uint32_t kRed = 0xC01020, kGreen = 0x10B030, kBlue = 0x2030D0;

class X11Capture : public ::testing::Test {
protected:
    X11Capture() {
        clock.startCaptureClock();
        frames->checkEvery = 1;
    }

    std::shared_ptr<DisplayCaptureSource> source(int width, int height, int perSecond = 60) {
        auto made = capture.makeSource({static_cast<double>(width), static_cast<double>(height)}, MediaTime::make(1, perSecond));
        made->setDelegate(frames);
        return made;
    }
    std::shared_ptr<DisplayCaptureSource> startOn(const TestWindow& window, int width, int height, int perSecond = 60) {
        capture.setContexts({window.context()});
        capture.setMirroringMode(DisplayCloneControl::kCloneContexts);
        auto made = source(width, height, perSecond);
        made->openGate();
        made->start();
        return made;
    }

    PrivateDisplay display;
    LinuxClock clock;
    const std::shared_ptr<ThreadLoop> loop = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler{loop};
    RunningThreadLoop running{*loop};
    X11DisplayCapture capture{display.name(), clock, scheduler};
    const std::shared_ptr<CapturedFrames> frames = std::make_shared<CapturedFrames>();
};

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

TEST_F(X11Capture, SeesNothingOfWhatCoversAWindowThatIsNeverRepainted) {
    TestWindow window(display.name(), {.colour = kRed, .repaints = false});
    TestWindow cover(display.name(), {.place = {-10, -10, 600, 500}, .colour = kBlue});
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForCount(1));
    EXPECT_NE(frames->frames()[0].colour, kBlue);
}

TEST_F(X11Capture, ShowsACoveredStillWindowAndNothingBlankBefore) {
    for (const bool background : {false, true}) {
        TestWindow window(display.name(), {.colour = kRed, .background = background});
        TestWindow cover(display.name(), {.place = {-10, -10, 600, 500}, .colour = kBlue});
        frames->clear();
        const auto made = startOn(window, 320, 240);
        ASSERT_TRUE(frames->waitForCount(1));
        EXPECT_EQ(frames->frames()[0].colour, kRed) << (background ? "with" : "without") << " a background";
        EXPECT_TRUE(frames->frames()[0].oneColour);
        EXPECT_GT(window.repaints(), 0u) << "the server asked the application to paint";
    }
}

}  // namespace
}  // namespace lumacast::test
