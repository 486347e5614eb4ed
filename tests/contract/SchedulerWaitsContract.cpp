// What every scheduler must do with waits: the contract of Semaphore, OwnerlessLock and Timer.

#include <atomic>
#include <chrono>
#include <cstdint>
#include <memory>
#include <utility>

#include "tests/contract/SchedulerFixture.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;
using test::SchedulerContract;

TEST_P(SchedulerContract, ASemaphoreCounts) {
    const auto semaphore = scheduler_.semaphore(2);
    EXPECT_TRUE(semaphore->waitFor(0ns));
    semaphore->wait();
    EXPECT_FALSE(semaphore->waitFor(0ns));
    semaphore->signal();
    semaphore->signal();
    EXPECT_TRUE(semaphore->waitFor(0ns));
    EXPECT_TRUE(semaphore->waitFor(0ns));
    EXPECT_FALSE(semaphore->waitFor(-1ns));
}

TEST_P(SchedulerContract, EachSignalLetsOneThrough) {
    const auto semaphore = scheduler_.semaphore(0);
    std::atomic<int> through = 0;
    for (int i = 0; i < 10; ++i)
        global([&] {
            semaphore->wait();
            ++through;
        });
    for (int i = 1; i <= 10; ++i) {
        semaphore->signal();
        ASSERT_TRUE(world_->until([&] { return through == i; }));
    }
    EXPECT_FALSE(semaphore->waitFor(0ns));
}

TEST_P(SchedulerContract, ATimedWaitLastsAsLongAsItsLimit) {
    const auto semaphore = scheduler_.semaphore(0);
    const auto before = world_->now();
    EXPECT_FALSE(semaphore->waitFor(20ms));
    EXPECT_GE(world_->now() - before, 20ms);
}

TEST_P(SchedulerContract, ATimedWaitEndsWithASignal) {
    const auto semaphore = scheduler_.semaphore(0);
    std::atomic<int> outcome = 0;
    global([&] { outcome = semaphore->waitFor(10min) ? 1 : 2; });
    semaphore->signal();
    EXPECT_TRUE(world_->until([&] { return outcome != 0; }));
    EXPECT_EQ(outcome, 1);
}

TEST_P(SchedulerContract, ALockMayBeReleasedByAnotherLane) {
    const auto lock = scheduler_.ownerlessLock();
    lock->lock();
    std::atomic<bool> taken = false;
    global([&] {
        lock->lock();
        taken = true;
    });
    std::atomic<bool> tried = false;
    global([&] { tried = true; });
    ASSERT_TRUE(world_->until([&] { return tried.load(); }));
    EXPECT_FALSE(taken);
    global([&] { lock->unlock(); });
    EXPECT_TRUE(world_->until([&] { return taken.load(); }));
}

TEST_P(SchedulerContract, ALockTakenTwiceBlocks) {
    const auto lock = scheduler_.ownerlessLock();
    std::atomic<int> times = 0;
    global([&] {
        lock->lock();
        ++times;
        lock->lock();
        ++times;
    });
    ASSERT_TRUE(world_->until([&] { return times == 1; }));
    EXPECT_FALSE(scheduler_.semaphore(0)->waitFor(20ms));
    EXPECT_EQ(times, 1);
    lock->unlock();
    EXPECT_TRUE(world_->until([&] { return times == 2; }));
}

TEST_P(SchedulerContract, ALockMayBeDestroyedWhileItIsHeld) {
    auto lock = scheduler_.ownerlessLock();
    lock->lock();
    lock.reset();
    EXPECT_FALSE(lock);
}

TEST_P(SchedulerContract, ALockKeepsOthersOut) {
    const auto lock = scheduler_.ownerlessLock();
    int unguarded = 0;
    std::atomic<int> done = 0;
    for (int i = 0; i < 4; ++i)
        global([&] {
            for (int round = 0; round < 50; ++round) {
                lock->lock();
                ++unguarded;
                lock->unlock();
            }
            ++done;
        });
    ASSERT_TRUE(world_->until([&] { return done == 4; }));
    EXPECT_EQ(unguarded, 200);
}

TEST_P(SchedulerContract, ATimerTicksOnItsQueueFirstAfterOneInterval) {
    const auto queue = scheduler_.serialQueue("queue");
    const auto before = world_->now();
    std::atomic<std::int64_t> first = 0;
    std::atomic<int> ticks = 0;
    const auto timer = scheduler_.timer(queue, 5ms, [&] {
        EXPECT_TRUE(queue->isCurrent());
        if (++ticks == 1) first = (world_->now() - before).count();
    });
    ASSERT_TRUE(world_->until([&] { return ticks >= 3; }));
    EXPECT_GE(first, std::chrono::nanoseconds(5ms).count());
}

TEST_P(SchedulerContract, ATimerThatWasDestroyedOnItsQueueTicksNoMore) {
    const auto queue = scheduler_.serialQueue("queue");
    std::atomic<int> ticks = 0;
    std::unique_ptr<Timer> timer = scheduler_.timer(queue, 1ms, [&] { ++ticks; });
    ASSERT_TRUE(world_->until([&] { return ticks >= 2; }));
    int last = 0;
    queue->sync([&] {
        timer.reset();
        last = ticks;
    });
    EXPECT_FALSE(scheduler_.semaphore(0)->waitFor(20ms));
    queue->sync([] {});
    EXPECT_EQ(ticks, last);
}

TEST_P(SchedulerContract, ATimersTaskMayDestroyIt) {
    const auto queue = scheduler_.serialQueue("queue");
    std::atomic<int> ticks = 0;
    std::unique_ptr<Timer> timer;
    queue->sync([&] {
        timer = scheduler_.timer(queue, 1ms, [&] {
            timer.reset();
            ++ticks;
        });
    });
    ASSERT_TRUE(world_->until([&] { return ticks == 1; }));
    EXPECT_FALSE(scheduler_.semaphore(0)->waitFor(20ms));
    EXPECT_EQ(ticks, 1);
}

TEST_P(SchedulerContract, ATimerMayTickOnTheMainQueue) {
    std::atomic<int> ticks = 0;
    auto timer = scheduler_.timer(world_->sharedMainQueue(), 1ms, [&] {
        EXPECT_TRUE(scheduler_.mainQueue().isCurrent());
        ++ticks;
    });
    EXPECT_TRUE(world_->until([&] { return ticks >= 3; }));
    scheduler_.mainQueue().sync([&] { timer.reset(); });
}

TEST_P(SchedulerContract, ATimersTaskIsReleasedWithIt) {
    const auto queue = scheduler_.serialQueue("queue");
    auto held = std::make_shared<int>(1);
    const std::weak_ptr<int> watched = held;
    auto timer = scheduler_.timer(queue, 1h, [captured = std::move(held)] {});
    EXPECT_FALSE(watched.expired());
    timer.reset();
    EXPECT_TRUE(watched.expired());
}

}  // namespace
}  // namespace lumacast
