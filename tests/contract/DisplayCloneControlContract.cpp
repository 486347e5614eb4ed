#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <thread>

#include "headless/display/Painter.h"
#include "headless/display/SyntheticDisplay.h"
#include "headless/display/SyntheticWindows.h"
#include "linux/display/X11DisplayCapture.h"
#include "linux/system/LinuxClock.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/CapturedFrames.h"
#include "tests/contract/Colours.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/contract/TestScreen.h"
#include "tests/contract/TestWindow.h"
#include "tests/fakes/FakeDisplayCloneControl.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast {
namespace {

using test::kGreen;
using test::kRed;

class CloneWorld {
public:
    virtual ~CloneWorld() = default;
    virtual DisplayCloneControl& control() = 0;
    virtual ContextID first() = 0;
    virtual ContextID second() = 0;
    /// Whether the clone comes to show this and nothing else.
    virtual bool shows(ContextID window) = 0;
    virtual bool showsTheScreen() = 0;
    virtual bool showsNothing() = 0;
};

class FakeCloneWorld final : public CloneWorld {
public:
    DisplayCloneControl& control() override { return control_; }
    ContextID first() override { return ContextID{11}; }
    ContextID second() override { return ContextID{12}; }
    bool shows(ContextID window) override {
        return control_.mode() == DisplayCloneControl::kCloneContexts && control_.contexts() == std::set{window};
    }
    bool showsTheScreen() override { return control_.mode() == DisplayCloneControl::kMirrorDisplay; }
    bool showsNothing() override { return control_.mode() == DisplayCloneControl::kOff; }

private:
    FakeDisplayCloneControl control_;
};

/// Two windows of one colour each; what is shown is what a running source delivers.
class PortCloneWorld final : public CloneWorld {
public:
    PortCloneWorld() {
        clock_.startCaptureClock();
        source_->setDelegate(frames_);
        source_->openGate();
        source_->start();
    }
    DisplayCloneControl& control() override { return capture_; }
    ContextID first() override { return first_.context(); }
    ContextID second() override { return second_.context(); }
    bool shows(ContextID window) override {
        return frames_->waitForColour(window == first_.context() ? kRed : kGreen);
    }
    // Both windows at their places, and the empty screen between them.
    bool showsTheScreen() override {
        frames_->keepPlanes = true;
        return frames_->waitFor([](const test::CapturedFrames::Frames& got) {
            if (got.empty() || !got.back().plane) return false;
            const test::Pixels screen = test::uprightPixels(*got.back().plane, got.back().transformFlags);
            return screen.width == 400 && screen.at(50, 50) == kRed && screen.at(250, 50) == kGreen &&
                   screen.at(190, 50) == 0;
        });
    }
    // Whatever is drawn, nothing is delivered until something is to be shown again.
    bool showsNothing() override {
        const test::TestWindow probe(display_.name(), {.place = {0, 0, 400, 300}, .colour = 0x123456});
        first_.paint(kRed);
        const std::size_t before = frames_->count();
        // A source of another maker sees the screen meanwhile.
        X11DisplayCapture other(display_.name(), clock_, scheduler_);
        other.setMirroringMode(DisplayCloneControl::kMirrorDisplay);
        const auto seen = std::make_shared<test::CapturedFrames>();
        const auto source = other.makeSource({400, 300}, MediaTime::make(1, 60));
        source->setDelegate(seen);
        source->openGate();
        source->start();
        if (!seen->waitForCount(3)) return false;  // more than a second: it is still
        return frames_->count() <= before + 1;
    }

private:
    test::PrivateDisplay display_{"400x300x24"};
    test::TestWindow first_{display_.name(), {.place = {0, 0, 160, 120}, .colour = kRed}};
    test::TestWindow second_{display_.name(), {.place = {220, 0, 160, 120}, .colour = kGreen}};
    LinuxClock clock_;
    const std::shared_ptr<ThreadLoop> loop_ = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler_{loop_};
    RunningThreadLoop running_{*loop_};
    X11DisplayCapture capture_{display_.name(), clock_, scheduler_};
    const std::shared_ptr<test::CapturedFrames> frames_ = std::make_shared<test::CapturedFrames>();
    const std::shared_ptr<DisplayCaptureSource> source_ = capture_.makeSource({400, 300}, MediaTime::make(1, 60));
};

/// Two windows of this process; what is shown is said by the squares in a running source's pictures.
class HeadlessCloneWorld final : public CloneWorld {
public:
    HeadlessCloneWorld() {
        clock_.startCaptureClock();
        frames_->keepPlanes = true;
        source_->setDelegate(frames_);
        source_->openGate();
        source_->start();
    }
    DisplayCloneControl& control() override { return display_; }
    ContextID first() override { return headless::windowOf(ProcessID{::getpid()}, 0); }
    ContextID second() override { return headless::windowOf(ProcessID{::getpid()}, 1); }
    bool shows(ContextID window) override { return showsOnly(headless::colourOf(window)); }
    bool showsTheScreen() override { return showsOnly(headless::kScreenColour); }
    // Nothing more is delivered, while a source of another display delivers on.
    bool showsNothing() override {
        const std::size_t before = frames_->count();
        headless::SyntheticDisplay other(headless::Show(clock_.hostTime()), clock_, scheduler_);
        other.setMirroringMode(DisplayCloneControl::kMirrorDisplay);
        const auto seen = std::make_shared<test::CapturedFrames>();
        const auto source = other.makeSource({400, 300}, MediaTime::make(1, 60));
        source->setDelegate(seen);
        source->openGate();
        source->start();
        return seen->waitForCount(10) && frames_->count() <= before + 1;
    }

private:
    bool showsOnly(std::uint32_t colour) {
        return frames_->waitFor([this, colour](const test::CapturedFrames::Frames& got) {
            if (got.empty() || !got.back().plane) return false;
            const test::Pixels upright = test::uprightPixels(*got.back().plane, got.back().transformFlags);
            const int side = upright.height / 8, middle = side + side / 2;
            const auto square = [&](int place) { return upright.at(middle + place * 2 * side, middle); };
            return square(0) == colour && square(1) != headless::colourOf(first()) && square(1) != headless::colourOf(second());
        });
    }

    LinuxClock clock_;
    const std::shared_ptr<ThreadLoop> loop_ = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler_{loop_};
    RunningThreadLoop running_{*loop_};
    headless::SyntheticDisplay display_{headless::Show(clock_.hostTime()), clock_, scheduler_};
    const std::shared_ptr<test::CapturedFrames> frames_ = std::make_shared<test::CapturedFrames>();
    const std::shared_ptr<DisplayCaptureSource> source_ = display_.makeSource({400, 300}, MediaTime::make(1, 60));
};

using Maker = std::function<std::unique_ptr<CloneWorld>()>;

class DisplayCloneControlContract : public ::testing::TestWithParam<Maker> {
protected:
    const std::unique_ptr<CloneWorld> world_ = GetParam()();
    DisplayCloneControl& control_ = world_->control();
};

TEST_P(DisplayCloneControlContract, ShowsNothingAtFirst) { EXPECT_TRUE(world_->showsNothing()); }

TEST_P(DisplayCloneControlContract, ShowsTheScreen) {
    control_.setMirroringMode(DisplayCloneControl::kMirrorDisplay);
    EXPECT_TRUE(world_->showsTheScreen());
}

TEST_P(DisplayCloneControlContract, ShowsTheContextsAndFollowsTheirChange) {
    control_.setContexts({world_->first()});
    control_.setMirroringMode(DisplayCloneControl::kCloneContexts);
    EXPECT_TRUE(world_->shows(world_->first()));
    control_.setContexts({world_->second()});
    EXPECT_TRUE(world_->shows(world_->second()));
}

TEST_P(DisplayCloneControlContract, ShowsNothingOnceItIsOff) {
    control_.setContexts({world_->first()});
    control_.setMirroringMode(DisplayCloneControl::kCloneContexts);
    EXPECT_TRUE(world_->shows(world_->first()));
    control_.setMirroringMode(DisplayCloneControl::kOff);
    EXPECT_TRUE(world_->showsNothing());
}

TEST_P(DisplayCloneControlContract, TakesChangesFromAnyLane) {
    std::vector<std::thread> lanes;
    for (int lane = 0; lane < 4; ++lane)
        lanes.emplace_back([this, lane] {
            for (int i = 0; i < 200; ++i) {
                control_.setContexts({lane % 2 == 0 ? world_->first() : world_->second()});
                control_.setMirroringMode(i % 2 == 0 ? DisplayCloneControl::kOff : DisplayCloneControl::kCloneContexts);
            }
        });
    for (std::thread& lane : lanes) lane.join();
    control_.setContexts({world_->second()});
    EXPECT_TRUE(world_->shows(world_->second()));
}

INSTANTIATE_TEST_SUITE_P(Fake, DisplayCloneControlContract,
                         ::testing::Values([] { return std::make_unique<FakeCloneWorld>(); }));
INSTANTIATE_TEST_SUITE_P(Port, DisplayCloneControlContract,
                         ::testing::Values([] { return std::make_unique<PortCloneWorld>(); }));
INSTANTIATE_TEST_SUITE_P(Headless, DisplayCloneControlContract,
                         ::testing::Values([] { return std::make_unique<HeadlessCloneWorld>(); }));

}  // namespace
}  // namespace lumacast
