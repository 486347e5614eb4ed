#include "linux/system/IniFile.h"

#include <gtest/gtest.h>

#include <string>

namespace lumacast {
namespace {

TEST(IniFile, SectionsHoldTheirEntries) {
    const IniFile file = IniFile::parse("a=1\n# comment\n; comment\n[one]\n b = x y \nc=\n[two]\nb=2\n[one]\nd=3");
    ASSERT_EQ(file.sections.size(), 3u);
    EXPECT_EQ(*file.find("", "a"), "1");
    EXPECT_EQ(*file.find("one", "b"), "x y");
    EXPECT_EQ(*file.find("one", "c"), "");
    EXPECT_EQ(*file.find("one", "d"), "3");
    EXPECT_EQ(*file.find("two", "b"), "2");
    EXPECT_EQ(file.find("two", "a"), nullptr);
    EXPECT_EQ(file.find("three", "a"), nullptr);
}

TEST(IniFile, TheLastValueOfAKeyCounts) { EXPECT_EQ(*IniFile::parse("a=1\r\na=2\r\n").find("", "a"), "2"); }

TEST(IniFile, BadLinesArePassedOver) {
    const IniFile file = IniFile::parse("nonsense\n=x\n[open\na=1\n\0\n");
    EXPECT_EQ(*file.find("", "a"), "1");
    EXPECT_EQ(file.sections.size(), 1u);
}

TEST(IniFile, EntriesAreLimited) {
    std::string text;
    for (int i = 0; i < 10'000; ++i) text += "k" + std::to_string(i) + "=1\n";
    EXPECT_EQ(IniFile::parse(text).sections[0].entries.size(), 4096u);
}

TEST(IniFile, ValuesMeanWhatTheyLookLike) {
    for (const char* text : {"true", "TRUE", "Yes", " yes "}) EXPECT_EQ(iniValue(text), Value(true)) << text;
    for (const char* text : {"false", "No"}) EXPECT_EQ(iniValue(text), Value(false)) << text;
    EXPECT_EQ(iniValue("0"), Value(std::int64_t{0}));
    EXPECT_EQ(iniValue("-12"), Value(std::int64_t{-12}));
    EXPECT_EQ(iniValue("+7"), Value(std::int64_t{7}));
    EXPECT_EQ(iniValue("9223372036854775807"), Value(INT64_MAX));
    EXPECT_EQ(iniValue("1.5"), Value(1.5));
    EXPECT_EQ(iniValue("1e3"), Value(1000.0));
    EXPECT_EQ(iniValue("9223372036854775808"), Value(9223372036854775808.0));
    for (const char* text : {"", "hello", "0x10", "inf", "nan", "1.2.3", "--1", "+-1", "truely", "1 2"})
        EXPECT_EQ(iniValue(text), Value(text)) << text;
    EXPECT_EQ(iniValue("\"true\""), Value("true"));
}

}  // namespace
}  // namespace lumacast
