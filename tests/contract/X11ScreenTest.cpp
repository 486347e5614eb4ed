// Windows that nothing covers are read from the screen, and what comes in front of them is never shown.

#include <gtest/gtest.h>
#include <xcb/composite.h>

#include <chrono>
#include <random>
#include <thread>

#include "tests/contract/Colours.h"
#include "tests/contract/Eventually.h"
#include "tests/contract/TestWindow.h"
#include "tests/contract/X11CaptureFixture.h"

namespace lumacast::test {
namespace {

using Frames = CapturedFrames::Frames;

/// Whether the server keeps a picture of the window in memory.
bool isRedirected(const TestWindow& window) {
    xcb_connection_t* const x = window.connection();
    const xcb_pixmap_t pixmap = xcb_generate_id(x);
    const x11::Owned<xcb_generic_error_t> error(
        xcb_request_check(x, xcb_composite_name_window_pixmap_checked(x, window.id(), pixmap)));
    if (error) return false;
    xcb_free_pixmap(x, pixmap);
    return true;
}

class X11Screen : public X11CaptureFixture {
protected:
    /// Once a window is captured.
    bool waitForScreen(const TestWindow& window) {
        return frames->waitForCount(1) && eventually([&] { return !isRedirected(window); });
    }
};

TEST_F(X11Screen, ReadsAWindowThatNothingCoversFromTheScreenWithoutOneMorePicture) {
    TestWindow window(display.name(), {.place = {30, 40, 320, 240}, .colour = kRed, .repaints = false});
    window.paint(kRed);
    frames->keepPlanes = true;
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForColour(kRed));
    EXPECT_TRUE(isRedirected(window));
    ASSERT_TRUE(waitForScreen(window));
    ASSERT_TRUE(frames->waitForCount(frames->frames().size() + 1));
    for (std::size_t i = 1; i < frames->frames().size(); ++i) EXPECT_TRUE(frames->frames()[i].damage.empty()) << i;
    window.paintPart({0, 0, 1, 1}, kGreen);
    window.paintPart({319, 239, 1, 1}, kBlue);
    ASSERT_TRUE(frames->waitFor([](const Frames& got) { return colourAt(*got.back().plane, 319, 239) == kBlue; }));
    const auto plane = frames->frames().back().plane;
    EXPECT_EQ(colourAt(*plane, 0, 0), kGreen);
    EXPECT_EQ(colourAt(*plane, 1, 0), kRed);
    EXPECT_EQ(colourAt(*plane, 318, 239), kRed);
}

// What an application does not paint again is still its own: a picture from a moment ago and not black.
TEST_F(X11Screen, KeepsThePixelsOfAWindowThatIsCoveredWhileItIsReadFromTheScreen) {
    for (const bool repaints : {true, false}) {
        TestWindow window(display.name(), {.place = {30, 40, 320, 240}, .colour = kRed, .border = 2, .repaints = repaints});
        window.paint(kRed);
        frames->clear();
        const auto made = startOn(window, 320, 240);
        ASSERT_TRUE(waitForScreen(window));
        TestWindow cover(display.name(), {.place = {100, 100, 600, 500}, .colour = kBlue});
        cover.paint(kBlue);
        ASSERT_TRUE(eventually([&] { return isRedirected(window); }));
        if (repaints) {
            window.paint(kGreen);
            ASSERT_TRUE(frames->waitForColour(kGreen));
        } else {
            window.paintPart({0, 0, 10, 10}, kGreen);
            ASSERT_TRUE(frames->waitFor([](const Frames& got) { return !got.back().oneColour; }));
            window.paintPart({0, 0, 10, 10}, kRed);
            ASSERT_TRUE(frames->waitForColour(kRed)) << "what is covered is the window's own";
        }
        for (const CapturedFrame& frame : frames->frames()) EXPECT_NE(frame.colour, kBlue);
        cover.unmap();
        EXPECT_TRUE(waitForScreen(window)) << "and back";
    }
}

TEST_F(X11Screen, NeverShowsWhatComesAndGoesInFrontOfAWindow) {
    TestWindow window(display.name(), {.place = {0, 0, 320, 240}, .colour = kRed});
    window.paint(kRed);
    frames->isOdd = [](const SharedPlane& plane) {
        for (int y = 0; y < 240; y += 7)
            for (int x = 0; x < 320; x += 7)
                if (colourAt(plane, x, y) != kRed && colourAt(plane, x, y) != kGreen) return true;
        return false;
    };
    const auto made = startOn(window, 320, 240);
    std::mt19937 random(20261122);
    TestWindow cover(display.name(), {.place = {0, 0, 90, 70}, .colour = kBlue, .background = kBlue, .mapped = false});
    for (int round = 0; round < 6; ++round) {
        ASSERT_TRUE(waitForScreen(window));
        for (int times = 0; times < 8; ++times) {
            cover.move(static_cast<int>(random() % 300), static_cast<int>(random() % 220));
            cover.map();
            window.paint(times % 2 == 0 ? kGreen : kRed);
            cover.unmap();
        }
        ASSERT_TRUE(frames->waitForColour(kRed)) << "and what was painted last stays";
    }
    for (const CapturedFrame& frame : frames->frames()) EXPECT_FALSE(frame.odd) << frame.number;
}

TEST_F(X11Screen, KeepsAWindowThatIsMovedPartlyOffTheScreenWhole) {
    TestWindow window(display.name(), {.place = {30, 40, 320, 240}, .colour = kRed, .repaints = false});
    window.paint(kRed);
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(waitForScreen(window));
    window.move(-100, -100);
    ASSERT_TRUE(eventually([&] { return isRedirected(window); }));
    window.paint(kGreen);
    ASSERT_TRUE(frames->waitForColour(kGreen));
    EXPECT_TRUE(frames->frames().back().oneColour);
    for (const CapturedFrame& frame : frames->frames()) EXPECT_TRUE(frame.oneColour);
}

TEST_F(X11Screen, NeverShowsWhatWasBehindAWindowThatGrowsWhileItIsReadFromTheScreen) {
    TestWindow behind(display.name(), {.place = {0, 0, 900, 700}, .colour = kBlue});
    behind.paint(kBlue);
    TestWindow window(display.name(), {.place = {30, 40, 320, 240}, .colour = kRed, .repaints = false});
    window.paint(kRed);
    frames->isOdd = [](const SharedPlane& plane) {
        for (int y = 0; y < plane.height(); y += 3)
            for (int x = 0; x < plane.width(); x += 3)
                if (sameColour(colourAt(plane, x, y), kBlue)) return true;
        return false;
    };
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(waitForScreen(window));
    window.resize(480, 360);
    ASSERT_TRUE(eventually([&] { return isRedirected(window); }));
    window.paint(kGreen);
    ASSERT_TRUE(frames->waitForColour(kGreen));
    for (const CapturedFrame& frame : frames->frames()) EXPECT_FALSE(frame.odd) << frame.number;
}

TEST_F(X11Screen, AWindowWithinAnotherIsReadFromTheScreenOnlyWhileNothingIsInFrontOfEither) {
    TestWindow outer(display.name(), {.place = {50, 50, 500, 400}, .colour = kBlue, .border = 5});
    TestWindow window(display.name(), {.place = {20, 30, 320, 240}, .colour = kRed, .border = 3, .parent = outer.id()});
    TestWindow beside(display.name(), {.place = {0, 0, 40, 60}, .colour = kGreen, .parent = outer.id()});
    TestWindow aside(display.name(), {.place = {700, 50, 100, 400}, .colour = kGreen});
    window.paint(kRed);
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForColour(kRed));
    // What is beside it is in front of one of its corners.
    const std::uint64_t before = window.repaints();
    ASSERT_TRUE(frames->waitForCount(frames->frames().size() + 3)) << "that takes seconds";
    EXPECT_TRUE(isRedirected(window));
    EXPECT_EQ(window.repaints(), before) << "it was not tried, in vain";
    beside.unmap();
    ASSERT_TRUE(waitForScreen(window));
    aside.move(360, 50);
    EXPECT_TRUE(eventually([&] { return isRedirected(window); })) << "over what it is in";
    aside.move(900, 50);
    ASSERT_TRUE(waitForScreen(window));
    window.move(300, 30);
    EXPECT_TRUE(eventually([&] { return isRedirected(window); })) << "cut off by what it is in";
    window.paint(kGreen);
    ASSERT_TRUE(frames->waitForColour(kGreen));
    EXPECT_TRUE(frames->frames().back().oneColour);
    for (const CapturedFrame& frame : frames->frames()) EXPECT_NE(frame.colour, kBlue);
}

TEST_F(X11Screen, TwoWindowsAreReadFromTheirOwnMemory) {
    TestWindow window(display.name(), {.place = {0, 0, 320, 240}, .colour = kRed});
    TestWindow other(display.name(), {.place = {400, 0, 320, 240}, .colour = kGreen});
    const auto made = startOn(window, 720, 240);
    ASSERT_TRUE(waitForScreen(window));
    capture.setContexts({window.context(), other.context()});
    EXPECT_TRUE(eventually([&] { return isRedirected(window) && isRedirected(other); }));
}

}  // namespace
}  // namespace lumacast::test
