// What is special about capturing on X11: windows that are covered, hidden, resized, moved and destroyed, and servers
// that hang or die.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <random>
#include <utility>

#include "linux/display/CaptureStatus.h"
#include "linux/display/X11DisplayCapture.h"
#include "linux/system/LinuxClock.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/CapturedFrames.h"
#include "tests/contract/Colours.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/contract/TestWindow.h"
#include "tests/contract/X11CaptureFixture.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast::test {
namespace {

using Frames = CapturedFrames::Frames;
using Look = TestWindow::Look;

class TemporaryFile final {
public:
    TemporaryFile() : descriptor_(::mkstemp(path_.data())) {}
    ~TemporaryFile() { ::unlink(path_.c_str()); }
    const std::string& path() const { return path_; }
    void write(const std::string& text) const {
        EXPECT_EQ(::write(descriptor_.get(), text.data(), text.size()), static_cast<ssize_t>(text.size()));
    }

private:
    std::string path_ = (std::filesystem::temp_directory_path() / "lumacast-key-XXXXXX").string();
    const Fd descriptor_;
};

class X11Capture : public X11CaptureFixture {};

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

TEST_F(X11Capture, SealsItsPlanesSoThatNobodyElseCanWriteOrResizeThem) {
    TestWindow window(display.name(), {.colour = kRed});
    frames->keepPlanes = true;
    const auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForColour(kRed));
    const auto plane = frames->frames().back().plane;
    const int descriptor = plane->descriptor();
    EXPECT_EQ(::fcntl(descriptor, F_GET_SEALS) & (F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_SEAL),
              F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_SEAL);
    const std::size_t size = plane->pixels().size();
    EXPECT_EQ(size, plane->stride() * 240);
    EXPECT_EQ(::mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_SHARED, descriptor, 0), MAP_FAILED);
    EXPECT_NE(::ftruncate(descriptor, 1), 0);
    void* const readable = ::mmap(nullptr, size, PROT_READ, MAP_SHARED, descriptor, 0);
    ASSERT_NE(readable, MAP_FAILED);
    EXPECT_EQ(std::memcmp(readable, plane->pixels().data(), size), 0) << "the very same picture";
    ::munmap(readable, size);
}

TEST_F(X11Capture, DropsFramesWhenAllPlanesAreHeldAndGoesOnWhenTheyAreGivenBack) {
    TestWindow window(display.name(), {.colour = 1});
    frames->keepPlanes = true;
    const auto made = startOn(window, 320, 240, 1000);
    ASSERT_TRUE(frames->waitForCount(1));
    std::uint32_t colour = 1;
    const auto limit = std::chrono::steady_clock::now() + kGenerous;
    while (made->counters().dropped == 0 && std::chrono::steady_clock::now() < limit) {
        const std::size_t before = frames->count();
        window.paint(++colour);
        frames->waitFor([&](const Frames& got) { return got.size() > before; }, std::chrono::milliseconds(50));
    }
    EXPECT_GT(made->counters().dropped, 0u);
    for (const CapturedFrame& frame : frames->frames())
        EXPECT_EQ(colourAt(*frame.plane, 1, 1), frame.colour) << "a held picture never changes";
    frames->keepPlanes = false;
    frames->clear();
    ASSERT_TRUE(frames->waitForColour(colour)) << "the newest picture comes, without anything new being drawn";
}

TEST_F(X11Capture, GivesPlanesBackThatWereNeededOnlyForAMoment) {
    const auto planes = [] {
        std::ptrdiff_t count = 0;
        for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
            std::error_code gone;
            count += std::filesystem::read_symlink(entry, gone).string().starts_with("/memfd:lumacast-plane");
        }
        return count;
    };
    TestWindow window(display.name(), {.colour = 1});
    frames->keepPlanes = true;
    const auto made = startOn(window, 320, 240);
    std::uint32_t colour = 1;
    const auto paintNext = [&] {
        const std::size_t before = frames->count();
        window.paint(++colour);
        return frames->waitFor([&](const Frames& got) { return got.size() > before; });
    };
    while (planes() < 12) ASSERT_TRUE(paintNext());
    frames->keepPlanes = false;
    frames->clear();
    const auto limit = std::chrono::steady_clock::now() + kGenerous;
    while (planes() > 3 && std::chrono::steady_clock::now() < limit) ASSERT_TRUE(paintNext());
    EXPECT_LE(planes(), 3) << "one that is shown, one that is written, one in the encoder's hands";
    ASSERT_TRUE(frames->waitForColour(colour));
    // What is made anew is whole.
    frames->keepPlanes = true;
    while (planes() < 12) ASSERT_TRUE(paintNext());
    for (const CapturedFrame& frame : frames->frames()) EXPECT_TRUE(frame.oneColour);
}

TEST_F(X11Capture, BringsEveryPlaneUpToDate) {
    TestWindow window(display.name(), {.colour = kRed, .repaints = false});
    const auto made = startOn(window, 320, 240, 1000);
    ASSERT_TRUE(frames->waitForColour(kRed));
    // Small squares, each seen before the next is drawn, so that planes take turns with different histories.
    std::vector<std::shared_ptr<SharedPlane>> some;
    frames->keepPlanes = true;
    for (int i = 0; i < 60; ++i) {
        const int x = 16 * (i % 20), y = 16 * (i / 20);
        window.paintPart({x, y, 16, 16}, kGreen);
        ASSERT_TRUE(frames->waitFor([&](const Frames& got) {
            return !got.empty() && got.back().plane && colourAt(*got.back().plane, x + 8, y + 8) == kGreen;
        })) << i;
        const auto plane = frames->frames().back().plane;
        for (int j = 0; j < 60; ++j)
            ASSERT_EQ(colourAt(*plane, 16 * (j % 20) + 8, 16 * (j / 20) + 8), j <= i ? kGreen : kRed) << i << " " << j;
        if (i % 7 == 0) some.push_back(plane);
        if (some.size() > 3) some.erase(some.begin());
        frames->clear();
    }
}

// An application and a source that are equally fast: every picture once, in order, none torn. On a machine that is busy
// with something else some may be missed, but none is ever shown twice as new.
TEST_F(X11Capture, TakesEveryPictureOfASteadyApplicationOnce) {
    frames->checkEvery = 32;
    for (const int perSecond : {60, 30}) {
        TestWindow window(display.name(), {.place = {0, 0, 640, 480}, .colour = 0x010000, .repaints = false});
        frames->clear();
        const auto made = startOn(window, 640, 480);
        ASSERT_TRUE(frames->waitForCount(1));
        constexpr int kPictures = 120;
        const auto began = std::chrono::steady_clock::now();
        for (int i = 1; i <= kPictures; ++i) {
            std::this_thread::sleep_until(began + std::chrono::nanoseconds(1'000'000'000) * i / perSecond);
            window.paint(0x010000 + static_cast<std::uint32_t>(i));
        }
        ASSERT_TRUE(frames->waitFor([](const Frames& got) { return got.back().colour == 0x010000 + kPictures; }));
        made->stop();
        std::uint32_t before = 0x010000 - 1;
        int taken = 0;
        for (const CapturedFrame& frame : frames->frames()) {
            EXPECT_TRUE(frame.oneColour);
            if (frame.damage.empty()) continue;  // a repeat
            EXPECT_GT(frame.colour, before);
            before = frame.colour;
            ++taken;
        }
        EXPECT_GE(taken, kPictures / 2);
        std::printf("             %d of %d pictures at %d a second\n", taken - 1, kPictures, perSecond);
    }
}

TEST_F(X11Capture, DamageTellsWhatDiffersFromTheLastPicture) {
    TestWindow window(display.name(), {.place = {0, 0, 640, 480}, .colour = kRed, .repaints = false});
    const auto made = startOn(window, 640, 480);
    ASSERT_TRUE(frames->waitForColour(kRed));
    EXPECT_EQ(frames->frames()[0].damage, (std::vector<PixelRect>{{0, 0, 640, 480}}));
    const std::size_t before = frames->count();
    window.paintPart({100, 200, 30, 20}, kGreen);
    ASSERT_TRUE(frames->waitFor([&](const Frames& got) {
        return std::any_of(got.begin() + static_cast<std::ptrdiff_t>(before), got.end(),
                           [](const CapturedFrame& frame) {
                               return frame.damage == std::vector<PixelRect>{{100, 200, 30, 20}};
                           });
    }));
    const Frames got = frames->frames();
    for (std::size_t i = 1; i < got.size(); ++i) EXPECT_EQ(got[i].number, got[i - 1].number + 1);
}

TEST_F(X11Capture, FailsOnceWhenTheServerDiesAndWorksWithTheNextOne) {
    const std::string name = PrivateDisplay::nameOfOnesOwn();
    auto first = std::make_unique<PrivateDisplay>("800x600x24", name);
    ASSERT_EQ(first->name(), name);
    X11DisplayCapture lasting(name, clock, scheduler);
    auto window = std::make_unique<TestWindow>(name, Look{.colour = kRed});
    lasting.setContexts({window->context()});
    lasting.setMirroringMode(DisplayCloneControl::kCloneContexts);
    const auto made = lasting.makeSource({320, 240}, MediaTime::make(1, 60));
    made->setDelegate(frames);
    made->openGate();
    made->start();
    ASSERT_TRUE(frames->waitForColour(kRed));
    first->crash();
    EXPECT_EQ(frames->waitForFailure(), CaptureStatus::kDisplayLost);
    first.reset();
    made->start();
    ASSERT_TRUE(frames->waitFor([&](const Frames&) { return frames->failuresUnlocked() >= 2; }));
    EXPECT_EQ(frames->failures()[1], CaptureStatus::kNoDisplay);
    window.reset();

    const PrivateDisplay next("800x600x24", name);
    ASSERT_EQ(next.name(), name);
    TestWindow another(name, {.colour = kGreen});
    made->start();
    ASSERT_TRUE(frames->waitFor([&](const Frames&) { return frames->failuresUnlocked() >= 3; }));
    EXPECT_EQ(frames->failures()[2], CaptureStatus::kWindowGone) << "the old server's windows are nobody's";
    lasting.setContexts({another.context()});
    made->start();
    ASSERT_TRUE(frames->waitForColour(kGreen));
    EXPECT_EQ(frames->failures().size(), 3u);
}

TEST_F(X11Capture, NobodyWaitsForAServerThatHangs) {
    TestWindow window(display.name(), {.colour = kRed});
    auto made = startOn(window, 320, 240);
    ASSERT_TRUE(frames->waitForColour(kRed));
    window.paint(kGreen);
    display.hang();
    const auto began = std::chrono::steady_clock::now();
    made->closeGate(GateWait::UntilDelivered);
    made->stop();
    made->openGate();
    made->start();
    made.reset();
    EXPECT_LT(std::chrono::steady_clock::now() - began, std::chrono::seconds(2));
    display.goOn();
}

TEST_F(X11Capture, EndsWhileTheServerHangs) {
    auto second = std::make_unique<X11DisplayCapture>(display.name(), clock, scheduler);
    second->setMirroringMode(DisplayCloneControl::kMirrorDisplay);
    display.hang();
    const auto made = second->makeSource({320, 240}, MediaTime::make(1, 60));
    made->setDelegate(frames);
    made->openGate();
    made->start();
    const auto began = std::chrono::steady_clock::now();
    second.reset();
    EXPECT_LT(std::chrono::steady_clock::now() - began, std::chrono::seconds(5)) << "its lane waits for the connection";
    display.goOn();
}

TEST(X11CaptureWithKey, ShowsTheServerTheUsersKey) {
    const TemporaryFile authority;
    // This machine's, any display; the secret is sixteen bytes.
    const std::string secret = "sixteen-bytes-ok";
    authority.write(std::string("\xff\xff\0\0\0\0\0\x12MIT-MAGIC-COOKIE-1\0\x10", 28) + secret);
    const PrivateDisplay display("800x600x24", {}, {"-auth", authority.path()});
    ASSERT_FALSE(display.name().empty());
    x11::Interrupt interrupt;
    ::setenv("XAUTHORITY", "/nowhere", 1);
    EXPECT_EQ(x11::X11Connection::open(display.name(), interrupt), nullptr) << "it lets nobody in without the key";
    ::setenv("XAUTHORITY", authority.path().c_str(), 1);
    EXPECT_NE(x11::X11Connection::open(display.name(), interrupt), nullptr);
    ::unsetenv("XAUTHORITY");
}

TEST(X11CaptureWithoutDisplay, FailsAfterTheStart) {
    LinuxClock clock;
    clock.startCaptureClock();
    const auto loop = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler(loop);
    RunningThreadLoop running(*loop);
    for (const char* name : {"", ":4711", "elsewhere:0", "nonsense"}) {
        X11DisplayCapture capture(name, clock, scheduler);
        const auto frames = std::make_shared<CapturedFrames>();
        const auto made = capture.makeSource({320, 240}, MediaTime::make(1, 60));
        ASSERT_NE(made, nullptr);
        made->setDelegate(frames);
        made->openGate();
        made->start();
        EXPECT_EQ(frames->waitForFailure(), CaptureStatus::kNoDisplay) << name;
    }
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
