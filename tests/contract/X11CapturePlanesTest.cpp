// The planes of capturing on X11: what is in them, who holds them, and what has changed.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <memory>
#include <vector>

#include "tests/contract/CapturedFrames.h"
#include "tests/contract/Colours.h"
#include "tests/contract/TestWindow.h"
#include "tests/contract/X11CaptureFixture.h"

namespace lumacast::test {
namespace {

using Frames = CapturedFrames::Frames;

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

}  // namespace
}  // namespace lumacast::test
