#include "support/ThreadScheduler.h"

#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <set>
#include <thread>
#include <vector>

#include "tests/fakes/ThreadLoop.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;

/// How long a test waits for what must come.
constexpr auto kGenerous = 30s;

class ThreadSchedulerTest : public ::testing::Test {
protected:
    /// Waits until `condition` holds.
    template <class Condition>
    static bool eventually(Condition condition) {
        const auto end = std::chrono::steady_clock::now() + kGenerous;
        while (!condition()) {
            if (std::chrono::steady_clock::now() > end) return false;
            std::this_thread::yield();
        }
        return true;
    }

    std::shared_ptr<ThreadLoop> loop_ = std::make_shared<ThreadLoop>();
    std::unique_ptr<ThreadScheduler> scheduler_ = std::make_unique<ThreadScheduler>(loop_);
};

TEST_F(ThreadSchedulerTest, SyncOnAnIdleQueueRunsOnTheCallersThread) {
    const auto queue = scheduler_->serialQueue("queue");
    std::thread::id ranOn;
    queue->sync([&] { ranOn = std::this_thread::get_id(); });
    EXPECT_EQ(ranOn, std::this_thread::get_id());
    EXPECT_EQ(scheduler_->workerCount(), 0u);
}

TEST_F(ThreadSchedulerTest, SyncOnABusyQueueWaitsForItsTurnAndStillRunsOnTheCallersThread) {
    const auto queue = scheduler_->serialQueue("queue");
    const auto started = scheduler_->semaphore(0), release = scheduler_->semaphore(0);
    std::vector<int> order;
    queue->async([&] {
        started->signal();
        release->wait();
        order.push_back(1);
    });
    started->wait();
    queue->async([&] { order.push_back(2); });
    std::thread caller([&] {
        queue->sync([&, self = std::this_thread::get_id()] {
            EXPECT_EQ(self, std::this_thread::get_id());
            order.push_back(3);
        });
    });
    release->signal();
    caller.join();
    queue->sync([&] { order.push_back(4); });
    EXPECT_EQ(order, (std::vector{1, 2, 3, 4}));
}

TEST_F(ThreadSchedulerTest, AQueueStaysCurrentBelowASyncOfAnotherQueue) {
    const auto outer = scheduler_->serialQueue("outer"), inner = scheduler_->serialQueue("inner");
    int depth = 0;
    outer->sync([&] {
        inner->sync([&] {
            EXPECT_TRUE(outer->isCurrent());
            EXPECT_TRUE(inner->isCurrent());
            outer->sync([&] { depth = 3; });  // would wait for itself for ever if it did not run inline
        });
        EXPECT_FALSE(inner->isCurrent());
    });
    EXPECT_EQ(depth, 3);
    EXPECT_FALSE(outer->isCurrent());
}

TEST_F(ThreadSchedulerTest, TasksOfOneQueueNeverOverlapAndKeepTheirOrder) {
    const auto queue = scheduler_->serialQueue("queue");
    constexpr int kThreads = 4, kTasks = 5000;
    int unguarded = 0;  // a race on it is a report under ThreadSanitizer
    std::vector<std::vector<int>> seen(kThreads);
    std::vector<std::thread> callers;
    for (int caller = 0; caller < kThreads; ++caller) {
        callers.emplace_back([&, caller] {
            for (int i = 0; i < kTasks; ++i) {
                const auto task = [&, caller, i] {
                    ++unguarded;
                    seen[static_cast<std::size_t>(caller)].push_back(i);
                };
                if (i % 3 == 0)
                    queue->sync(task);
                else
                    queue->async(task);
            }
        });
    }
    for (std::thread& caller : callers) caller.join();
    queue->sync([] {});
    EXPECT_EQ(unguarded, kThreads * kTasks);
    for (const auto& one : seen) EXPECT_TRUE(std::is_sorted(one.begin(), one.end()));
}

TEST_F(ThreadSchedulerTest, AQueueReleasedFromItsOwnWorkStillRunsTheRest) {
    const auto done = scheduler_->semaphore(0);
    std::shared_ptr<SerialQueue> queue = scheduler_->serialQueue("queue");
    const auto submitted = scheduler_->semaphore(0);
    SerialQueue* raw = queue.get();
    raw->async([&] {
        submitted->wait();
        queue.reset();
    });
    raw->async([&] { done->signal(); });
    submitted->signal();
    EXPECT_TRUE(done->waitFor(kGenerous));
}

TEST_F(ThreadSchedulerTest, AQueueReleasedWithinSyncIsLegal) {
    std::shared_ptr<SerialQueue> queue = scheduler_->serialQueue("queue");
    queue->sync([&] { queue.reset(); });
    EXPECT_EQ(queue, nullptr);
}

TEST_F(ThreadSchedulerTest, ATasksCapturesAreReleasedOnItsQueueBeforeTheNextTask) {
    const auto queue = scheduler_->serialQueue("queue");
    const auto go = scheduler_->semaphore(0);
    auto held = std::make_shared<int>(1);
    const std::weak_ptr<int> watched = held;
    queue->async([&, captured = std::move(held)] { go->wait(); });
    bool goneBeforeNext = false;
    queue->async([&] { goneBeforeNext = watched.expired(); });
    go->signal();
    queue->sync([] {});
    EXPECT_TRUE(goneBeforeNext);
}

TEST_F(ThreadSchedulerTest, MoreWaitingTasksThanTheBoundOfRunnableWorkersDoNotStopTheOthers) {
    scheduler_ = std::make_unique<ThreadScheduler>(loop_, ThreadPoolLimits{.runnable = 2, .total = 64});
    const auto gate = scheduler_->semaphore(0), passed = scheduler_->semaphore(0);
    constexpr int kWaiting = 20;
    for (int i = 0; i < kWaiting; ++i) {
        scheduler_->globalQueue(QueuePriority::Default).async([&] {
            gate->wait();
            passed->signal();
        });
    }
    scheduler_->globalQueue(QueuePriority::Default).async([&] {
        for (int i = 0; i < kWaiting; ++i) gate->signal();
    });
    for (int i = 0; i < kWaiting; ++i) ASSERT_TRUE(passed->waitFor(kGenerous)) << i;
}

TEST_F(ThreadSchedulerTest, ThePoolKeepsToItsBoundWhenNobodyWaits) {
    scheduler_ = std::make_unique<ThreadScheduler>(loop_, ThreadPoolLimits{.runnable = 3, .total = 64});
    std::atomic<int> running = 0, most = 0, done = 0;
    for (int i = 0; i < 200; ++i) {
        scheduler_->globalQueue(QueuePriority::Default).async([&] {
            const int now = ++running;
            for (int seen = most; now > seen && !most.compare_exchange_weak(seen, now);) {
            }
            std::this_thread::yield();
            --running;
            ++done;
        });
    }
    EXPECT_TRUE(eventually([&] { return done == 200; }));
    EXPECT_LE(most, 3);
    EXPECT_LE(scheduler_->workerCount(), 3u);
}

TEST_F(ThreadSchedulerTest, ManyIdleQueuesCostNoThreads) {
    std::vector<std::shared_ptr<SerialQueue>> queues;
    for (int i = 0; i < 500; ++i) queues.push_back(scheduler_->serialQueue("queue"));
    std::atomic<int> done = 0;
    for (const auto& queue : queues) queue->async([&] { ++done; });
    EXPECT_TRUE(eventually([&] { return done == 500; }));
    EXPECT_LE(scheduler_->workerCount(), ThreadPoolLimits{}.runnable);
}

TEST_F(ThreadSchedulerTest, IdleWorkersEnd) {
    scheduler_ = std::make_unique<ThreadScheduler>(
        loop_, ThreadPoolLimits{.runnable = 8, .total = 8, .idleTime = std::chrono::milliseconds(1)});
    const auto ran = scheduler_->semaphore(0);
    for (int i = 0; i < 8; ++i) scheduler_->globalQueue(QueuePriority::Default).async([&] { ran->signal(); });
    for (int i = 0; i < 8; ++i) ran->wait();
    EXPECT_TRUE(eventually([&] { return scheduler_->workerCount() == 0; }));
    scheduler_->globalQueue(QueuePriority::Default).async([&] { ran->signal(); });
    EXPECT_TRUE(ran->waitFor(kGenerous));  // and come again
}

TEST_F(ThreadSchedulerTest, TheEndOfTheSchedulerRunsWhatWasSubmitted) {
    std::atomic<int> done = 0;
    const auto queue = scheduler_->serialQueue("queue");
    for (int i = 0; i < 300; ++i) queue->async([&] { ++done; });
    scheduler_->globalQueue(QueuePriority::Background).async([&] { queue->async([&] { ++done; }); });
    scheduler_.reset();
    EXPECT_EQ(done, 301);
    queue->async([&] { ++done; });  // nobody is left to run it
    EXPECT_EQ(done, 301);
}

TEST_F(ThreadSchedulerTest, ATimerTicksOnItsQueueUntilItsEndAndNotAfterwards) {
    const auto queue = scheduler_->serialQueue("queue");
    std::atomic<int> ticks = 0;
    std::unique_ptr<Timer> timer = scheduler_->timer(queue, 1ms, [&] {
        EXPECT_TRUE(queue->isCurrent());
        ++ticks;
    });
    EXPECT_TRUE(eventually([&] { return ticks >= 3; }));
    int atEnd = 0;
    queue->sync([&] {
        timer.reset();
        atEnd = ticks;
    });
    // A second timer that ticks well after the first one would have.
    const auto later = scheduler_->semaphore(0);
    const auto second = scheduler_->timer(queue, 5ms, [&] { later->signal(); });
    for (int i = 0; i < 3; ++i) ASSERT_TRUE(later->waitFor(kGenerous));
    EXPECT_EQ(ticks, atEnd);
}

TEST_F(ThreadSchedulerTest, ATimerCanBeDestroyedFromItsOwnTask) {
    const auto queue = scheduler_->serialQueue("queue");
    const auto done = scheduler_->semaphore(0);
    std::unique_ptr<Timer> timer;
    queue->sync([&] {
        timer = scheduler_->timer(queue, 1ms, [&] {
            timer.reset();
            done->signal();
        });
    });
    EXPECT_TRUE(done->waitFor(kGenerous));
}

TEST_F(ThreadSchedulerTest, TicksThatFindTheirQueueBusyAreNotSavedUp) {
    const auto queue = scheduler_->serialQueue("queue"), other = scheduler_->serialQueue("other");
    std::atomic<int> ticks = 0, otherTicks = 0;
    const auto blocked = scheduler_->semaphore(0), release = scheduler_->semaphore(0);
    queue->async([&] {
        blocked->signal();
        release->wait();
    });
    blocked->wait();
    std::unique_ptr<Timer> timer = scheduler_->timer(queue, 1ms, [&] { ++ticks; });
    const auto pace = scheduler_->timer(other, 1ms, [&] { ++otherTicks; });
    EXPECT_TRUE(eventually([&] { return otherTicks >= 20; }));
    int afterRelease = -1;
    queue->async([&] {
        timer.reset();
        afterRelease = ticks;
    });
    release->signal();
    queue->sync([] {});
    EXPECT_LE(afterRelease, 1);
}

TEST_F(ThreadSchedulerTest, ASemaphoreMayBeDestroyedByWhoeverItLetThrough) {
    // Whether signal() still touches it then is for the builds with sanitizers to see; a signal that is lost fails here.
    for (int i = 0; i < 300; ++i) {
        auto semaphore = scheduler_->semaphore(0);
        scheduler_->globalQueue(QueuePriority::Default).async([raw = semaphore.get()] { raw->signal(); });
        ASSERT_TRUE(semaphore->waitFor(kGenerous));
        semaphore.reset();
    }
}

TEST_F(ThreadSchedulerTest, ALimitThatIsLongerThanTheClocksRangeStillWaits) {
    const auto semaphore = scheduler_->semaphore(0), waiting = scheduler_->semaphore(0);
    bool signalled = false;
    std::thread waiter([&] {
        waiting->signal();
        signalled = semaphore->waitFor(std::chrono::nanoseconds::max());
    });
    waiting->wait();
    semaphore->signal();
    waiter.join();
    EXPECT_TRUE(signalled);
}

TEST_F(ThreadSchedulerTest, TheMainQueueIsTheLoopItWasGiven) {
    EXPECT_EQ(&scheduler_->mainQueue(), loop_.get());
    bool ran = false;
    scheduler_->mainQueue().async([&] {
        ran = scheduler_->mainQueue().isCurrent();
        loop_->requestStop();
    });
    scheduler_->runMainLoop();
    EXPECT_TRUE(ran);
}

}  // namespace
}  // namespace lumacast
