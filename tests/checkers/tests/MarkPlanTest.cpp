// When frames are marked.

#include "examples/self_recorder/MarkPlan.h"

#include <gtest/gtest.h>

#include <map>
#include <vector>

namespace lumacast::example {
namespace {

constexpr std::int64_t kMillisecond = 1'000'000;

struct Marks {
    std::vector<std::int64_t> planned;                   ///< the moments, in ns
    std::vector<std::int64_t> aheadOf;                   ///< how long before
    std::map<std::int64_t, std::uint32_t> firstMarked;   ///< number by time
    int marked = 0;
};

/// `seconds` of ticks; those for which `isLeftOut` draw nothing.
template <typename IsLeftOut>
Marks run(std::uint32_t every, int framesPerSecond, int seconds, IsLeftOut isLeftOut) {
    const std::int64_t interval = 1'000'000'000 / framesPerSecond;
    MarkPlan plan(every, interval);
    Marks result;
    std::uint32_t number = 1;
    bool wasMarked = false;
    for (std::int64_t tick = 1; tick <= seconds * framesPerSecond; ++tick) {
        if (isLeftOut(tick)) continue;
        const std::int64_t time = tick * interval;
        if (const auto mark = plan.tick(time, number)) {
            result.planned.push_back(*mark);
            result.aheadOf.push_back(*mark - time);
        }
        const bool isMarked = plan.isMarked(time);
        if (isMarked && !wasMarked) result.firstMarked[time] = number;
        result.marked += isMarked ? 1 : 0;
        wasMarked = isMarked;
        ++number;
    }
    return result;
}

TEST(MarkPlan, MarksTheMultiplesAndKnowsThemBefore) {
    for (const int framesPerSecond : {10, 30, 60, 144}) {
        const Marks result = run(60, framesPerSecond, 20, [](auto) { return false; });
        ASSERT_FALSE(result.firstMarked.empty());
        std::size_t place = 0;
        for (const auto& [time, number] : result.firstMarked) {
            EXPECT_EQ(number, 60 * (place + 1)) << framesPerSecond;
            EXPECT_EQ(time, result.planned[place]);
            EXPECT_GE(result.aheadOf[place], MarkPlan::kLead);
            EXPECT_LT(result.aheadOf[place], MarkPlan::kLead + 150 * kMillisecond);
            ++place;
        }
    }
}

TEST(MarkPlan, AMarkStaysForItsLength) {
    const Marks result = run(70, 60, 10, [](auto) { return false; });
    EXPECT_EQ(result.marked, static_cast<int>(result.firstMarked.size()) * 6);
}

TEST(MarkPlan, KeepsTheMomentWhenFramesAreLeftOut) {
    const Marks result = run(30, 30, 5, [](std::int64_t tick) { return tick == 26 || tick == 27; });
    ASSERT_GE(result.planned.size(), 2U);
    EXPECT_EQ(result.firstMarked.begin()->first, result.planned.front()) << "though the number is another one";
    EXPECT_EQ(result.firstMarked.begin()->second, 28U);
    EXPECT_EQ(std::next(result.firstMarked.begin())->second, 60U) << "and the next one is on its multiple again";
}

TEST(MarkPlan, NoMoreOftenThanItCanBeKnownBefore) {
    const Marks result = run(10, 240, 3, [](auto) { return false; });
    for (std::size_t place = 0; place < result.planned.size(); ++place) {
        EXPECT_GE(result.aheadOf[place], MarkPlan::kLead);
        if (place == 0) continue;
        EXPECT_GT(result.planned[place] - result.planned[place - 1], MarkPlan::kLength);
    }
    EXPECT_GT(result.planned.size(), 5U);
}

TEST(MarkPlan, NoneAreMarkedUnlessAsked) {
    const Marks result = run(0, 30, 5, [](auto) { return false; });
    EXPECT_TRUE(result.planned.empty());
    EXPECT_EQ(result.marked, 0);
}

}  // namespace
}  // namespace lumacast::example
