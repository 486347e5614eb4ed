#include "linux/system/DiskLane.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>
#include <vector>

#include "tests/unit/linux_services/Until.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;

std::optional<int> askThrough(DiskLane& lane, const std::shared_ptr<Gate>& gate, std::chrono::nanoseconds patience) {
    return lane.ask<int>(patience, [gate] {
        gate->pass();
        return 7;
    });
}

TEST(DiskLane, AQuestionIsAnswered) {
    DiskLane lane;
    EXPECT_EQ(lane.ask<int>(30s, [] { return 42; }), 42);
    EXPECT_EQ(lane.threadCount(), 1u);
}

TEST(DiskLane, QuestionsOneAfterAnotherNeedOneThread) {
    DiskLane lane;
    for (int i = 0; i < 100; ++i) EXPECT_EQ(lane.ask<int>(30s, [i] { return i; }), i);
    EXPECT_LE(lane.threadCount(), 2u);
}

TEST(DiskLane, AHungQuestionCostsThePatienceAndNoMore) {
    DiskLane lane;
    const auto gate = std::make_shared<Gate>();
    gate->shut();
    const auto begin = std::chrono::steady_clock::now();
    EXPECT_EQ(askThrough(lane, gate, 40ms), std::nullopt);
    EXPECT_GE(std::chrono::steady_clock::now() - begin, 40ms);
    EXPECT_EQ(lane.ask<int>(30s, [] { return 1; }), 1) << "another thread answers the next question";
    gate->open();
}

TEST(DiskLane, HungQuestionsDoNotPileUpThreads) {
    DiskLane lane(3);
    const auto gate = std::make_shared<Gate>();
    gate->shut();
    ASSERT_TRUE(until([&] { return !askThrough(lane, gate, 1ms) && gate->arrived() == 3; }));
    for (int i = 0; i < 20; ++i) EXPECT_EQ(askThrough(lane, gate, 1ms), std::nullopt);
    EXPECT_EQ(lane.threadCount(), 3u);
    gate->open();
    EXPECT_EQ(askThrough(lane, gate, 30s), 7);
    EXPECT_EQ(gate->arrived(), 4) << "a question nobody waits for any more is not asked";
}

TEST(DiskLane, ManyLanesMayAsk) {
    DiskLane lane(2);
    std::atomic<int> right{0};
    std::vector<std::thread> lanes;
    for (int i = 0; i < 8; ++i)
        lanes.emplace_back([&, i] {
            for (int k = 0; k < 50; ++k)
                if (lane.ask<int>(30s, [i, k] { return i * 1000 + k; }) == i * 1000 + k) ++right;
        });
    for (std::thread& thread : lanes) thread.join();
    EXPECT_EQ(right, 400);
    EXPECT_LE(lane.threadCount(), 2u);
}

TEST(DiskLane, ItsEndLeavesAHungQuestionToItsThread) {
    const auto gate = std::make_shared<Gate>();
    const auto done = std::make_shared<std::atomic<bool>>(false);
    gate->shut();
    {
        DiskLane lane;
        ASSERT_TRUE(until([&] {
            lane.ask<int>(1ms, [gate, done] {
                gate->pass();
                *done = true;
                return 0;
            });
            return gate->arrived() > 0;
        }));
    }
    EXPECT_FALSE(*done);
    gate->open();
    EXPECT_TRUE(until([&] { return done->load(); }));
}

}  // namespace
}  // namespace lumacast
