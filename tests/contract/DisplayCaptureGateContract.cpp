// The gate of a capture source.

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <memory>
#include <mutex>
#include <thread>

#include "tests/contract/DisplayCaptureFixture.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;
using test::DisplayCaptureContract;

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

}  // namespace
}  // namespace lumacast
