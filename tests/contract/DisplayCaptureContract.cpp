#include <gtest/gtest.h>

#include <functional>
#include <memory>

#include "headless/display/SyntheticDisplay.h"
#include "headless/display/SyntheticWindows.h"
#include "linux/display/X11DisplayCapture.h"
#include "linux/system/LinuxClock.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/CapturedFrames.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/contract/Skip.h"
#include "tests/contract/TestWindow.h"
#include "tests/fakes/FakeDisplayCapture.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;
using test::CapturedFrame;
using test::CapturedFrames;
using Frames = CapturedFrames::Frames;

const MediaTime kSixtieth = MediaTime::make(1, 60);

class CaptureWorld {
public:
    virtual ~CaptureWorld() = default;
    virtual DisplayCapture& capture() = 0;
    /// Something changes on what is captured.
    virtual void change() = 0;
    /// Lets the next start of a source fail.
    virtual void letTheNextStartFail() = 0;
    virtual void letStartsSucceed() = 0;
    /// Why what is captured never stands still; empty where it does until change().
    virtual std::string whyNothingStandsStill() const { return {}; }

    Clock& clock() { return clock_; }
    SerialQueue& mainQueue() { return *loop_; }

protected:
    LinuxClock clock_;
    const std::shared_ptr<ThreadLoop> loop_ = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler_{loop_};
    RunningThreadLoop running_{*loop_};
};

class FakeCaptureWorld final : public CaptureWorld {
public:
    DisplayCapture& capture() override { return capture_; }
    void change() override {
        for (const auto& source : capture_.sources()) source->change();
    }
    void letTheNextStartFail() override { faults_.failNext("DisplayCapture.start"); }
    void letStartsSucceed() override { faults_.clear(); }

private:
    FaultPlan faults_;
    FakeDisplayCapture capture_{scheduler_, clock_, faults_};
};

class PortCaptureWorld final : public CaptureWorld {
public:
    PortCaptureWorld() { letStartsSucceed(); }
    DisplayCapture& capture() override { return capture_; }
    void change() override { window_.paint(++colour_); }
    void letTheNextStartFail() override { capture_.setContexts({ContextID{0x7ffffff0}}); }
    void letStartsSucceed() override {
        capture_.setContexts({window_.context()});
        capture_.setMirroringMode(DisplayCloneControl::kCloneContexts);
    }

private:
    test::PrivateDisplay display_;
    test::TestWindow window_{display_.name(), {.colour = 1}};
    std::uint32_t colour_ = 1;
    X11DisplayCapture capture_{display_.name(), clock_, scheduler_};
};

/// A window of this process.
class HeadlessCaptureWorld final : public CaptureWorld {
public:
    HeadlessCaptureWorld() { letStartsSucceed(); }
    DisplayCapture& capture() override { return display_; }
    void change() override {}
    void letTheNextStartFail() override { display_.setContexts({ContextID{0x7ffffff0}}); }
    void letStartsSucceed() override {
        display_.setContexts({headless::windowOf(ProcessID{::getpid()})});
        display_.setMirroringMode(DisplayCloneControl::kCloneContexts);
    }
    std::string whyNothingStandsStill() const override { return "what the synthetic display shows moves all the time"; }

private:
    headless::SyntheticDisplay display_{headless::Show(clock_.hostTime()), clock_, scheduler_};
};

using Maker = std::function<std::unique_ptr<CaptureWorld>()>;

class DisplayCaptureContract : public ::testing::TestWithParam<Maker> {
protected:
    struct Watched {
        std::shared_ptr<CapturedFrames> frames = std::make_shared<CapturedFrames>();
        std::shared_ptr<DisplayCaptureSource> source;
    };
    Watched make(MediaTime interval = kSixtieth) {
        Watched watched;
        watched.source = world_->capture().makeSource({320, 240}, interval);
        watched.source->setDelegate(watched.frames);
        return watched;
    }
    Watched started(MediaTime interval = kSixtieth) {
        Watched watched = make(interval);
        watched.source->openGate();
        watched.source->start();
        return watched;
    }
    /// Until the source has delivered `count` frames, with something changing all the time.
    bool deliversWithChanges(const Watched& watched, std::size_t count) {
        const auto limit = std::chrono::steady_clock::now() + test::kGenerous;
        while (watched.frames->count() < count && std::chrono::steady_clock::now() < limit) {
            const std::size_t before = watched.frames->count();
            world_->change();
            watched.frames->waitFor([&](const Frames& got) { return got.size() > before; }, 200ms);
        }
        return watched.frames->count() >= count;
    }
    /// Time in which another source delivers several frames.
    void letTimePass(std::size_t frames = 5) {
        const Watched other = started();
        EXPECT_TRUE(deliversWithChanges(other, frames));
        other.source->stop();
    }
    /// Nothing but time: another source would let the clock run.
    static void passTime(std::chrono::milliseconds time) {
        const auto over = std::chrono::steady_clock::now() + time;
        while (std::chrono::steady_clock::now() < over) std::this_thread::yield();
    }
    MediaTime now() { return world_->clock().captureClock()->now(); }

    const std::unique_ptr<CaptureWorld> world_ = GetParam()();
};

TEST_P(DisplayCaptureContract, DeliversTheFirstFrameAtOnceWithTheClockAtZero) {
    world_->clock().startCaptureClock();
    const Watched watched = started();
    ASSERT_TRUE(watched.frames->waitForCount(1));
    const CapturedFrame first = watched.frames->frames()[0];
    EXPECT_LT(first.stamp.seconds(), 0.001);
    EXPECT_EQ(first.stamp.timescale, CaptureClock::kTimescale);
    EXPECT_EQ(compare(first.duration, kSixtieth), 0);
    EXPECT_EQ(first.width, 320);
    EXPECT_EQ(first.height, 240);
    EXPECT_TRUE(world_->clock().captureClock()->isRunning());
}

TEST_P(DisplayCaptureContract, KeepsTheClockStandingUntilTheFirstFrame) {
    world_->clock().startCaptureClock();
    const Watched watched = make();
    watched.source->openGate();
    passTime(20ms);
    EXPECT_FALSE(world_->clock().captureClock()->isRunning());
    EXPECT_EQ(compare(now(), MediaTime::make(0, 1)), 0);
}

TEST_P(DisplayCaptureContract, DeliversNothingWhileTheGateIsClosed) {
    world_->clock().startCaptureClock();
    const Watched watched = make();
    watched.source->start();
    letTimePass();
    EXPECT_EQ(watched.frames->count(), 0u) << "a start while the gate is closed does nothing";
    watched.source->openGate();
    letTimePass();
    EXPECT_EQ(watched.frames->count(), 0u) << "and is not made up for";
    watched.source->start();
    EXPECT_TRUE(watched.frames->waitForCount(1));
}

TEST_P(DisplayCaptureContract, StaysClosedBeforeTheFirstRecording) {
    const Watched watched = started();
    world_->clock().startCaptureClock();
    letTimePass();
    EXPECT_EQ(watched.frames->count(), 0u);
}

TEST_P(DisplayCaptureContract, DeliversChangesWithGrowingStampsOneAtATime) {
    world_->clock().startCaptureClock();
    Watched watched = make();
    std::atomic<int> inside{0};
    std::atomic<bool> overlapped{false};
    watched.frames->onFrame = [&](DisplayCaptureSource&) {
        if (++inside != 1) overlapped = true;
        --inside;
    };
    watched.source->openGate();
    watched.source->start();
    ASSERT_TRUE(deliversWithChanges(watched, 30));
    watched.source->closeGate(GateWait::UntilDelivered);
    const Frames got = watched.frames->frames();
    for (std::size_t i = 1; i < got.size(); ++i) {
        EXPECT_GT(compare(got[i].stamp, got[i - 1].stamp), 0) << i;
        EXPECT_EQ(got[i].number, got[i - 1].number + 1) << i;
    }
    EXPECT_FALSE(overlapped);
    const auto counters = watched.source->counters();
    EXPECT_EQ(counters.delivered, got.size());
    EXPECT_LE(compare(got.back().stamp, now()), 0);
}

TEST_P(DisplayCaptureContract, RepeatsAStillPictureEachSecond) {
    if (const std::string why = world_->whyNothingStandsStill(); !why.empty()) LC_SKIP(why);
    world_->clock().startCaptureClock();
    const Watched watched = started();
    ASSERT_TRUE(watched.frames->waitForCount(3));
    const Frames got = watched.frames->frames();
    EXPECT_TRUE(got[2].damage.empty()) << "nothing has changed";
    for (std::size_t i = 1; i < got.size(); ++i)
        EXPECT_LT(got[i].stamp.seconds() - got[i - 1].stamp.seconds(), 1.5) << "a second, and what a busy machine adds";
}

TEST_P(DisplayCaptureContract, IsNotFasterThanTheMinimumIntervalInTheLongRun) {
    world_->clock().startCaptureClock();
    const Watched watched = started(MediaTime::make(1, 20));
    ASSERT_TRUE(deliversWithChanges(watched, 20));
    const Frames got = watched.frames->frames();
    const double took = got.back().stamp.seconds() - got.front().stamp.seconds();
    // Half an interval may have been saved up.
    EXPECT_GE(took, (static_cast<double>(got.size()) - 1.6) / 20);
}

TEST_P(DisplayCaptureContract, DeliversNothingOnceTheGateIsClosedAndLetsTheClockStand) {
    world_->clock().startCaptureClock();
    const Watched watched = started();
    for (int round = 0; round < 20; ++round) {
        ASSERT_TRUE(deliversWithChanges(watched, watched.frames->count() + 2));
        world_->change();
        watched.source->closeGate(GateWait::UntilDelivered);
        const std::size_t count = watched.frames->count();
        const MediaTime stands = now();
        EXPECT_FALSE(world_->clock().captureClock()->isRunning());
        world_->change();
        if (round == 19) {
            world_->clock().startCaptureClock();
            letTimePass();
            EXPECT_EQ(watched.frames->count(), count);
            break;
        }
        EXPECT_EQ(compare(now(), stands), 0);
        EXPECT_EQ(watched.frames->count(), count);
        watched.source->openGate();
        watched.source->start();
    }
}

TEST_P(DisplayCaptureContract, ClosingTheGateWaitsForADelivery) {
    world_->clock().startCaptureClock();
    Watched watched = make();
    std::atomic<bool> inside{false}, left{false};
    std::atomic<bool> once{false};
    watched.frames->onFrame = [&](DisplayCaptureSource&) {
        if (once.exchange(true)) return;
        inside = true;
        const auto until = std::chrono::steady_clock::now() + 10ms;
        while (std::chrono::steady_clock::now() < until) std::this_thread::yield();
        left = true;
    };
    watched.source->openGate();
    watched.source->start();
    while (!inside) std::this_thread::yield();
    const auto began = std::chrono::steady_clock::now();
    watched.source->closeGate(GateWait::UntilDelivered);
    const auto took = std::chrono::steady_clock::now() - began;
    EXPECT_TRUE(left || took >= 90ms) << "it waits as long as it may";
}

TEST_P(DisplayCaptureContract, ClosingTheGateNeverWaitsLong) {
    world_->clock().startCaptureClock();
    Watched watched = make();
    struct Held {
        std::mutex mutex;
        std::condition_variable changed;
        bool inside = false, mayLeave = false;
    };
    const auto held = std::make_shared<Held>();
    watched.frames->onFrame = [held](DisplayCaptureSource&) {
        std::unique_lock lock(held->mutex);
        held->inside = true;
        held->changed.notify_all();
        held->changed.wait(lock, [&] { return held->mayLeave; });
    };
    watched.source->openGate();
    watched.source->start();
    {
        std::unique_lock lock(held->mutex);
        held->changed.wait(lock, [&] { return held->inside; });
    }
    for (const GateWait wait : {GateWait::No, GateWait::UntilDelivered}) {
        const auto began = std::chrono::steady_clock::now();
        watched.source->closeGate(wait);
        watched.source->stop();
        const auto took = std::chrono::steady_clock::now() - began;
        EXPECT_LT(took, 2s);
        if (wait == GateWait::UntilDelivered) {
            EXPECT_GE(took, 90ms) << "it did wait";
        }
        EXPECT_FALSE(world_->clock().captureClock()->isRunning());
    }
    const std::lock_guard lock(held->mutex);
    held->mayLeave = true;
    held->changed.notify_all();
}

TEST_P(DisplayCaptureContract, CanBeClosedStoppedAndStartedFromWithinADelivery) {
    world_->clock().startCaptureClock();
    Watched watched = make();
    std::atomic<int> closed{0};
    std::atomic<std::int64_t> longest{0};
    watched.frames->onFrame = [&](DisplayCaptureSource& source) {
        if (closed >= 5) return;
        ++closed;
        const auto began = std::chrono::steady_clock::now();
        source.closeGate(GateWait::UntilDelivered);
        source.stop();
        source.openGate();
        source.start();
        longest = std::max<std::int64_t>(longest, (std::chrono::steady_clock::now() - began) / 1ms);
    };
    watched.source->openGate();
    watched.source->start();
    EXPECT_TRUE(watched.frames->waitForCount(6));
    watched.source->closeGate(GateWait::UntilDelivered);
    EXPECT_LT(longest, 90) << "it can't wait for itself";
}

TEST_P(DisplayCaptureContract, BeginsAgainWithTheLastPictureAndItsStampAndThenTheCurrentOne) {
    world_->clock().startCaptureClock();
    const Watched watched = started();
    ASSERT_TRUE(deliversWithChanges(watched, 5));
    watched.source->closeGate(GateWait::UntilDelivered);
    watched.source->stop();
    const Frames before = watched.frames->frames();
    const MediaTime paused = now();
    world_->change();
    passTime(300ms);
    EXPECT_EQ(compare(now(), paused), 0);
    watched.source->openGate();
    const auto resumed = std::chrono::steady_clock::now();
    watched.source->start();
    ASSERT_TRUE(watched.frames->waitForCount(before.size() + 2));
    const Frames got = watched.frames->frames();
    const CapturedFrame& last = before.back();
    const CapturedFrame& again = got[before.size()];
    const CapturedFrame& current = got[before.size() + 1];
    EXPECT_EQ(compare(again.stamp, last.stamp), 0);
    EXPECT_EQ(again.colour, last.colour);
    EXPECT_GE(compare(current.stamp, paused), 0);
    EXPECT_GT(compare(current.stamp, last.stamp), 0);
    const double running = std::chrono::duration<double>(current.at - resumed).count();
    EXPECT_LE(current.stamp.seconds() - paused.seconds(), running + 0.01) << "the pause is not on the clock";
}

TEST_P(DisplayCaptureContract, AnotherRecordingBeginsWithItsOwnClock) {
    world_->clock().startCaptureClock();
    const Watched watched = started();
    ASSERT_TRUE(deliversWithChanges(watched, 5));
    watched.source->closeGate(GateWait::UntilDelivered);
    watched.source->stop();
    const auto firstClock = world_->clock().captureClock();
    const std::size_t before = watched.frames->count();
    world_->clock().startCaptureClock();
    watched.source->openGate();
    watched.source->start();
    ASSERT_TRUE(watched.frames->waitForCount(before + 1));
    EXPECT_LT(watched.frames->frames()[before].stamp.seconds(), 0.001);
    EXPECT_FALSE(watched.frames->frames()[before].damage.empty()) << "nobody has seen it yet";
    EXPECT_FALSE(firstClock->isRunning());
}

TEST_P(DisplayCaptureContract, KeepsItsClockUntilTheGateOpensAgain) {
    world_->clock().startCaptureClock();
    const Watched watched = started();
    ASSERT_TRUE(deliversWithChanges(watched, 3));
    const auto own = world_->clock().captureClock();
    world_->clock().startCaptureClock();
    ASSERT_TRUE(deliversWithChanges(watched, watched.frames->count() + 3));
    EXPECT_FALSE(world_->clock().captureClock()->isRunning());
    EXPECT_GT(watched.frames->frames().back().stamp.seconds(), 0.01);
    watched.source->closeGate(GateWait::UntilDelivered);
    EXPECT_FALSE(own->isRunning());
}

TEST_P(DisplayCaptureContract, StartingTwiceIsStartingOnce) {
    world_->clock().startCaptureClock();
    const Watched watched = started();
    for (int i = 0; i < 20; ++i) watched.source->start();
    ASSERT_TRUE(deliversWithChanges(watched, 3));
    for (int i = 0; i < 20; ++i) watched.source->start();
    ASSERT_TRUE(deliversWithChanges(watched, watched.frames->count() + 3));
    const Frames got = watched.frames->frames();
    for (std::size_t i = 1; i < got.size(); ++i) EXPECT_GT(compare(got[i].stamp, got[i - 1].stamp), 0) << i;
}

TEST_P(DisplayCaptureContract, StopsWithoutLettingTheClockStand) {
    world_->clock().startCaptureClock();
    const Watched watched = started();
    ASSERT_TRUE(watched.frames->waitForCount(1));
    watched.source->stop();
    EXPECT_TRUE(world_->clock().captureClock()->isRunning()) << "that is the gate's business";
    // The delivery in progress may still come; one more start must bring the last picture and the current one.
    watched.source->start();
    ASSERT_TRUE(deliversWithChanges(watched, watched.frames->count() + 3));
}

TEST_P(DisplayCaptureContract, MayLoseItsLastReferenceWithinADelivery) {
    world_->clock().startCaptureClock();
    Watched watched = make();
    std::atomic<bool> released{false};
    watched.frames->onFrame = [&](DisplayCaptureSource&) {
        if (released) return;
        watched.source.reset();
        released = true;
    };
    watched.source->openGate();
    const std::weak_ptr<DisplayCaptureSource> weak = watched.source;
    auto keep = watched.source;
    keep->start();
    keep.reset();
    const auto limit = std::chrono::steady_clock::now() + test::kGenerous;
    while (!(released && weak.expired()) && std::chrono::steady_clock::now() < limit) std::this_thread::yield();
    EXPECT_TRUE(weak.expired());
    EXPECT_EQ(watched.frames->count(), 1u);
}

TEST_P(DisplayCaptureContract, DeliversToNobodyWithoutADelegate) {
    world_->clock().startCaptureClock();
    Watched watched = started();
    ASSERT_TRUE(watched.frames->waitForCount(1));
    watched.source->setDelegate({});
    letTimePass();
    const std::size_t count = watched.frames->count();
    letTimePass();
    EXPECT_EQ(watched.frames->count(), count);
    watched.source->setDelegate(watched.frames);
    EXPECT_TRUE(deliversWithChanges(watched, count + 2));
}

TEST_P(DisplayCaptureContract, GoesOnWhenAnotherSourceEnds) {
    world_->clock().startCaptureClock();
    const Watched watched = started();
    ASSERT_TRUE(watched.frames->waitForCount(1));
    for (int end = 0; end < 10; ++end) {
        Watched other = started();
        ASSERT_TRUE(other.frames->waitForCount(1)) << end;
        other.source->stop();
        // It has come to rest when its last owner lets it go.
        ASSERT_TRUE(deliversWithChanges(watched, watched.frames->count() + 2)) << end;
    }
    const Watched later = started();
    EXPECT_TRUE(later.frames->waitForCount(1));
}

TEST_P(DisplayCaptureContract, ReportsAFailureOnTheMainQueueAndCanBeStartedAgain) {
    world_->clock().startCaptureClock();
    world_->letTheNextStartFail();
    Watched watched = make();
    std::thread::id mainThread;
    world_->mainQueue().sync([&] { mainThread = std::this_thread::get_id(); });
    watched.source->openGate();
    // Held up: nothing may come inline.
    std::atomic<bool> goOn{false};
    world_->mainQueue().async([&] {
        while (!goOn) std::this_thread::yield();
    });
    watched.source->start();
    EXPECT_TRUE(watched.frames->failures().empty());
    goOn = true;
    ASSERT_TRUE(watched.frames->waitForFailure());
    EXPECT_EQ(watched.frames->failureThread(), mainThread);
    EXPECT_EQ(watched.frames->count(), 0u);
    world_->letStartsSucceed();
    watched.source->start();
    EXPECT_TRUE(watched.frames->waitForCount(1));
    EXPECT_EQ(watched.frames->failures().size(), 1u);
}

TEST_P(DisplayCaptureContract, TellsNoFailureOfARunBeforeTheLastStart) {
    world_->clock().startCaptureClock();
    world_->letTheNextStartFail();
    Watched watched = make();
    watched.source->openGate();
    std::atomic<bool> goOn{false}, held{false};
    world_->mainQueue().async([&] {
        held = true;
        while (!goOn) std::this_thread::yield();
    });
    while (!held) std::this_thread::yield();
    watched.source->start();
    passTime(200ms);  // enough for a lane to find out; if it was not, the next start fails by itself
    world_->letStartsSucceed();
    // The failure waits on the main queue; meanwhile the recording is paused and goes on.
    watched.source->closeGate(GateWait::UntilDelivered);
    watched.source->openGate();
    watched.source->start();
    ASSERT_TRUE(watched.frames->waitForCount(1));
    goOn = true;
    world_->mainQueue().sync([] {});
    EXPECT_TRUE(watched.frames->failures().empty());
    EXPECT_TRUE(deliversWithChanges(watched, watched.frames->count() + 1));
}

INSTANTIATE_TEST_SUITE_P(Fake, DisplayCaptureContract,
                         ::testing::Values([] { return std::make_unique<FakeCaptureWorld>(); }));
INSTANTIATE_TEST_SUITE_P(Port, DisplayCaptureContract,
                         ::testing::Values([] { return std::make_unique<PortCaptureWorld>(); }));
INSTANTIATE_TEST_SUITE_P(Headless, DisplayCaptureContract,
                         ::testing::Values([] { return std::make_unique<HeadlessCaptureWorld>(); }));

}  // namespace
}  // namespace lumacast
