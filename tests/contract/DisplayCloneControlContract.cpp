// What the display clone shows is what capture sources capture.

#include <gtest/gtest.h>

#include <functional>
#include <memory>

#include "linux/display/X11DisplayCapture.h"
#include "linux/system/LinuxClock.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/CapturedFrames.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/contract/TestWindow.h"
#include "tests/fakes/FakeDisplayCloneControl.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast {
namespace {

/// What a capture source shows: one of two window layers, or the screen, on which the second layer covers half of the
/// first.
enum class Shown { First, Second, Screen };

class CloneControlWorld {
public:
    virtual ~CloneControlWorld() = default;
    virtual DisplayCloneControl& control() = 0;
    virtual ContextID layer(Shown which) = 0;
    /// Starts a capture source, or lets the one that runs go on.
    virtual void capture() = 0;
    /// Whether capture shows this within a generous bound.
    virtual bool shows(Shown what) = 0;
};

/// The fake's capture shows no window, so what was recorded is what would be shown.
class FakeCloneControlWorld final : public CloneControlWorld {
public:
    DisplayCloneControl& control() override { return control_; }
    ContextID layer(Shown which) override { return ContextID{which == Shown::First ? 11u : 12u}; }
    void capture() override {}
    bool shows(Shown what) override {
        if (control_.mode() == DisplayCloneControl::kMirrorDisplay) return what == Shown::Screen;
        if (control_.mode() != DisplayCloneControl::kCloneContexts) return false;
        return what != Shown::Screen && control_.contexts() == std::set{layer(what)};
    }

private:
    FakeDisplayCloneControl control_;
};

class PortCloneControlWorld final : public CloneControlWorld {
public:
    PortCloneControlWorld() { clock_.startCaptureClock(); }
    DisplayCloneControl& control() override { return capture_; }
    ContextID layer(Shown which) override { return which == Shown::First ? first_.context() : second_.context(); }
    void capture() override {
        if (source_) return;
        source_ = capture_.makeSource({640, 480}, MediaTime::make(1, 60));
        source_->setDelegate(frames_);
        source_->openGate();
        source_->start();
    }
    bool shows(Shown what) override {
        return frames_->waitFor([what](const test::CapturedFrames::Frames& frames) {
            if (frames.empty()) return false;
            const test::CapturedFrame& last = frames.back();
            if (what == Shown::Screen) return last.colour == kScreenMiddle && !last.oneColour;
            return last.oneColour && last.colour == (what == Shown::First ? kRed : kGreen);
        });
    }

private:
    static constexpr std::uint32_t kRed = 0xC01020, kGreen = 0x10B030, kScreenMiddle = kGreen;

    test::PrivateDisplay display_{"640x480x24"};
    // Both are as large as a frame, so that each layer alone is one colour.
    test::TestWindow first_{display_.name(), {.place = {0, 0, 640, 480}, .colour = kRed}};
    test::TestWindow second_{display_.name(), {.place = {320, 0, 640, 480}, .colour = kGreen}};
    LinuxClock clock_;
    std::shared_ptr<ThreadLoop> loop_ = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler_{loop_};
    RunningThreadLoop running_{*loop_};
    X11DisplayCapture capture_{display_.name(), clock_, scheduler_};
    std::shared_ptr<test::CapturedFrames> frames_ = std::make_shared<test::CapturedFrames>();
    std::shared_ptr<DisplayCaptureSource> source_;
};

using Maker = std::function<std::unique_ptr<CloneControlWorld>()>;

class DisplayCloneControlContract : public ::testing::TestWithParam<Maker> {
protected:
    std::unique_ptr<CloneControlWorld> world_ = GetParam()();
    DisplayCloneControl& control_ = world_->control();
};

TEST_P(DisplayCloneControlContract, ALayerThatWasChosenIsShown) {
    control_.setContexts({world_->layer(Shown::Second)});
    control_.setMirroringMode(DisplayCloneControl::kCloneContexts);
    world_->capture();
    EXPECT_TRUE(world_->shows(Shown::Second));
}

TEST_P(DisplayCloneControlContract, ALayerIsShownAloneThoughOthersLieOnIt) {
    control_.setMirroringMode(DisplayCloneControl::kCloneContexts);
    control_.setContexts({world_->layer(Shown::First)});
    world_->capture();
    EXPECT_TRUE(world_->shows(Shown::First));
}

TEST_P(DisplayCloneControlContract, TheWholeScreenIsShownWhenItIsMirrored) {
    control_.setMirroringMode(DisplayCloneControl::kMirrorDisplay);
    world_->capture();
    EXPECT_TRUE(world_->shows(Shown::Screen));
}

TEST_P(DisplayCloneControlContract, AnotherChoiceCountsForASourceThatRuns) {
    control_.setContexts({world_->layer(Shown::First)});
    control_.setMirroringMode(DisplayCloneControl::kCloneContexts);
    world_->capture();
    ASSERT_TRUE(world_->shows(Shown::First));
    control_.setContexts({world_->layer(Shown::Second)});
    EXPECT_TRUE(world_->shows(Shown::Second));
    control_.setMirroringMode(DisplayCloneControl::kMirrorDisplay);
    EXPECT_TRUE(world_->shows(Shown::Screen));
    control_.setMirroringMode(DisplayCloneControl::kCloneContexts);
    EXPECT_TRUE(world_->shows(Shown::Second));
}

INSTANTIATE_TEST_SUITE_P(Fake, DisplayCloneControlContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeCloneControlWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, DisplayCloneControlContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortCloneControlWorld>(); })));

}  // namespace
}  // namespace lumacast
