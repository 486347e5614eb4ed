#include "tests/fakes/SimScheduler.h"

#include <gtest/gtest.h>

#include <set>
#include <stdexcept>
#include <string>
#include <vector>

namespace lumacast {
namespace {

using namespace std::chrono_literals;

/// A small world with much to choose: queues, semaphores, a lock, timers. Answers what happened, in order.
std::string play(std::uint64_t seed, std::uint64_t& hash) {
    SimScheduler sim(seed);
    std::string story;
    const auto a = sim.serialQueue("a"), b = sim.serialQueue("b");
    const auto semaphore = sim.semaphore(0);
    const auto lock = sim.ownerlessLock();
    for (int i = 0; i < 5; ++i) {
        a->async([&, i] {
            lock->lock();
            story += "a" + std::to_string(i) + " ";
            lock->unlock();
            semaphore->signal();
        });
        b->async([&, i] {
            semaphore->wait();
            story += "b" + std::to_string(i) + " ";
            a->sync([&] { story += "s "; });
        });
        sim.globalQueue(QueuePriority::Default).async([&, i] { story += "g" + std::to_string(i) + " "; });
    }
    const auto timer = sim.timer(a, 10ms, [&] { story += "t "; });
    sim.advance(35ms);
    hash = sim.traceHash();
    return story;
}

TEST(SimScheduler, ASeedReplaysExactlyAndSeedsDiffer) {
    std::set<std::string> stories;
    std::set<std::uint64_t> hashes;
    for (std::uint64_t seed = 1; seed <= 50; ++seed) {
        std::uint64_t first = 0, second = 0;
        const std::string story = play(seed, first);
        EXPECT_EQ(story, play(seed, second));
        EXPECT_EQ(first, second);
        stories.insert(story);
        hashes.insert(first);
    }
    EXPECT_GT(stories.size(), 40u);
    EXPECT_EQ(hashes.size(), 50u);
}

TEST(SimScheduler, TheTraceOfASeedIsTheSameOnEveryMachine) {
    // Written down once; a change of the engine's choices changes it, a change of machine or compiler must not.
    SimRandom random(42);
    EXPECT_EQ(random.next(), 1546998764402558742u);
    EXPECT_EQ(random.next(), 6990951692964543102u);
}

TEST(SimScheduler, AQueueKeepsItsOrderUnderEverySeed) {
    for (std::uint64_t seed = 0; seed < 100; ++seed) {
        SimScheduler sim(seed);
        const auto queue = sim.serialQueue("queue");
        std::vector<int> order;
        for (int i = 0; i < 10; ++i) queue->async([&, i] { order.push_back(i); });
        sim.globalQueue(QueuePriority::Default).async([&] { queue->sync([&] { order.push_back(10); }); });
        sim.runUntilIdle();
        EXPECT_EQ(order, (std::vector{0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10}));
    }
}

TEST(SimScheduler, NoTwoTasksOfOneQueueOverlapThoughTheyWait) {
    for (std::uint64_t seed = 0; seed < 100; ++seed) {
        SimScheduler sim(seed);
        const auto queue = sim.serialQueue("queue");
        const auto semaphore = sim.semaphore(0);
        int inside = 0;
        for (int i = 0; i < 4; ++i)
            queue->async([&] {
                EXPECT_EQ(++inside, 1);
                semaphore->wait();
                --inside;
            });
        for (int i = 0; i < 4; ++i)
            sim.globalQueue(QueuePriority::Default).async([&] {
                queue->sync([&] {
                    EXPECT_EQ(++inside, 1);
                    --inside;
                });
            });
        for (int i = 0; i < 4; ++i) sim.globalQueue(QueuePriority::Background).async([&] { semaphore->signal(); });
        sim.runUntilIdle();
        EXPECT_EQ(inside, 0);
        EXPECT_TRUE(sim.blockedTasks().empty());
    }
}

TEST(SimScheduler, TimeStandsWhileAnythingCanGoOnAndThenGoesToTheNextTimer) {
    SimScheduler sim(1);
    const auto queue = sim.serialQueue("queue");
    std::vector<std::int64_t> ticks;
    const auto timer = sim.timer(queue, 10ms, [&] { ticks.push_back(sim.now().nanoseconds); });
    sim.runUntilIdle();
    EXPECT_EQ(sim.now().nanoseconds, 0);
    sim.advance(25ms);
    EXPECT_EQ(ticks, (std::vector<std::int64_t>{10'000'000, 20'000'000}));
    EXPECT_EQ(sim.now().nanoseconds, 25'000'000);
}

TEST(SimScheduler, ATimedWaitEndsAtItsLimitAndNotBefore) {
    SimScheduler sim(1);
    const auto semaphore = sim.semaphore(0);
    bool ended = false, signalled = true;
    sim.globalQueue(QueuePriority::Default).async([&] {
        signalled = semaphore->waitFor(100ms);
        ended = true;
    });
    sim.advance(99ms);
    EXPECT_FALSE(ended);
    ASSERT_EQ(sim.blockedTasks().size(), 1u);
    EXPECT_EQ(sim.blockedTasks()[0].waitsFor, "semaphore, with a time limit");
    sim.advance(1ms);
    EXPECT_TRUE(ended);
    EXPECT_FALSE(signalled);
    semaphore->signal();
    EXPECT_TRUE(semaphore->waitFor(0ms));  // the wait that timed out takes no signal
}

TEST(SimScheduler, ASignalEndsATimedWaitAndItsLimitIsForgotten) {
    SimScheduler sim(1);
    const auto semaphore = sim.semaphore(0);
    bool signalled = false;
    sim.globalQueue(QueuePriority::Default).async([&] { signalled = semaphore->waitFor(100ms); });
    sim.advance(50ms);
    semaphore->signal();
    sim.runUntilIdle();
    EXPECT_TRUE(signalled);
    sim.advance(100ms);
    EXPECT_TRUE(sim.blockedTasks().empty());
}

TEST(SimScheduler, TheTestsOwnWaitLetsTheSimulationGoOn) {
    SimScheduler sim(1);
    const auto queue = sim.serialQueue("queue");
    const auto semaphore = sim.semaphore(0);
    const auto timer = sim.timer(queue, 10ms, [&] { semaphore->signal(); });
    semaphore->wait();
    EXPECT_EQ(sim.now().nanoseconds, 10'000'000);
    bool ran = false;
    queue->async([&] { sim.semaphore(0)->waitFor(5ms) ? void() : void(ran = true); });
    queue->sync([&] { EXPECT_TRUE(ran); });
    EXPECT_EQ(sim.now().nanoseconds, 15'000'000);
}

TEST(SimScheduler, TheTestsWaitForWhatNeverComesNamesWhoWaits) {
    SimScheduler sim(1);
    const auto queue = sim.serialQueue("stuck");
    const auto never = sim.semaphore(0);
    queue->async([&] { never->wait(); });
    try {
        queue->sync([] { FAIL() << "the queue is held"; });
        FAIL() << "the wait ended";
    } catch (const std::runtime_error& error) {
        EXPECT_NE(std::string(error.what()).find("[stuck waits for semaphore]"), std::string::npos) << error.what();
    }
    never->signal();
    bool ran = false;
    queue->sync([&] { ran = true; });
    EXPECT_TRUE(ran);
}

TEST(SimScheduler, ADeadlockOfTasksIsReportedWithWhatTheyWaitFor) {
    SimScheduler sim(7);
    sim.setYieldOneIn(1);
    const auto a = sim.serialQueue("a"), b = sim.serialQueue("b");
    const auto met = sim.semaphore(0);
    a->async([&] { met->wait(); b->sync([] {}); });
    b->async([&] { met->signal(); a->sync([] {}); });
    sim.runUntilIdle();
    const std::vector<SimBlockedTask> blocked = sim.blockedTasks();
    std::set<std::string> who;
    for (const SimBlockedTask& task : blocked) who.insert(task.lane + ": " + task.waitsFor);
    EXPECT_EQ(who, (std::set<std::string>{"a: queue b held by b", "b: queue a held by a"}));
}

TEST(SimScheduler, ALockTakenTwiceBlocksAndMayBeDestroyedWhileHeld) {
    SimScheduler sim(1);
    auto lock = sim.ownerlessLock();
    lock->lock();
    bool taken = false;
    sim.globalQueue(QueuePriority::Default).async([&] {
        lock->lock();
        taken = true;
    });
    sim.runUntilIdle();
    EXPECT_FALSE(taken);
    EXPECT_EQ(sim.blockedTasks()[0].waitsFor, "lock");
    lock->unlock();
    sim.runUntilIdle();
    EXPECT_TRUE(taken);
    lock.reset();
}

TEST(SimScheduler, TheEndOfTheWorldUnwindsWhatWaits) {
    auto held = std::make_shared<int>(1);
    bool reached = false, syncEnded = false;
    {
        SimScheduler sim(1);
        const auto queue = sim.serialQueue("queue");
        const auto never = sim.semaphore(0);
        queue->async([&, held] {
            const auto onTheStack = held;
            never->wait();
            reached = true;
        });
        sim.runUntilIdle();
        queue->async([held] { FAIL() << "dropped"; });
        sim.globalQueue(QueuePriority::Default).async([&, held] {
            queue->sync([] {});
            syncEnded = true;
        });
        sim.runUntilIdle();
        EXPECT_EQ(sim.blockedTasks().size(), 2u);
        sim.endWorld();
        EXPECT_FALSE(reached);
        EXPECT_TRUE(syncEnded);
        bool inlineSync = false;
        queue->sync([&] { inlineSync = true; });
        EXPECT_TRUE(inlineSync);
        queue->async([] { FAIL() << "the world has ended"; });
        sim.runUntilIdle();
    }
    EXPECT_EQ(held.use_count(), 1);
}

TEST(SimScheduler, ATimerDestroyedFromItsOwnTaskTicksNoMore) {
    SimScheduler sim(3);
    const auto queue = sim.serialQueue("queue");
    int ticks = 0;
    std::unique_ptr<Timer> timer = sim.timer(queue, 1ms, [&] {
        ++ticks;
        timer.reset();
    });
    sim.advance(10ms);
    EXPECT_EQ(ticks, 1);
}

TEST(SimScheduler, StepMakesOneStep) {
    SimScheduler sim(1);
    const auto queue = sim.serialQueue("queue");
    int count = 0;
    for (int i = 0; i < 3; ++i) queue->async([&] { ++count; });
    EXPECT_TRUE(sim.step());
    EXPECT_EQ(count, 1);
    EXPECT_TRUE(sim.step());
    EXPECT_TRUE(sim.step());
    EXPECT_FALSE(sim.step());
    EXPECT_EQ(count, 3);
}

TEST(SimScheduler, EveryOrderOfTwoTasksComesUp) {
    std::set<std::string> orders;
    for (std::uint64_t seed = 0; seed < 200; ++seed) {
        SimScheduler sim(seed);
        std::string order;
        const auto gate = sim.semaphore(1);
        for (const char name : {'x', 'y'})
            sim.globalQueue(QueuePriority::Default).async([&, name] {
                order += name;
                gate->wait();
                order += name;
                gate->signal();
                order += name;
            });
        sim.runUntilIdle();
        orders.insert(order);
    }
    EXPECT_GE(orders.size(), 8u);
}

TEST(SimScheduler, TheMainLoopRunsUntilItIsToldToStop) {
    SimScheduler sim(1);
    int ticks = 0;
    const auto timer = sim.timer(sim.sharedMainQueue(), 1s, [&] {
        EXPECT_TRUE(sim.mainQueue().isCurrent());
        if (++ticks == 3) sim.requestStop();
    });
    sim.runMainLoop();
    EXPECT_EQ(ticks, 3);
}

}  // namespace
}  // namespace lumacast
