// What every scheduler must do with tasks: the contract of Scheduler, SerialQueue and GlobalQueue.

#include <algorithm>
#include <atomic>
#include <memory>
#include <utility>
#include <vector>

#include "base/Guarded.h"
#include "tests/contract/SchedulerFixture.h"

namespace lumacast {
namespace {

using test::SchedulerContract;
using test::SchedulerWorldMaker;

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

SchedulerWorldMaker simulated(std::uint64_t seed) {
    return [seed] { return std::make_unique<test::SimSchedulerWorld>(seed); };
}

INSTANTIATE_TEST_SUITE_P(Fake, SchedulerContract,
                         ::testing::Values(simulated(1), simulated(2), simulated(3), simulated(4)));
INSTANTIATE_TEST_SUITE_P(Port, SchedulerContract,
                         ::testing::Values(SchedulerWorldMaker([] { return std::make_unique<test::PortSchedulerWorld>(); })));

}  // namespace
}  // namespace lumacast
