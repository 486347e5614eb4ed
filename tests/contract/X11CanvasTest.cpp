// Several windows in one picture: where they are put, what covers what, and what becomes of them.

#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <initializer_list>
#include <random>
#include <utility>
#include <vector>

#include "linux/display/CaptureStatus.h"
#include "base/Limits.h"
#include "tests/contract/Colours.h"
#include "tests/contract/TestScreen.h"
#include "tests/contract/X11CaptureFixture.h"

namespace lumacast::test {
namespace {

using Frames = CapturedFrames::Frames;
using Look = TestWindow::Look;

constexpr std::uint32_t kWhite = 0xF0E0F0, kBlack = 0;

struct Dot {
    int x, y;
    std::uint32_t colour;
};

class X11Canvas : public X11CaptureFixture {
protected:
    explicit X11Canvas(const std::string& screen = "1000x800x24") : X11CaptureFixture(screen) {
        frames->keepPlanes = true;
        frames->checkEvery = 1000;
    }

    /// Until the newest picture, seen upright, has all these colours.
    bool shows(std::initializer_list<Dot> dots) {
        const auto newest = [](const Frames& got) {
            return uprightPixels(*got.back().plane, got.back().transformFlags);
        };
        const bool shown = frames->waitFor([&](const Frames& got) {
            if (got.empty() || !got.back().plane) return false;
            const Pixels picture = newest(got);
            return std::all_of(dots.begin(), dots.end(), [&](const Dot& dot) {
                return dot.x < picture.width && dot.y < picture.height &&
                       sameColour(picture.at(dot.x, dot.y), dot.colour);
            });
        });
        if (!shown && frames->count() > 0)
            for (const Dot& dot : dots)
                std::printf("             (%d, %d): %06x, wanted %06x\n", dot.x, dot.y,
                            newest(frames->frames()).at(dot.x, dot.y), dot.colour);
        frames->clear();  // the planes go back
        return shown;
    }
};

TEST_F(X11Canvas, PutsWindowsWhereTheyAreAndLeavesTheRestBlack) {
    TestWindow back(display.name(), {.place = {0, 0, 1000, 800}, .colour = kWhite});
    TestWindow left(display.name(), {.place = {100, 50, 160, 240}, .colour = kRed, .repaints = false});
    TestWindow right(display.name(), {.place = {300, 130, 120, 100}, .colour = kGreen, .border = 3, .repaints = false});
    const auto made = startOn({left.context(), right.context()}, 323, 240);
    // The right one's first pixel is within its border, at (303, 133); the box is (100, 50) to (423, 290).
    EXPECT_TRUE(shows({{0, 0, kRed},
                       {159, 239, kRed},
                       {160, 0, kBlack},
                       {202, 83, kBlack},
                       {203, 82, kBlack},
                       {203, 83, kGreen},
                       {322, 182, kGreen},
                       {322, 183, kBlack},
                       {322, 0, kBlack}}));
    left.paintPart({10, 20, 5, 5}, kBlue);
    right.paintPart({0, 0, 5, 5}, kWhite);
    EXPECT_TRUE(shows({{10, 20, kBlue}, {14, 24, kBlue}, {15, 24, kRed}, {203, 83, kWhite}, {208, 83, kGreen}}));
    EXPECT_TRUE(frames->failures().empty());
}

TEST_F(X11Canvas, FollowsTheStackingOrderOfTheScreen) {
    TestWindow low(display.name(), {.place = {0, 0, 200, 200}, .colour = kRed});
    TestWindow high(display.name(), {.place = {100, 100, 200, 200}, .colour = kGreen});
    const auto made = startOn({low.context(), high.context()}, 300, 300);
    EXPECT_TRUE(shows({{150, 150, kGreen}, {50, 50, kRed}, {250, 250, kGreen}, {250, 50, kBlack}}));
    low.raise();
    EXPECT_TRUE(shows({{150, 150, kRed}, {199, 199, kRed}, {200, 199, kGreen}}));
    high.raise();
    EXPECT_TRUE(shows({{150, 150, kGreen}, {99, 99, kRed}}));
}

TEST_F(X11Canvas, FollowsTheWindowsThatItsWindowsAreIn) {
    TestWindow lowFrame(display.name(), {.place = {0, 0, 220, 220}, .colour = kWhite});
    TestWindow highFrame(display.name(), {.place = {100, 100, 220, 220}, .colour = kWhite});
    // Made in the other order, so that only the frames tell what is above.
    TestWindow high(display.name(), {.place = {10, 10, 200, 200}, .colour = kGreen, .parent = highFrame.id()});
    TestWindow low(display.name(), {.place = {10, 10, 200, 200}, .colour = kRed, .parent = lowFrame.id()});
    const auto made = startOn({low.context(), high.context()}, 300, 300);
    EXPECT_TRUE(shows({{150, 150, kGreen}, {50, 50, kRed}, {250, 250, kGreen}}));
    lowFrame.raise();
    EXPECT_TRUE(shows({{150, 150, kRed}, {50, 50, kRed}, {250, 250, kGreen}}));
    // The box becomes 350 wide and 300 high.
    highFrame.move(150, 100);
    EXPECT_TRUE(shows({{0, 20, kBlack}, {1, 23, kRed}, {298, 276, kGreen}, {298, 279, kBlack}}));
    highFrame.unmap();
    EXPECT_TRUE(shows({{298, 270, kBlack}, {1, 30, kRed}}));
    highFrame.map();
    high.paint(kBlue);
    EXPECT_TRUE(shows({{298, 270, kBlue}, {1, 30, kRed}}));
    EXPECT_TRUE(frames->failures().empty());
}

TEST_F(X11Canvas, ShowsAWindowWithinAnotherAboveIt) {
    TestWindow outer(display.name(), {.place = {50, 50, 300, 300}, .colour = kRed});
    TestWindow inner(display.name(), {.place = {20, 30, 100, 100}, .colour = kGreen, .parent = outer.id()});
    const auto made = startOn({outer.context(), inner.context()}, 300, 300);
    EXPECT_TRUE(shows({{19, 30, kRed}, {20, 30, kGreen}, {119, 129, kGreen}, {120, 130, kRed}}));
    outer.move(300, 200);
    inner.paint(kBlue);
    EXPECT_TRUE(shows({{19, 30, kRed}, {20, 30, kBlue}}));
}

TEST_F(X11Canvas, FollowsMovesAndSizesWithItsBoxAndItsBorders) {
    TestWindow first(display.name(), {.place = {0, 0, 100, 100}, .colour = kRed, .background = kRed});
    TestWindow second(display.name(), {.place = {100, 0, 100, 100}, .colour = kGreen, .background = kGreen});
    const auto made = startOn({first.context(), second.context()}, 400, 200);
    EXPECT_TRUE(shows({{0, 0, kRed}, {190, 199, kRed}, {210, 0, kGreen}, {399, 199, kGreen}}));
    // 100 x 200: a column of 100 in the middle.
    second.move(0, 100);
    EXPECT_TRUE(shows({{149, 0, kBlack},
                       {150, 0, kRed},
                       {249, 95, kRed},
                       {150, 105, kGreen},
                       {249, 199, kGreen},
                       {250, 199, kBlack}}));
    // 400 x 100: a row of 100 in the middle.
    second.move(100, 0);
    second.resize(300, 100);
    second.paint(kBlue);
    EXPECT_TRUE(shows({{0, 49, kBlack},
                       {0, 50, kRed},
                       {99, 149, kRed},
                       {100, 50, kBlue},
                       {399, 149, kBlue},
                       {399, 150, kBlack},
                       {0, 150, kBlack}}));
}

TEST_F(X11Canvas, ShowsOnlyWhatIsOnTheScreen) {
    TestWindow first(display.name(), {.place = {-60, -40, 160, 140}, .colour = kRed});
    TestWindow second(display.name(), {.place = {900, 700, 5000, 5000}, .colour = kGreen});
    const auto made = startOn({first.context(), second.context()}, 1000, 800);
    EXPECT_TRUE(shows({{0, 0, kRed}, {99, 99, kRed}, {100, 99, kBlack}, {900, 700, kGreen}, {999, 799, kGreen}}));
    first.move(2000, 2000);
    EXPECT_TRUE(shows({{510, 10, kGreen}, {510, 790, kGreen}, {110, 10, kGreen}, {90, 10, kBlack}}));
    second.move(-6000, 0);
    first.move(100, 100);
    EXPECT_TRUE(shows({{500, 400, kRed}})) << "the only one on the screen";
}

TEST_F(X11Canvas, LeavesAHiddenWindowsPlaceToWhatIsBelow) {
    TestWindow low(display.name(), {.place = {0, 0, 200, 100}, .colour = kRed});
    TestWindow high(display.name(), {.place = {100, 0, 200, 100}, .colour = kGreen});
    TestWindow never(display.name(), {.place = {600, 600, 90, 90}, .colour = kWhite, .mapped = false});
    const auto made = startOn({low.context(), high.context(), never.context()}, 300, 100);
    EXPECT_TRUE(shows({{0, 0, kRed}, {99, 50, kRed}, {100, 50, kGreen}, {299, 99, kGreen}}))
        << "one that was never shown has no place";
    high.unmap();
    EXPECT_TRUE(shows({{0, 0, kRed}, {199, 50, kRed}, {200, 50, kBlack}, {299, 99, kBlack}}));
    low.paint(kBlue);
    EXPECT_TRUE(shows({{199, 50, kBlue}, {200, 50, kBlack}}));
    low.unmap();
    EXPECT_TRUE(shows({{0, 0, kBlack}, {150, 50, kBlack}, {250, 50, kBlack}}));
    high.map();
    high.paint(kWhite);
    EXPECT_TRUE(shows({{99, 0, kBlack}, {100, 0, kWhite}, {299, 99, kWhite}}));
    low.map();
    low.paint(kRed);
    EXPECT_TRUE(shows({{99, 0, kRed}, {100, 0, kWhite}}));
    EXPECT_TRUE(frames->failures().empty());
}

TEST_F(X11Canvas, KeepsTheOthersWhenOneIsDestroyedAndFailsOnceWithTheLast) {
    TestWindow first(display.name(), {.place = {0, 0, 100, 100}, .colour = kRed, .repaints = false});
    TestWindow second(display.name(), {.place = {100, 0, 100, 100}, .colour = kGreen, .repaints = false});
    TestWindow third(display.name(), {.place = {0, 100, 200, 100}, .colour = kBlue, .repaints = false});
    const auto made = startOn({first.context(), second.context(), third.context()}, 200, 200);
    EXPECT_TRUE(shows({{50, 50, kRed}, {150, 50, kGreen}, {100, 150, kBlue}}));
    first.destroy();
    EXPECT_TRUE(shows({{50, 50, kBlack}, {150, 50, kGreen}, {100, 150, kBlue}}));
    third.destroy();
    EXPECT_TRUE(shows({{0, 0, kGreen}, {199, 199, kGreen}})) << "the only one fills the picture";
    second.paint(kWhite);
    EXPECT_TRUE(shows({{0, 0, kWhite}, {199, 199, kWhite}}));
    EXPECT_TRUE(frames->failures().empty());
    second.destroy();
    EXPECT_EQ(frames->waitForFailure(), CaptureStatus::kWindowGone);
    EXPECT_EQ(frames->failures().size(), 1u);
}

TEST_F(X11Canvas, FailsOnceWhenAllAreDestroyedTogether) {
    TestWindow parent(display.name(), {.place = {0, 0, 300, 300}, .colour = kWhite});
    TestWindow first(display.name(), {.place = {0, 0, 100, 100}, .colour = kRed, .parent = parent.id()});
    TestWindow second(display.name(), {.place = {100, 0, 100, 100}, .colour = kGreen, .parent = parent.id()});
    const auto made = startOn({first.context(), second.context()}, 200, 100);
    EXPECT_TRUE(shows({{50, 50, kRed}, {150, 50, kGreen}}));
    parent.destroy();
    EXPECT_EQ(frames->waitForFailure(), CaptureStatus::kWindowGone);
    // A start of another selection works, and no second failure came before it.
    TestWindow next(display.name(), {.place = {0, 0, 200, 100}, .colour = kBlue});
    capture.setContexts({next.context()});
    made->start();
    EXPECT_TRUE(shows({{50, 50, kBlue}, {150, 50, kBlue}}));
    EXPECT_EQ(frames->failures().size(), 1u);
}

TEST_F(X11Canvas, NeverTakesUpANumberThatNamedNoWindow) {
    TestWindow first(display.name(), {.place = {0, 0, 100, 100}, .colour = kRed});
    TestWindow second(display.name(), {.place = {100, 0, 100, 100}, .colour = kGreen});
    const xcb_window_t unused = xcb_generate_id(second.connection());
    const auto made = startOn({first.context(), second.context(), ContextID{unused}}, 200, 100);
    EXPECT_TRUE(shows({{50, 50, kRed}, {150, 50, kGreen}}));
    const std::uint32_t white = kWhite;
    xcb_create_window(second.connection(), XCB_COPY_FROM_PARENT, unused, second.screen().root, 0, 0, 200, 100, 0,
                      XCB_WINDOW_CLASS_INPUT_OUTPUT, XCB_COPY_FROM_PARENT, XCB_CW_BACK_PIXEL, &white);
    xcb_map_window(second.connection(), unused);
    second.sync();
    first.destroy();
    second.raise();
    second.paint(kBlue);
    EXPECT_TRUE(shows({{10, 50, kBlack}, {55, 50, kBlue}, {145, 50, kBlue}, {190, 50, kBlack}}))
        << "only the one that was wanted and is left";
}

TEST_F(X11Canvas, CapturesCoveredWindowsAndNothingElse) {
    TestWindow first(display.name(), {.place = {0, 0, 100, 100}, .colour = kRed});
    TestWindow second(display.name(), {.place = {150, 0, 100, 100}, .colour = kGreen});
    TestWindow cover(display.name(), {.place = {0, 0, 1000, 800}, .colour = kWhite});
    const auto made = startOn({first.context(), second.context()}, 250, 100);
    EXPECT_TRUE(shows({{0, 0, kRed}, {99, 99, kRed}, {125, 50, kBlack}, {150, 0, kGreen}, {249, 99, kGreen}}));
    second.paint(kBlue);
    EXPECT_TRUE(shows({{99, 99, kRed}, {125, 50, kBlack}, {150, 0, kBlue}}));
}

// The memory that the server gives a redirected window begins with what is on the screen at its place.
TEST_F(X11Canvas, NeverShowsWhatCoversWindowsThatAreNotRepainted) {
    TestWindow first(display.name(), {.place = {0, 0, 100, 100}, .colour = kRed, .repaints = false});
    TestWindow second(display.name(),
                      {.place = {100, 0, 100, 100}, .colour = kGreen, .background = kGreen, .repaints = false});
    TestWindow cover(display.name(), {.place = {0, 0, 1000, 800}, .colour = kWhite});
    const auto made = startOn({first.context(), second.context()}, 200, 100);
    ASSERT_TRUE(frames->waitForCount(1));
    const auto plane = frames->frames()[0].plane;
    EXPECT_EQ(colourAt(*plane, 50, 50), kBlack);
    EXPECT_EQ(colourAt(*plane, 150, 50), kGreen);
    first.paint(kRed);
    EXPECT_TRUE(shows({{50, 50, kRed}, {150, 50, kGreen}}));
}

TEST_F(X11Canvas, TakesWindowsOfAnotherDepth) {
    TestWindow low(display.name(), {.place = {0, 0, 200, 200}, .colour = kRed});
    TestWindow deep(display.name(),
                    {.place = {50, 60, 70, 80}, .colour = kGreen, .border = 2, .repaints = false, .depth = 32});
    TestWindow high(display.name(), {.place = {100, 100, 50, 50}, .colour = kBlue});
    const auto made = startOn({low.context(), deep.context(), high.context()}, 200, 200);
    EXPECT_TRUE(shows({{51, 61, kRed}, {52, 62, kGreen}, {121, 99, kGreen}, {122, 99, kRed}, {110, 110, kBlue}}));
    deep.paintPart({60, 30, 10, 30}, kWhite);
    EXPECT_TRUE(shows({{111, 92, kGreen}, {112, 92, kWhite}, {112, 99, kWhite}, {112, 100, kBlue}}));
}

TEST_F(X11Canvas, TakesOddSizes) {
    TestWindow first(display.name(), {.place = {3, 5, 101, 77}, .colour = kRed, .repaints = false});
    TestWindow second(display.name(), {.place = {131, 43, 189, 93}, .colour = kGreen, .repaints = false});
    const auto made = startOn({first.context(), second.context()}, 317, 131);
    EXPECT_TRUE(shows({{100, 76, kRed}, {101, 76, kBlack}, {128, 38, kGreen}, {127, 38, kBlack}, {316, 130, kGreen}}));
    second.paintPart({185, 90, 3, 1}, kBlue);
    EXPECT_TRUE(shows({{312, 128, kGreen}, {313, 128, kBlue}, {315, 128, kBlue}, {316, 128, kGreen}}));
    // 203 x 131 in 317 x 131: an odd rest.
    second.resize(75, 93);
    second.paint(kBlue);
    EXPECT_TRUE(shows({{56, 0, kBlack}, {57, 0, kRed}, {259, 130, kBlue}, {260, 130, kBlack}}));
}

TEST_F(X11Canvas, TakesAsManyWindowsAsARequestMayName) {
    constexpr std::size_t kWindows = limitOf(Limit::ContextIdentifiersPerRequest);
    std::vector<std::unique_ptr<TestWindow>> windows;
    std::set<ContextID> contexts;
    const auto colourOf = [](std::size_t i) { return static_cast<std::uint32_t>(0x800000 + i * 0x000301 + 0x10); };
    for (std::size_t i = 0; i < kWindows; ++i) {
        const int x = static_cast<int>(i % 8) * 40, y = static_cast<int>(i / 8) * 30;
        windows.push_back(
            std::make_unique<TestWindow>(display.name(), Look{.place = {x, y, 40, 30}, .colour = colourOf(i)}));
        contexts.insert(windows.back()->context());
    }
    ASSERT_EQ(contexts.size(), 64u);
    const auto made = startOn(contexts, 320, 240);
    const auto all = [&](const Frames& got) {
        if (got.empty() || !got.back().plane) return false;
        for (std::size_t i = 0; i < kWindows; ++i) {
            const int x = static_cast<int>(i % 8) * 40, y = static_cast<int>(i / 8) * 30;
            for (const auto& [dx, dy] : {std::pair{0, 0}, std::pair{39, 29}})
                if (colourAt(*got.back().plane, x + dx, y + dy) != colourOf(i)) return false;
        }
        return true;
    };
    EXPECT_TRUE(frames->waitFor(all));
    for (auto& window : windows) window->paint(kWhite);
    EXPECT_TRUE(shows({{0, 0, kWhite}, {319, 0, kWhite}, {0, 239, kWhite}, {319, 239, kWhite}, {160, 120, kWhite}}));
    for (std::size_t i = 0; i + 1 < kWindows; ++i) windows[i]->destroy();
    windows.back()->paint(kRed);
    EXPECT_TRUE(shows({{0, 0, kRed}, {319, 239, kRed}})) << "the last one is alone";
    EXPECT_TRUE(frames->failures().empty());
}

TEST_F(X11Canvas, FollowsASelectionThatChanges) {
    TestWindow first(display.name(), {.place = {0, 0, 100, 100}, .colour = kRed});
    TestWindow second(display.name(), {.place = {100, 0, 100, 100}, .colour = kGreen});
    TestWindow third(display.name(), {.place = {200, 0, 100, 100}, .colour = kBlue});
    const auto made = startOn({first.context(), second.context()}, 200, 100);
    EXPECT_TRUE(shows({{50, 50, kRed}, {150, 50, kGreen}}));
    capture.setContexts({second.context(), third.context()});
    EXPECT_TRUE(shows({{50, 50, kGreen}, {150, 50, kBlue}}));
    capture.setContexts({third.context()});
    EXPECT_TRUE(shows({{51, 50, kBlue}, {149, 50, kBlue}, {10, 50, kBlack}}));
    capture.setContexts({first.context(), third.context()});
    EXPECT_TRUE(shows({{10, 50, kRed}, {100, 50, kBlack}, {190, 50, kBlue}}));
    capture.setMirroringMode(DisplayCloneControl::kMirrorDisplay);
    EXPECT_TRUE(shows({{68, 5, kBlue}, {55, 5, kGreen}, {43, 5, kRed}, {100, 90, kBlack}}));
    capture.setMirroringMode(DisplayCloneControl::kCloneContexts);
    EXPECT_TRUE(shows({{10, 50, kRed}, {100, 50, kBlack}, {190, 50, kBlue}}));
    // Events of the screen were not lost on the way.
    third.move(100, 0);
    EXPECT_TRUE(shows({{50, 50, kRed}, {150, 50, kBlue}}));
    EXPECT_TRUE(frames->failures().empty());
}

TEST_F(X11Canvas, TellsWhatChangedAndMakesNoPictureOfWhatIsCovered) {
    TestWindow low(display.name(), {.place = {0, 0, 300, 200}, .colour = kRed, .repaints = false});
    TestWindow high(display.name(), {.place = {200, 0, 300, 200}, .colour = kGreen, .repaints = false});
    const auto made = startOn({low.context(), high.context()}, 500, 200);
    ASSERT_TRUE(shows({{199, 50, kRed}, {200, 50, kGreen}}));
    low.paintPart({210, 10, 20, 20}, kBlue);   // covered
    high.paintPart({210, 10, 20, 20}, kBlue);  // seen at (410, 10)
    ASSERT_TRUE(frames->waitFor(
        [](const Frames& got) { return !got.empty() && colourAt(*got.back().plane, 410, 10) == kBlue; }));
    bool told = false;
    for (const CapturedFrame& frame : frames->frames()) {
        if (frame.damage.empty()) continue;  // a repeat
        EXPECT_EQ(frame.damage, (std::vector<PixelRect>{{410, 10, 20, 20}}));
        told = true;
        EXPECT_EQ(colourAt(*frame.plane, 215, 15), kGreen);
    }
    EXPECT_TRUE(told);
    // Uncovered, it is there.
    high.move(300, 0);
    low.raise();
    EXPECT_TRUE(shows({{160, 40, kRed}, {180, 30, kBlue}}));
}

class X11CanvasOnASmallScreen : public X11Canvas {
protected:
    X11CanvasOnASmallScreen() : X11Canvas("400x300x24") {}
};

// With a window in each corner of the screen, the canvas is the screen: whatever happens, both must look alike.
TEST_F(X11CanvasOnASmallScreen, LooksLikeTheScreenWhateverTheWindowsDo) {
    TestWindow topLeft(display.name(), {.place = {0, 0, 3, 3}, .colour = kWhite});
    TestWindow bottomRight(display.name(), {.place = {397, 297, 3, 3}, .colour = kBlue});
    std::vector<std::unique_ptr<TestWindow>> windows;
    std::set<ContextID> contexts{topLeft.context(), bottomRight.context()};
    std::mt19937 random(11);
    const auto below = [&](int limit) { return static_cast<int>(random() % static_cast<unsigned>(limit)); };
    for (int i = 0; i < 6; ++i) {
        windows.push_back(std::make_unique<TestWindow>(
            display.name(), Look{.place = {below(300), below(200), 30 + below(100), 30 + below(100)},
                                 .colour = static_cast<std::uint32_t>(0x102030 * (i + 1)),
                                 .background = 0x102030 * (i + 1)}));
        contexts.insert(windows.back()->context());
    }
    // Slow enough for several changes to come together.
    const auto made = startOn(contexts, 400, 300, 30);
    const TestScreen screen(display.name());
    for (int round = 0; round < 25; ++round) {
        for (int i = 0; i < 12; ++i) {
            TestWindow& window = *windows[random() % windows.size()];
            // Often nothing but parts, so that pictures are made of several that changed.
            switch (round % 2 == 0 ? 6 : random() % 7) {
                case 0: window.move(below(420) - 40, below(320) - 40); break;
                case 1: window.raise(); break;
                case 2: window.resize(20 + below(150), 20 + below(150)); break;
                case 3: window.unmap(); break;
                case 4: window.map(); break;
                case 5: window.paint(random() & 0xFFFFFF); break;
                default: window.paintPart({below(60), below(60), 1 + below(40), 1 + below(40)}, random() & 0xFFFFFF);
            }
        }
        const auto limit = std::chrono::steady_clock::now() + kGenerous;
        bool same = false;
        while (!same && std::chrono::steady_clock::now() < limit) {
            const Pixels shown = screen.withoutPointer();
            const auto alike = [&](const Frames& got) {
                return !got.empty() && got.back().plane && uprightPixels(*got.back().plane, 0) == shown;
            };
            same = frames->waitFor(alike, std::chrono::milliseconds(20));
        }
        ASSERT_TRUE(same) << "round " << round;
        frames->clear();
    }
    EXPECT_TRUE(frames->failures().empty());
}

}  // namespace
}  // namespace lumacast::test
