// What every scheduler must do: the contract of Scheduler, SerialQueue, GlobalQueue, Semaphore, OwnerlessLock and
// Timer.

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <functional>
#include <memory>
#include <optional>
#include <thread>
#include <vector>

#include "base/Guarded.h"
#include "linux/ipc/Reactor.h"
#include "support/ThreadScheduler.h"
#include "tests/fakes/SimScheduler.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;

/// A scheduler whose main loop runs beside the test.
class SchedulerWorld {
public:
    virtual ~SchedulerWorld() = default;
    virtual Scheduler& scheduler() = 0;
    virtual std::shared_ptr<SerialQueue> sharedMainQueue() = 0;
    /// Waits until `condition` holds; whether it does within a generous bound. It may be evaluated on any lane.
    virtual bool until(const std::function<bool()>& condition) = 0;
    /// The time that this scheduler's waits and timers go by.
    virtual std::chrono::nanoseconds now() = 0;
};

class SimSchedulerWorld final : public SchedulerWorld {
public:
    explicit SimSchedulerWorld(std::uint64_t seed) : scheduler_(seed) {}
    Scheduler& scheduler() override { return scheduler_; }
    std::shared_ptr<SerialQueue> sharedMainQueue() override { return scheduler_.sharedMainQueue(); }
    bool until(const std::function<bool()>& condition) override { return scheduler_.runUntil(condition, 1h); }
    std::chrono::nanoseconds now() override { return std::chrono::nanoseconds(scheduler_.now().nanoseconds); }

private:
    SimScheduler scheduler_;
};

/// The shipped scheduler on the shipped main loop.
class PortSchedulerWorld final : public SchedulerWorld {
public:
    Scheduler& scheduler() override { return scheduler_; }
    std::shared_ptr<SerialQueue> sharedMainQueue() override { return loop_; }
    bool until(const std::function<bool()>& condition) override {
        const auto limit = std::chrono::steady_clock::now() + 60s;
        while (!condition()) {
            if (std::chrono::steady_clock::now() > limit) return false;
            std::this_thread::yield();
        }
        return true;
    }
    std::chrono::nanoseconds now() override { return std::chrono::steady_clock::now().time_since_epoch(); }

private:
    std::shared_ptr<Reactor> loop_ = std::make_shared<Reactor>();
    ThreadScheduler scheduler_{loop_};
    RunningThreadLoop running_{*loop_};
};

using Maker = std::function<std::unique_ptr<SchedulerWorld>()>;

class SchedulerContract : public ::testing::TestWithParam<Maker> {
protected:
    void global(Task task) { scheduler_.globalQueue(QueuePriority::Default).async(std::move(task)); }

    std::unique_ptr<SchedulerWorld> world_ = GetParam()();
    Scheduler& scheduler_ = world_->scheduler();
};

TEST_P(SchedulerContract, AQueueKeepsItsLabel) { EXPECT_EQ(scheduler_.serialQueue("a label")->label(), "a label"); }

TEST_P(SchedulerContract, TasksOfAQueueRunInOrderOneAtATime) {
    const auto queue = scheduler_.serialQueue("queue");
    std::vector<int> order;
    std::atomic<int> inside = 0;
    for (int i = 0; i < 200; ++i)
        queue->async([&, i] {
            EXPECT_EQ(++inside, 1);
            order.push_back(i);
            --inside;
        });
    queue->sync([&] { EXPECT_EQ(order.size(), 200u); });
    EXPECT_TRUE(std::is_sorted(order.begin(), order.end()));
}

TEST_P(SchedulerContract, TasksOfSeveralSubmittersNeverOverlapAndKeepEachSubmittersOrder) {
    const auto queue = scheduler_.serialQueue("queue");
    std::vector<std::vector<int>> order(3);
    std::atomic<int> inside = 0, done = 0;
    for (std::size_t submitter = 0; submitter < order.size(); ++submitter)
        global([&, submitter] {
            for (int i = 0; i < 30; ++i) {
                const auto task = [&, submitter, i] {
                    EXPECT_EQ(++inside, 1);
                    order[submitter].push_back(i);
                    --inside;
                };
                if (i % 2 == 0)
                    queue->async(task);
                else
                    queue->sync(task);
            }
            queue->sync([&] { ++done; });
        });
    ASSERT_TRUE(world_->until([&] { return done == 3; }));
    for (const auto& one : order) {
        EXPECT_EQ(one.size(), 30u);
        EXPECT_TRUE(std::is_sorted(one.begin(), one.end()));
    }
}

TEST_P(SchedulerContract, SyncReturnsWhenItsTaskIsDone) {
    const auto queue = scheduler_.serialQueue("queue");
    bool before = false, done = false;
    queue->async([&] { before = true; });
    queue->sync([&] {
        EXPECT_TRUE(before);
        EXPECT_TRUE(queue->isCurrent());
        done = true;
    });
    EXPECT_TRUE(done);
    EXPECT_FALSE(queue->isCurrent());
}

TEST_P(SchedulerContract, SyncOnTheQueueItselfRunsInlineAtAnyDepth) {
    const auto queue = scheduler_.serialQueue("queue"), other = scheduler_.serialQueue("other");
    std::atomic<bool> done = false, ranInside = false;
    queue->async([&] {
        queue->sync([&] {
            other->sync([&] {
                EXPECT_TRUE(queue->isCurrent());
                queue->sync([&] { ranInside = true; });
            });
            EXPECT_FALSE(other->isCurrent());
        });
        done = true;  // last: the queues go when it is seen
    });
    EXPECT_TRUE(world_->until([&] { return done.load(); }));
    EXPECT_TRUE(ranInside);
}

TEST_P(SchedulerContract, AQueueIsCurrentInItsTasksOnly) {
    const auto queue = scheduler_.serialQueue("queue"), other = scheduler_.serialQueue("other");
    EXPECT_FALSE(queue->isCurrent());
    std::atomic<int> seen = 0;
    queue->async(
        [&] { seen += queue->isCurrent() && !other->isCurrent() && !scheduler_.mainQueue().isCurrent() ? 1 : 100; });
    other->async([&] { seen += !queue->isCurrent() && other->isCurrent() ? 1 : 100; });
    scheduler_.mainQueue().async([&] { seen += !queue->isCurrent() && scheduler_.mainQueue().isCurrent() ? 1 : 100; });
    global([&] { seen += !queue->isCurrent() && !scheduler_.mainQueue().isCurrent() ? 1 : 100; });
    EXPECT_TRUE(world_->until([&] { return seen >= 4; }));
    EXPECT_EQ(seen, 4);
}

TEST_P(SchedulerContract, ATaskSubmittedFromATaskRunsAfterIt) {
    const auto queue = scheduler_.serialQueue("queue");
    std::vector<int> order;
    std::atomic<bool> done = false;
    queue->async([&] {
        queue->async([&] {
            order.push_back(2);
            done = true;
        });
        order.push_back(1);
    });
    ASSERT_TRUE(world_->until([&] { return done.load(); }));
    EXPECT_EQ(order, (std::vector{1, 2}));
}

TEST_P(SchedulerContract, AQueueMayBeReleasedFromItsOwnWorkAndStillRunsTheRest) {
    std::shared_ptr<SerialQueue> queue = scheduler_.serialQueue("queue");
    const auto begin = scheduler_.semaphore(0);
    std::atomic<bool> rest = false;
    queue->async([&] {
        begin->wait();
        queue.reset();
    });
    queue->async([&] { rest = true; });
    begin->signal();
    EXPECT_TRUE(world_->until([&] { return rest.load(); }));
    std::shared_ptr<SerialQueue> second = scheduler_.serialQueue("second");
    second->sync([&] { second.reset(); });
    EXPECT_FALSE(second);
}

TEST_P(SchedulerContract, ATasksCapturesAreReleasedWhenItHasRun) {
    const auto queue = scheduler_.serialQueue("queue");
    auto held = std::make_shared<int>(1);
    const std::weak_ptr<int> watched = held;
    queue->async([captured = std::move(held)] {});
    bool gone = false;
    queue->sync([&] { gone = watched.expired(); });
    EXPECT_TRUE(gone);
}

TEST_P(SchedulerContract, QueuesDoNotWaitForEachOther) {
    const auto blocked = scheduler_.serialQueue("blocked"), free = scheduler_.serialQueue("free");
    const auto release = scheduler_.semaphore(0);
    std::atomic<bool> passed = false, ran = false;
    blocked->async([&] {
        release->wait();
        passed = true;
    });
    free->async([&] { ran = true; });
    ASSERT_TRUE(world_->until([&] { return ran.load(); }));
    EXPECT_FALSE(passed);
    release->signal();
    EXPECT_TRUE(world_->until([&] { return passed.load(); }));
}

TEST_P(SchedulerContract, GlobalTasksRunConcurrently) {
    const auto met = scheduler_.semaphore(0), answered = scheduler_.semaphore(0);
    std::atomic<int> done = 0;
    for (const QueuePriority priority : {QueuePriority::Default, QueuePriority::Background}) {
        scheduler_.globalQueue(priority).async([&] {
            met->wait();
            answered->signal();
            ++done;
        });
        scheduler_.globalQueue(priority).async([&] {
            met->signal();
            answered->wait();
            ++done;
        });
    }
    EXPECT_TRUE(world_->until([&] { return done == 4; }));
}

TEST_P(SchedulerContract, ManyWaitingTasksDoNotKeepAnotherFromRunning) {
    const auto gate = scheduler_.semaphore(0);
    std::atomic<int> passed = 0;
    std::vector<std::shared_ptr<SerialQueue>> queues;
    for (int i = 0; i < 80; ++i) {
        queues.push_back(scheduler_.serialQueue("waiting"));
        queues.back()->async([&] {
            gate->wait();
            ++passed;
        });
    }
    global([&] {
        for (int i = 0; i < 80; ++i) gate->signal();
    });
    EXPECT_TRUE(world_->until([&] { return passed == 80; }));
}

TEST_P(SchedulerContract, TheMainQueueRunsTasksOfAllLanesInOrder) {
    Guarded<std::vector<int>> order;
    const auto add = [&](int value) { order.update([&](auto& list) { list.push_back(value); }); };
    for (int i = 0; i < 50; ++i)
        scheduler_.mainQueue().async([&, i] {
            EXPECT_TRUE(scheduler_.mainQueue().isCurrent());
            add(i);
        });
    scheduler_.mainQueue().sync([&] {
        scheduler_.mainQueue().sync([&] { add(50); });
        add(51);
    });
    const std::vector<int> seen = order.get();
    EXPECT_EQ(seen.size(), 52u);
    EXPECT_TRUE(std::is_sorted(seen.begin(), seen.end()));
}

TEST_P(SchedulerContract, ALaneMaySyncWithTheMainQueue) {
    const auto queue = scheduler_.serialQueue("queue");
    std::atomic<int> ran = 0;
    for (int i = 0; i < 20; ++i)
        queue->async([&] {
            scheduler_.mainQueue().sync([&] {
                EXPECT_TRUE(scheduler_.mainQueue().isCurrent());
                ++ran;
            });
        });
    EXPECT_TRUE(world_->until([&] { return ran == 20; }));
}

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

Maker simulated(std::uint64_t seed) {
    return [seed] { return std::make_unique<SimSchedulerWorld>(seed); };
}

INSTANTIATE_TEST_SUITE_P(Fake, SchedulerContract,
                         ::testing::Values(simulated(1), simulated(2), simulated(3), simulated(4)));
INSTANTIATE_TEST_SUITE_P(Port, SchedulerContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortSchedulerWorld>(); })));

}  // namespace
}  // namespace lumacast
