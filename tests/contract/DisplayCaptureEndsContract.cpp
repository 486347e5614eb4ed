// How a capture source is started and stopped, how it fails, and who is told.

#include <atomic>
#include <chrono>
#include <memory>
#include <thread>

#include "tests/contract/DisplayCaptureFixture.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;
using test::DisplayCaptureContract;
using Frames = test::CapturedFrames::Frames;

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

}  // namespace
}  // namespace lumacast
