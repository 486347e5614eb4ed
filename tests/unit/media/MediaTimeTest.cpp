#include "writer/media/MediaTime.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <vector>

namespace lumacast {
namespace {

constexpr std::int64_t kMost = std::numeric_limits<std::int64_t>::max();
constexpr std::int64_t kLeast = std::numeric_limits<std::int64_t>::min();
constexpr std::int32_t kMostScale = std::numeric_limits<std::int32_t>::max();

constexpr MediaTime special(std::uint32_t flag) { return {0, 0, MediaTime::kValid | flag, 0}; }
constexpr MediaTime kPlus = special(MediaTime::kPositiveInfinity);
constexpr MediaTime kMinus = special(MediaTime::kNegativeInfinity);
constexpr MediaTime kIndefinite = special(MediaTime::kIndefinite);

/// A finite, valid time of exactly these numbers, rounded or not.
void expectTime(const MediaTime& time, std::int64_t value, std::int32_t timescale, bool rounded = false) {
    EXPECT_EQ(time.value, value);
    EXPECT_EQ(time.timescale, timescale);
    EXPECT_EQ(time.flags, MediaTime::kValid | (rounded ? MediaTime::kRounded : 0));
    EXPECT_EQ(time.epoch, 0);
}

void expectSpecial(const MediaTime& time, std::uint32_t flag) { EXPECT_EQ(time.flags, MediaTime::kValid | flag); }

void expectInvalid(const MediaTime& time) {
    EXPECT_FALSE(time.isValid());
    EXPECT_EQ(compare(time, kInvalidMediaTime), 0);
}

TEST(MediaTime, TheInvalidTimeIsAllZeroAndTheZeroTimeIsValid) {
    EXPECT_EQ(kInvalidMediaTime.value, 0);
    EXPECT_EQ(kInvalidMediaTime.timescale, 0);
    EXPECT_EQ(kInvalidMediaTime.flags, 0u);
    EXPECT_EQ(kInvalidMediaTime.epoch, 0);
    EXPECT_TRUE(kZeroMediaTime.isValid());
    EXPECT_EQ(kZeroMediaTime.seconds(), 0.0);
    EXPECT_NE(compare(kZeroMediaTime, kInvalidMediaTime), 0);
}

TEST(MediaTime, SecondsBecomeTheNearestTick) {
    expectTime(MediaTime::fromSeconds(2.6, 1), 3, 1, true);
    expectTime(MediaTime::fromSeconds(2.4, 1), 2, 1, true);
    expectTime(MediaTime::fromSeconds(2.0, 1), 2, 1);
    expectTime(MediaTime::fromSeconds(0.5, 600), 300, 600);
    expectTime(MediaTime::fromSeconds(0.0, 1), 0, 1);
    expectTime(MediaTime::fromSeconds(-1.25, 4), -5, 4);
}

TEST(MediaTime, HalfATickGoesAwayFromZero) {
    expectTime(MediaTime::fromSeconds(2.5, 1), 3, 1, true);
    expectTime(MediaTime::fromSeconds(-2.5, 1), -3, 1, true);
    expectTime(MediaTime::fromSeconds(0.5, 1), 1, 1, true);
    // The largest double below a half: adding a half to it gives 1.
    expectTime(MediaTime::fromSeconds(0.49999999999999994, 1), 0, 1, true);
}

TEST(MediaTime, SecondsThatAreNotFiniteAreSpecial) {
    expectSpecial(MediaTime::fromSeconds(INFINITY, 600), MediaTime::kPositiveInfinity);
    expectSpecial(MediaTime::fromSeconds(-INFINITY, 600), MediaTime::kNegativeInfinity);
    expectSpecial(MediaTime::fromSeconds(NAN, 600), MediaTime::kIndefinite);
}

TEST(MediaTime, SecondsBeyondTheRangeOfTicksAreInfinite) {
    expectSpecial(MediaTime::fromSeconds(9223372036854775808.0, 1), MediaTime::kPositiveInfinity);
    expectTime(MediaTime::fromSeconds(9223372036854774784.0, 1), 9223372036854774784, 1);
    expectTime(MediaTime::fromSeconds(-9223372036854775808.0, 1), kLeast, 1);
    expectSpecial(MediaTime::fromSeconds(-9223372036854777856.0, 1), MediaTime::kNegativeInfinity);
    expectSpecial(MediaTime::fromSeconds(1e18, 1'000'000'000), MediaTime::kPositiveInfinity);
    expectSpecial(MediaTime::fromSeconds(1e308, kMostScale), MediaTime::kPositiveInfinity);
}

TEST(MediaTime, ATimescaleBelowOneGivesTheInvalidTime) {
    expectInvalid(MediaTime::fromSeconds(1, 0));
    expectInvalid(MediaTime::fromSeconds(1, -600));
    expectInvalid(MediaTime::fromSeconds(NAN, 0));
}

TEST(MediaTime, SecondsAreTicksOverTimescale) {
    EXPECT_EQ(MediaTime::make(300, 600).seconds(), 0.5);
    EXPECT_EQ(MediaTime::make(-3, 2).seconds(), -1.5);
    EXPECT_EQ(MediaTime::make(7, 0).seconds(), 0.0);
    EXPECT_EQ(kInvalidMediaTime.seconds(), 0.0);
    EXPECT_EQ(kIndefinite.seconds(), 0.0);
    EXPECT_EQ(kPlus.seconds(), INFINITY);
    EXPECT_EQ(kMinus.seconds(), -INFINITY);
}

TEST(MediaTime, ATimeWithoutItsValidBitIsInvalidWhateverElseItHolds) {
    const MediaTime odd{5, 600, MediaTime::kPositiveInfinity, 0};
    EXPECT_EQ(odd.seconds(), 0.0);
    expectInvalid(odd);
    EXPECT_EQ(compare({5, 1, 0, 0}, {6, 1, 0, 0}), 0);
    expectInvalid(add(odd, kZeroMediaTime));
}

TEST(MediaTime, TheKindsAreOrdered) {
    const std::vector<MediaTime> ascending{kMinus, MediaTime::make(kLeast, 1), MediaTime::make(0, 1),
                                           MediaTime::make(kMost, 1), kIndefinite, kPlus, kInvalidMediaTime};
    for (std::size_t a = 0; a < ascending.size(); ++a)
        for (std::size_t b = 0; b < ascending.size(); ++b)
            EXPECT_EQ(compare(ascending[a], ascending[b]), a < b ? -1 : a > b ? 1 : 0) << a << " " << b;
}

TEST(MediaTime, FiniteTimesAreComparedExactly) {
    EXPECT_EQ(compare(MediaTime::make(1, 2), MediaTime::make(300, 600)), 0);
    EXPECT_EQ(compare(MediaTime::make(1, 3), MediaTime::make(333333333, 1'000'000'000)), 1);
    // As doubles these are equal.
    EXPECT_EQ(compare(MediaTime::make(kMost - 1, 1), MediaTime::make(kMost, 1)), -1);
    // Cross products beyond 64 bits.
    EXPECT_EQ(compare(MediaTime::make(kMost, kMostScale), MediaTime::make(kMost - 1, kMostScale)), 1);
    EXPECT_EQ(compare(MediaTime::make(kMost, kMostScale), MediaTime::make(kMost, kMostScale - 1)), -1);
    EXPECT_EQ(compare(MediaTime::make(kLeast, 1), MediaTime::make(kLeast, kMostScale)), -1);
    EXPECT_EQ(compare({1, 1, MediaTime::kValid | MediaTime::kRounded, 0}, MediaTime::make(1, 1)), 0);
}

TEST(MediaTime, SumsKeepACommonTimescale) {
    expectTime(add(MediaTime::make(1, 600), MediaTime::make(2, 600)), 3, 600);
    expectTime(subtract(MediaTime::make(1, 600), MediaTime::make(2, 600)), -1, 600);
}

TEST(MediaTime, SumsOfTwoTimescalesAreExactInTheirLeastCommonMultiple) {
    expectTime(add(MediaTime::make(1, 4), MediaTime::make(1, 6)), 5, 12);
    expectTime(subtract(MediaTime::make(1, 4), MediaTime::make(1, 6)), 1, 12);
    expectTime(add(MediaTime::make(1, 1), MediaTime::make(1, 1'000'000'000)), 1'000'000'001, 1'000'000'000);
    expectTime(add(MediaTime::make(1, 44100), MediaTime::make(1, 48000)), 160 + 147, 7'056'000);
    expectTime(add(MediaTime::make(1, kMostScale), MediaTime::make(1, 1)), std::int64_t{kMostScale} + 1, kMostScale);
}

TEST(MediaTime, AMultipleThatDoesNotFitIsTheLargerTimescaleRoundedAndFlaggedSo) {
    // 1'000'000'000 and 44100 have the multiple 441'000'000'000.
    expectTime(add(MediaTime::make(5, 1'000'000'000), MediaTime::make(1, 44100)), 5 + 22676, 1'000'000'000, true);
    expectTime(subtract(MediaTime::make(1, 44100), MediaTime::make(5, 1'000'000'000)), 22676 - 5, 1'000'000'000, true);
    expectTime(add(MediaTime::make(0, kMostScale), MediaTime::make(-1, kMostScale - 1)), -1, kMostScale, true);
}

TEST(MediaTime, ARoundedOperandMakesARoundedSum) {
    const MediaTime rounded = MediaTime::fromSeconds(0.3, 1);
    expectTime(add(rounded, MediaTime::make(1, 1)), 1, 1, true);
}

TEST(MediaTime, SumsBeyondTheRangeAreInfinite) {
    expectSpecial(add(MediaTime::make(kMost, 1), MediaTime::make(1, 1)), MediaTime::kPositiveInfinity);
    expectSpecial(subtract(MediaTime::make(kLeast, 1), MediaTime::make(1, 1)), MediaTime::kNegativeInfinity);
    expectSpecial(subtract(MediaTime::make(0, 1), MediaTime::make(kLeast, 1)), MediaTime::kPositiveInfinity);
    expectTime(add(MediaTime::make(kMost, 1), MediaTime::make(kLeast, 1)), -1, 1);
    expectSpecial(add(MediaTime::make(kMost, 1), MediaTime::make(0, 2)), MediaTime::kPositiveInfinity);
    expectTime(add(MediaTime::make(kMost, kMostScale), MediaTime::make(kLeast, kMostScale)), -1, kMostScale);
}

TEST(MediaTime, AnInvalidOperandGivesTheInvalidTime) {
    for (const MediaTime& other : {kZeroMediaTime, kPlus, kMinus, kIndefinite, kInvalidMediaTime}) {
        expectInvalid(add(kInvalidMediaTime, other));
        expectInvalid(add(other, kInvalidMediaTime));
        expectInvalid(subtract(kInvalidMediaTime, other));
        expectInvalid(subtract(other, kInvalidMediaTime));
    }
}

TEST(MediaTime, InfinitiesWinOverFiniteTimesAndOppositeOnesAreIndefinite) {
    const MediaTime five = MediaTime::make(5, 1);
    expectSpecial(add(kPlus, five), MediaTime::kPositiveInfinity);
    expectSpecial(add(five, kMinus), MediaTime::kNegativeInfinity);
    expectSpecial(subtract(five, kPlus), MediaTime::kNegativeInfinity);
    expectSpecial(subtract(five, kMinus), MediaTime::kPositiveInfinity);
    expectSpecial(add(kPlus, kPlus), MediaTime::kPositiveInfinity);
    expectSpecial(add(kPlus, kMinus), MediaTime::kIndefinite);
    expectSpecial(subtract(kPlus, kPlus), MediaTime::kIndefinite);
    expectSpecial(subtract(kMinus, kPlus), MediaTime::kNegativeInfinity);
    expectSpecial(add(kIndefinite, five), MediaTime::kIndefinite);
    expectSpecial(add(kIndefinite, kPlus), MediaTime::kIndefinite);
    expectSpecial(subtract(five, kIndefinite), MediaTime::kIndefinite);
}

}  // namespace
}  // namespace lumacast
