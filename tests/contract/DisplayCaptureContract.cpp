// When a capture source delivers frames, and how they are stamped.

#include <atomic>
#include <chrono>

#include "tests/contract/DisplayCaptureFixture.h"
#include "tests/contract/Skip.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;
using test::CapturedFrame;
using test::DisplayCaptureContract;
using test::kSixtieth;
using Frames = test::CapturedFrames::Frames;

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

INSTANTIATE_TEST_SUITE_P(Fake, DisplayCaptureContract,
                         ::testing::Values([] { return std::make_unique<test::FakeCaptureWorld>(); }));
INSTANTIATE_TEST_SUITE_P(Port, DisplayCaptureContract,
                         ::testing::Values([] { return std::make_unique<test::PortCaptureWorld>(); }));
INSTANTIATE_TEST_SUITE_P(Headless, DisplayCaptureContract,
                         ::testing::Values([] { return std::make_unique<test::HeadlessCaptureWorld>(); }));

}  // namespace
}  // namespace lumacast
