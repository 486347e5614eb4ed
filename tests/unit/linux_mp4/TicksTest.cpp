#include "linux/media/mp4/Ticks.h"

#include <gtest/gtest.h>

namespace lumacast::mp4 {
namespace {

TEST(Ticks, ConvertsToTheNearestWithHalvesUpwards) {
    EXPECT_EQ(rescale(1, 2, 1), 1);
    EXPECT_EQ(rescale(-1, 2, 1), 0);
    EXPECT_EQ(rescale(1, 3, 1), 0);
    EXPECT_EQ(rescale(2, 3, 1), 1);
    EXPECT_EQ(rescale(-1, 3, 1), 0);
    EXPECT_EQ(rescale(-2, 3, 1), -1);
    EXPECT_EQ(rescale(1001, 30000, 90000), 3003);
    EXPECT_EQ(rescale(1024, 48000, 1'000'000), 21333);
}

TEST(Ticks, ConvertsThirtyYearsOfNanosecondsExactly) {
    const std::int64_t nanoseconds = 946'080'000LL * 1'000'000'000 + 123'456'789;
    EXPECT_EQ(rescale(nanoseconds, 1'000'000'000, 1'000'000'000), nanoseconds);
    EXPECT_EQ(rescale(nanoseconds, 1'000'000'000, 1'000'000), 946'080'000'123'457);
    EXPECT_EQ(rescale(-nanoseconds, 1'000'000'000, 1'000'000), -946'080'000'123'457);
    EXPECT_EQ(rescale(nanoseconds, 1'000'000'000, 48000), 946'080'000LL * 48000 + 5926);
}

TEST(Ticks, MovesANanosecondStampByHalfAMicrosecondAtMost) {
    for (std::int64_t stamp = 0; stamp < 2'000'000'000; stamp += 16'666'667) {
        const std::int64_t there = rescale(stamp, kNanosecondTimescale, 1'000'000);
        EXPECT_LE(std::abs(there * 1000 - stamp), 500);
    }
}

}  // namespace
}  // namespace lumacast::mp4
