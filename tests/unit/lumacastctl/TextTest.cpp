#include "client/lumacastctl/Text.h"

#include <gtest/gtest.h>

#include <limits>

namespace lumacast::ctl {
namespace {

TEST(Bytes, AreWrittenInDecimalUnitsWithOneDigit) {
    EXPECT_EQ(bytesText(0), "0 bytes");
    EXPECT_EQ(bytesText(1), "1 byte");
    EXPECT_EQ(bytesText(999), "999 bytes");
    EXPECT_EQ(bytesText(1000), "1.0 kB");
    EXPECT_EQ(bytesText(100'000'000), "100.0 MB");
    EXPECT_EQ(bytesText(1'260'000), "1.3 MB");
    EXPECT_EQ(bytesText(81'600'000'000), "81.6 GB");
    EXPECT_EQ(bytesText(std::numeric_limits<std::uint64_t>::max()), "18.4 EB");
}

TEST(Bytes, ThatRoundUpToAThousandMoveToTheNextUnit) {
    EXPECT_EQ(bytesText(999'949), "999.9 kB");
    EXPECT_EQ(bytesText(999'950), "1.0 MB");
}

TEST(Durations, AreMinutesSecondsAndTenthsAndHoursWhenThereAreAny) {
    EXPECT_EQ(durationText(0), "0:00.0");
    EXPECT_EQ(durationText(2.5), "0:02.5");
    EXPECT_EQ(durationText(754), "12:34.0");
    EXPECT_EQ(durationText(3723.4), "1:02:03.4");
}

TEST(Durations, AreCutOffNotRoundedAndATenthStaysATenth) {
    EXPECT_EQ(durationText(59.99), "0:59.9");
    EXPECT_EQ(durationText(0.3), "0:00.3");
    EXPECT_EQ(durationText(4.1), "0:04.1");
}

TEST(Durations, OfNoSenseAreNoneOrBounded) {
    EXPECT_EQ(durationText(-5), "0:00.0");
    EXPECT_EQ(durationText(std::numeric_limits<double>::quiet_NaN()), "0:00.0");
    EXPECT_EQ(durationText(std::numeric_limits<double>::infinity()), "277777777:46:40.0");
}

TEST(ForeignText, CannotCommandTheTerminal) {
    EXPECT_EQ(printable("a\x1B[2Jb\n\t\x7F"), "a?[2Jb???");
    EXPECT_EQ(printable("a\xC2\x9B" "2J"), "a?2J");
    EXPECT_EQ(printable("Übung/Füße"), "Übung/Füße");
    EXPECT_EQ(printable("\xC2"), "\xC2");
}

TEST(Settings, AreWrittenAsInTheFileAndTextsInQuotes) {
    EXPECT_EQ(settingText(Value(true)), "true");
    EXPECT_EQ(settingText(Value(false)), "false");
    EXPECT_EQ(settingText(Value(std::int64_t{8000000})), "8000000");
    EXPECT_EQ(settingText(Value("true")), "\"true\"");
}

}  // namespace
}  // namespace lumacast::ctl
