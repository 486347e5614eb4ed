// Windows on X11 that are hidden, destroyed, not there yet, or several.

#include <gtest/gtest.h>

#include "linux/display/CaptureStatus.h"
#include "tests/contract/CapturedFrames.h"
#include "tests/contract/Colours.h"
#include "tests/contract/TestWindow.h"
#include "tests/contract/X11CaptureFixture.h"

namespace lumacast::test {
namespace {

using Frames = CapturedFrames::Frames;

TEST_F(X11Capture, KeepsTheLastPictureOfAHiddenWindowAndGoesOnWhenItIsBack) {
    TestWindow window(display.name(), {.colour = kRed});
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForColour(kRed));
    window.unmap();
    const std::size_t before = frames->count();
    ASSERT_TRUE(frames->waitForCount(before + 2)) << "the picture is repeated";
    EXPECT_EQ(frames->frames().back().colour, kRed);
    EXPECT_TRUE(frames->frames().back().damage.empty());
    window.map();
    window.paint(kGreen);
    ASSERT_TRUE(frames->waitForColour(kGreen));
    window.paint(kBlue);
    ASSERT_TRUE(frames->waitForColour(kBlue));
    EXPECT_TRUE(frames->failures().empty());
}

TEST_F(X11Capture, GoesOnWhenTheParentOfTheWindowWasHidden) {
    TestWindow frame(display.name(), {.place = {10, 10, 400, 300}, .colour = kBlue, .repaints = false});
    TestWindow window(display.name(), {.colour = kRed, .parent = frame.id()});
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForColour(kRed));
    frame.unmap();
    frame.map();
    window.paint(kGreen);
    ASSERT_TRUE(frames->waitForColour(kGreen));
    EXPECT_TRUE(frames->failures().empty());
}

TEST_F(X11Capture, WaitsForAWindowThatIsNotShownYet) {
    TestWindow window(display.name(), {.colour = kRed, .mapped = false});
    const auto made = startOn(window, 320, 240);
    window.map();
    window.paint(kRed);
    ASSERT_TRUE(frames->waitForColour(kRed));
    EXPECT_TRUE(frames->failures().empty());
}

TEST_F(X11Capture, FailsOnceWhenTheWindowIsDestroyed) {
    TestWindow window(display.name(), {.colour = kRed});
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForColour(kRed));
    window.destroy();
    EXPECT_EQ(frames->waitForFailure(), CaptureStatus::kWindowGone);
    EXPECT_EQ(frames->failures().size(), 1u);
}

TEST_F(X11Capture, NeverCapturesTheSameNumberAgainAfterTheWindowWasDestroyed) {
    TestWindow window(display.name(), {.colour = kRed});
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForColour(kRed));
    window.destroy();
    ASSERT_TRUE(frames->waitForFailure());
    // The application makes a new window, which happens to get the old one's number.
    xcb_create_window(window.connection(), XCB_COPY_FROM_PARENT, window.id(), window.screen().root, 0, 0, 320, 240, 0,
                      XCB_WINDOW_CLASS_INPUT_OUTPUT, XCB_COPY_FROM_PARENT, 0, nullptr);
    window.map();
    const std::size_t before = frames->count();
    made->start();
    ASSERT_TRUE(frames->waitFor([&](const Frames&) { return frames->failuresUnlocked() >= 2; }));
    EXPECT_LE(frames->count(), before + 1) << "at most the last picture once more";
}

TEST_F(X11Capture, FailsForAWindowThatDoesNotExist) {
    capture.setContexts({ContextID{0x7fffff}});
    capture.setMirroringMode(DisplayCloneControl::kCloneContexts);
    const auto made = source(320, 240);
    made->openGate();
    made->start();
    EXPECT_EQ(frames->waitForFailure(), CaptureStatus::kWindowGone);
}

TEST_F(X11Capture, NeverTakesTheScreenForAWindow) {
    TestWindow window(display.name(), {.colour = kRed});
    capture.setContexts({ContextID{0}, ContextID{window.screen().root}});
    capture.setMirroringMode(DisplayCloneControl::kCloneContexts);
    const auto made = source(320, 240);
    made->openGate();
    made->start();
    EXPECT_EQ(frames->waitForFailure(), CaptureStatus::kWindowGone);
    EXPECT_EQ(frames->count(), 0u);
}

TEST_F(X11Capture, ShowsTheWindowThatExistsOfSeveral) {
    TestWindow window(display.name(), {.place = {700, 500, 320, 240}, .colour = kRed});
    capture.setContexts({ContextID{7}, window.context(), ContextID{0x7ffffff}});
    capture.setMirroringMode(DisplayCloneControl::kCloneContexts);
    const auto made = source(320, 240);
    made->openGate();
    made->start();
    ASSERT_TRUE(frames->waitForColour(kRed));
    EXPECT_TRUE(frames->failures().empty());
    window.destroy();
    EXPECT_EQ(frames->waitForFailure(), CaptureStatus::kWindowGone);
}

TEST_F(X11Capture, FollowsTheSelectionWhileItRuns) {
    TestWindow first(display.name(), {.colour = kRed});
    TestWindow second(display.name(), {.place = {500, 500, 320, 240}, .colour = kGreen});
    const auto made = startOn(first, 320, 240);
    ASSERT_TRUE(frames->waitForColour(kRed));
    capture.setContexts({second.context()});
    ASSERT_TRUE(frames->waitForColour(kGreen));
}

}  // namespace
}  // namespace lumacast::test
