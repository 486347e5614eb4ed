#include "linux/display/FramePacer.h"

#include <gtest/gtest.h>

#include <cmath>
#include <random>
#include <vector>

namespace lumacast::x11 {
namespace {

constexpr std::int64_t kMillisecond = 1'000'000;
constexpr std::int64_t kInterval = 16'666'667;

struct Taken {
    std::vector<std::int64_t> times;
    int lost = 0;     ///< pictures that were replaced before they were taken
    std::int64_t longestWait = 0;
};

// An application draws at `drawn`; each picture is taken when the pacer allows it, unless the next one is there before.
Taken watch(FramePacer& pacer, const std::vector<std::int64_t>& drawn) {
    Taken taken;
    for (std::size_t i = 0; i < drawn.size(); ++i) {
        const std::int64_t at = std::max(drawn[i], pacer.nextChange());
        if (i + 1 < drawn.size() && at >= drawn[i + 1]) {
            ++taken.lost;
            continue;
        }
        pacer.taken(at);
        taken.times.push_back(at);
        taken.longestWait = std::max(taken.longestWait, at - drawn[i]);
    }
    return taken;
}

std::vector<std::int64_t> steady(double perSecond, int count, std::int64_t jitter, unsigned seed) {
    std::mt19937 random(seed);
    std::uniform_int_distribution<std::int64_t> late(-jitter, jitter);
    std::vector<std::int64_t> times;
    for (int i = 0; i < count; ++i)
        times.push_back(1'000'000'000 + std::llround(i * 1e9 / perSecond) + (jitter > 0 ? late(random) : 0));
    return times;
}

TEST(FramePacer, TakesTheFirstFrameAtOnce) {
    const FramePacer pacer(kInterval);
    EXPECT_LE(pacer.nextChange(), 0);
    EXPECT_EQ(pacer.nextRepeat(), FramePacer::kNever) << "there is nothing to repeat yet";
}

TEST(FramePacer, TakesEveryFrameOfAnEquallyFastApplication) {
    for (const std::int64_t jitter : {std::int64_t{0}, kMillisecond, 4 * kMillisecond, 6 * kMillisecond}) {
        FramePacer pacer(kInterval);
        const Taken taken = watch(pacer, steady(60, 6000, jitter, 3));
        EXPECT_EQ(taken.lost, 0) << "with a jitter of " << jitter;
        EXPECT_EQ(taken.times.size(), 6000u);
    }
}

TEST(FramePacer, DoesNotDelayASteadyStreamAfterOneLateFrame) {
    FramePacer pacer(kInterval);
    auto drawn = steady(60, 600, 0, 1);
    drawn[100] += 7 * kMillisecond;
    const Taken taken = watch(pacer, drawn);
    EXPECT_EQ(taken.lost, 0);
    EXPECT_EQ(taken.longestWait, 0);
}

TEST(FramePacer, TakesEveryFrameOfASlowerApplication) {
    for (const double rate : {1.0, 24.0, 30.0, 50.0, 59.0}) {
        FramePacer pacer(kInterval);
        const Taken taken = watch(pacer, steady(rate, 1000, kMillisecond, 5));
        EXPECT_EQ(taken.lost, 0) << rate;
    }
}

TEST(FramePacer, IsNeverFasterThanTheIntervalInTheLongRun) {
    for (const double rate : {61.0, 75.0, 120.0, 144.0, 1000.0}) {
        FramePacer pacer(kInterval);
        const auto drawn = steady(rate, static_cast<int>(rate * 20), 0, 9);
        const Taken taken = watch(pacer, drawn);
        const double seconds = static_cast<double>(taken.times.back() - taken.times.front()) / 1e9;
        EXPECT_LE(static_cast<double>(taken.times.size() - 1) / seconds, 60.1) << rate;
        EXPECT_GE(static_cast<double>(taken.times.size() - 1) / seconds, rate < 70 ? 59.0 : 49.0) << rate;
        for (std::size_t i = 1; i < taken.times.size(); ++i)
            ASSERT_GE(taken.times[i] - taken.times[i - 1], kInterval / 2 - 1) << rate;
    }
}

TEST(FramePacer, RepeatsAStillPictureWithinASecond) {
    FramePacer pacer(kInterval);
    pacer.taken(5'000'000'000);
    EXPECT_GT(pacer.nextRepeat(), 5'800'000'000);
    EXPECT_LT(pacer.nextRepeat(), 6'000'000'000);
}

TEST(FramePacer, RepeatsNoFasterThanALongInterval) {
    FramePacer pacer(3'000'000'000);
    pacer.taken(5'000'000'000);
    EXPECT_EQ(pacer.nextRepeat(), 8'000'000'000);
}

TEST(FramePacer, TakesAFrameAtOnceAfterARestart) {
    FramePacer pacer(kInterval);
    pacer.taken(5'000'000'000);
    EXPECT_GT(pacer.nextChange(), 5'000'000'000);
    pacer.restart();
    EXPECT_LE(pacer.nextChange(), 5'000'000'000);
}

}  // namespace
}  // namespace lumacast::x11
