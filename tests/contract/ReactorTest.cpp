// The loop under everything: order, wakes, watches and timers.

#include "linux/ipc/Reactor.h"

#include <gtest/gtest.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <thread>
#include <vector>

#include "linux/ipc/Fd.h"

namespace lumacast {
namespace {

/// A reactor that runs on a thread of its own.
class ReactorTest : public ::testing::Test {
protected:
    void TearDown() override {
        reactor.requestStop();
        thread.join();
    }
    void spinUntil(const std::function<bool()>& condition) {
        const auto limit = std::chrono::steady_clock::now() + std::chrono::seconds(30);
        while (!condition()) {
            ASSERT_LT(std::chrono::steady_clock::now(), limit);
            std::this_thread::yield();
        }
    }
    Reactor reactor{"test"};
    std::thread thread{[this] { reactor.run(); }};
};

Fd signalledEvent() { return Fd(eventfd(1, EFD_CLOEXEC | EFD_NONBLOCK)); }

TEST_F(ReactorTest, TasksOfManyThreadsAllRunEachThreadsInOrder) {
    constexpr int kThreads = 4;
    constexpr int kTasks = 5000;
    std::array<std::vector<int>, kThreads> ran;
    std::vector<std::thread> threads;
    for (int t = 0; t < kThreads; ++t)
        threads.emplace_back([&, t] {
            for (int i = 0; i < kTasks; ++i)
                reactor.async([&, t, i] { ran[static_cast<std::size_t>(t)].push_back(i); });
        });
    for (std::thread& one : threads) one.join();
    reactor.sync([] {});
    for (const auto& list : ran) {
        ASSERT_EQ(list.size(), static_cast<std::size_t>(kTasks));
        for (int i = 0; i < kTasks; ++i) ASSERT_EQ(list[static_cast<std::size_t>(i)], i);
    }
}

TEST_F(ReactorTest, SyncOnItselfRunsInlineAtAnyDepth) {
    int depth = 0;
    EXPECT_FALSE(reactor.isCurrent());
    reactor.sync([&] {
        EXPECT_TRUE(reactor.isCurrent());
        reactor.sync([&] { reactor.sync([&] { ++depth; }); });
        EXPECT_EQ(depth, 1);
    });
}

TEST_F(ReactorTest, SyncRunsAfterWhatWasSubmittedBefore) {
    std::vector<int> order;
    for (int i = 0; i < 1000; ++i) reactor.async([&, i] { order.push_back(i); });
    reactor.sync([&] { EXPECT_EQ(order.size(), 1000u); });
}

TEST_F(ReactorTest, AWakeIsNeverLost) {
    // Each task is submitted while the loop is falling asleep from the one before. A lost wake would hang here, until
    // the test run's limit.
    int ran = 0;
    for (int i = 0; i < 20'000; ++i) reactor.sync([&] { ++ran; });
    EXPECT_EQ(ran, 20'000);
}

TEST_F(ReactorTest, AReadyDescriptorIsReportedAsLongAsItIsReady) {
    const Fd event = signalledEvent();
    std::atomic<int> calls{0};
    const auto watch = reactor.watch(event.get(), EPOLLIN, [&](std::uint32_t events) {
        EXPECT_EQ(events, static_cast<std::uint32_t>(EPOLLIN));
        EXPECT_TRUE(reactor.isCurrent());
        if (++calls == 3) {
            std::uint64_t value = 0;
            EXPECT_EQ(read(event.get(), &value, sizeof value), static_cast<ssize_t>(sizeof value));
        }
        return Reactor::Again::No;
    });
    ASSERT_TRUE(watch);
    spinUntil([&] { return calls >= 3; });
    for (int i = 0; i < 10; ++i) reactor.sync([] {});
    EXPECT_EQ(calls, 3);
}

TEST_F(ReactorTest, AWatchThatAsksToBeCalledAgainIs) {
    const Fd event = signalledEvent();
    std::vector<std::uint32_t> calls;
    std::atomic<bool> done{false};
    const auto watch = reactor.watch(event.get(), EPOLLIN, [&](std::uint32_t events) {
        std::uint64_t value = 0;
        if (calls.empty()) {
            EXPECT_GT(read(event.get(), &value, sizeof value), 0);
        }
        calls.push_back(events);
        done = calls.size() == 4;
        return done ? Reactor::Again::No : Reactor::Again::Yes;
    });
    spinUntil([&] { return done.load(); });
    reactor.sync([&] { EXPECT_EQ(calls, (std::vector<std::uint32_t>{EPOLLIN, 0, 0, 0})); });
}

TEST_F(ReactorTest, AWatchCanBeDestroyedFromItsOwnTask) {
    const Fd event = signalledEvent();
    std::unique_ptr<Reactor::Watch> watch;
    std::atomic<int> calls{0};
    reactor.sync([&] {
        watch = reactor.watch(event.get(), EPOLLIN, [&](std::uint32_t) {
            watch.reset();
            ++calls;
            return Reactor::Again::Yes;
        });
    });
    spinUntil([&] { return calls == 1; });
    for (int i = 0; i < 10; ++i) reactor.sync([] {});
    EXPECT_EQ(calls, 1);
}

TEST_F(ReactorTest, AWatchDestroyedByAnotherOneOfTheSameTurnIsNotCalled) {
    const Fd first = signalledEvent(), second = signalledEvent();
    std::array<std::unique_ptr<Reactor::Watch>, 2> watches;
    std::atomic<int> calls{0};
    reactor.sync([&] {
        for (std::size_t i = 0; i < 2; ++i)
            watches[i] = reactor.watch((i == 0 ? first : second).get(), EPOLLIN, [&, i](std::uint32_t) {
                ++calls;
                watches[1 - i].reset();
                watches[i].reset();
                return Reactor::Again::No;
            });
    });
    spinUntil([&] { return calls >= 1; });
    for (int i = 0; i < 10; ++i) reactor.sync([] {});
    EXPECT_EQ(calls, 1);
}

TEST_F(ReactorTest, ADescriptorThatCannotBeWatchedHasNoWatch) {
    EXPECT_EQ(reactor.watch(-1, EPOLLIN, [](std::uint32_t) { return Reactor::Again::No; }), nullptr);
}

TEST_F(ReactorTest, TimersRunInTheOrderOfTheirTimesOnTheReactor) {
    std::vector<int> order;
    std::atomic<int> ran{0};
    const auto note = [&](int which) {
        return [&, which] {
            EXPECT_TRUE(reactor.isCurrent());
            order.push_back(which);
            ++ran;
        };
    };
    const auto begin = std::chrono::steady_clock::now();
    const auto late = reactor.after(std::chrono::milliseconds(60), note(3));
    const auto early = reactor.after(std::chrono::milliseconds(20), note(1));
    const auto middle = reactor.after(std::chrono::milliseconds(40), note(2));
    spinUntil([&] { return ran == 3; });
    EXPECT_GE(std::chrono::steady_clock::now() - begin, std::chrono::milliseconds(60));
    reactor.sync([&] { EXPECT_EQ(order, (std::vector<int>{1, 2, 3})); });
}

TEST_F(ReactorTest, ATimerThatIsDestroyedDoesNotRun) {
    std::atomic<int> ran{0};
    auto cancelled = reactor.after(std::chrono::milliseconds(5), [&] { ran += 100; });
    cancelled.reset();
    const auto kept = reactor.after(std::chrono::milliseconds(20), [&] { ++ran; });
    spinUntil([&] { return ran > 0; });
    EXPECT_EQ(ran, 1);
}

TEST(ReactorStopTest, StopsAfterTheTaskInProgressAndDropsTheRest) {
    Reactor reactor;
    int ran = 0;
    auto dropped = std::make_shared<int>(0);
    const std::weak_ptr<int> weak = dropped;
    reactor.async([&] {
        ++ran;
        reactor.requestStop();
    });
    reactor.async([&ran, held = std::move(dropped)] { ran += 100; });
    reactor.run();
    EXPECT_EQ(ran, 1);
    EXPECT_FALSE(reactor.isCurrent());
    EXPECT_FALSE(weak.expired());
}

TEST(ReactorStopTest, ADroppedTaskMaySubmitAnotherOne) {
    std::weak_ptr<void> weak;
    {
        Reactor reactor;
        auto submitter = std::shared_ptr<void>(nullptr, [&](void*) { reactor.async([] {}); });
        weak = submitter;
        reactor.async([held = std::move(submitter)] {});
    }
    EXPECT_TRUE(weak.expired());
}

}  // namespace
}  // namespace lumacast
