#include "base/Recycler.h"

#include <gtest/gtest.h>

#include <atomic>
#include <deque>
#include <optional>
#include <thread>
#include <vector>

namespace lumacast {
namespace {

struct Counted {
    Counted(std::atomic<int>& alive, int number) : alive(alive), number(number) { ++alive; }
    ~Counted() { --alive; }
    std::atomic<int>& alive;
    const int number;
};

TEST(Recycler, UsesTheMemoryOfWhatHasGoneAgain) {
    const Recycler<Counted> recycler;
    std::atomic<int> alive = 0;
    auto first = recycler.make(alive, 1);
    const auto second = recycler.make(alive, 2);
    const void* const memory = first.get();
    EXPECT_NE(memory, second.get());
    first.reset();
    EXPECT_EQ(alive, 1) << "it has ended, and not only been put aside";
    const auto third = recycler.make(alive, 3);
    EXPECT_EQ(third.get(), memory);
    EXPECT_EQ(third->number, 3);
    EXPECT_EQ(second->number, 2);
}

TEST(Recycler, WaitsForThoseWhoOnlyWatch) {
    const Recycler<Counted> recycler;
    std::atomic<int> alive = 0;
    auto first = recycler.make(alive, 1);
    const std::weak_ptr<Counted> watching = first;
    first.reset();
    const auto second = recycler.make(alive, 2);
    EXPECT_TRUE(watching.expired());
    EXPECT_EQ(second->number, 2);
}

TEST(Recycler, ObjectsOutliveIt) {
    std::atomic<int> alive = 0;
    std::optional<Recycler<Counted>> recycler(std::in_place);
    auto first = recycler->make(alive, 1);
    recycler->make(alive, 2).reset();
    recycler.reset();
    EXPECT_EQ(first->number, 1);
    first.reset();
    EXPECT_EQ(alive, 0);
}

TEST(Recycler, ObjectsEndOnOtherThreadsThanTheyAreMadeOn) {
    const Recycler<Counted> recycler;
    std::atomic<int> alive = 0;
    std::atomic<bool> wrong = false;
    std::vector<std::thread> threads;
    for (int thread = 0; thread < 4; ++thread) {
        // What one has made ends on the next, which goes on making meanwhile.
        std::vector<std::shared_ptr<Counted>> made;
        for (int i = 0; i < 100; ++i) made.push_back(recycler.make(alive, i));
        threads.emplace_back([&, made = std::move(made)]() mutable {
            std::deque<std::shared_ptr<Counted>> held(made.begin(), made.end());
            made.clear();
            for (int i = 100; i < 5000; ++i) {
                held.push_back(recycler.make(alive, i));
                if (held.front()->number != i - 100) wrong = true;
                held.pop_front();
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_FALSE(wrong);
    EXPECT_EQ(alive, 0);
}

}  // namespace
}  // namespace lumacast
