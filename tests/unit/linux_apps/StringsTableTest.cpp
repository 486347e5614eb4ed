#include "linux/apps/StringsTable.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string>

#include "base/Utf8.h"

namespace lumacast {
namespace {

std::string text(const StringsTable& table, std::string_view key) {
    const std::string* found = table.find(key);
    return found ? *found : "(none)";
}

TEST(StringsTable, KeysHaveTheirTexts) {
    const auto table = StringsTable::parse("/* first */ \"A\" = \"one\"; // second\n\"B\"=\"two\";\nC.d-e = three;");
    EXPECT_TRUE(table.isComplete());
    EXPECT_EQ(table.size(), 3u);
    EXPECT_EQ(text(table, "A"), "one");
    EXPECT_EQ(text(table, "B"), "two");
    EXPECT_EQ(text(table, "C.d-e"), "three");
    EXPECT_EQ(text(table, "D"), "(none)");
}

TEST(StringsTable, EscapesAreResolved) {
    const auto table = StringsTable::parse(R"("A" = "a\"b\\c\nd\te\rf\'g";)");
    EXPECT_EQ(text(table, "A"), "a\"b\\c\nd\te\rf'g");
}

TEST(StringsTable, UnicodeEscapesBecomeUtf8) {
    const auto table = StringsTable::parse(R"("A" = "\u0041\U00e9\u20AC\ud83d\ude00";)");
    EXPECT_EQ(text(table, "A"), "A\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80");
}

TEST(StringsTable, HalfASurrogatePairIsAMistake) {
    for (const char* escape : {"\\ud83d", "\\ud83dx", "\\ude00", "\\ud83d\\u0041", "\\u12g4", "\\u12", "\\u0000"})
        EXPECT_FALSE(StringsTable::parse("\"A\" = \"" + std::string(escape) + "\";").isComplete()) << escape;
}

TEST(StringsTable, WhatStandsBeforeAMistakeIsKept) {
    for (const char* rest :
         {"\"B\" \"two\";", "\"B\" = \"two\"", "\"B\" = ;", "\"B", "/* open", "= \"x\";", "\"B\" = \"two\\"}) {
        const auto table = StringsTable::parse("\"A\" = \"one\";\n" + std::string(rest));
        EXPECT_FALSE(table.isComplete()) << rest;
        EXPECT_EQ(table.size(), 1u) << rest;
        EXPECT_EQ(text(table, "A"), "one") << rest;
    }
}

TEST(StringsTable, TheFirstTextOfAKeyCounts) {
    EXPECT_EQ(text(StringsTable::parse("\"A\" = \"one\"; \"A\" = \"two\";"), "A"), "one");
}

TEST(StringsTable, NothingAndAByteOrderMarkAreFine) {
    EXPECT_TRUE(StringsTable::parse("").isComplete());
    EXPECT_EQ(text(StringsTable::parse("\xEF\xBB\xBF\"A\" = \"one\";"), "A"), "one");
}

TEST(StringsTable, TextThatIsNotUtf8IsRefused) {
    EXPECT_EQ(StringsTable::parse("\"A\" = \"one\"; \"B\" = \"\xFF\";").size(), 0u);
}

TEST(StringsTable, EntriesAreLimited) {
    std::string many;
    for (int i = 0; i < 5000; ++i) many += "\"K" + std::to_string(i) + "\" = \"x\";\n";
    const auto table = StringsTable::parse(many);
    EXPECT_EQ(table.size(), 4096u);
    EXPECT_FALSE(table.isComplete());
}

TEST(StringsTable, EveryCutAndEveryFlippedByteIsSurvived) {
    const std::string good = "/* c */ \"A\" = \"a\\\"b\\u20ac\"; // x\n\"B\" = \"\xC3\xA9\";\n";
    for (std::size_t length = 0; length < good.size(); ++length) {
        const auto table = StringsTable::parse(std::string_view(good).substr(0, length));
        for (const auto& [key, value] : table.texts()) EXPECT_TRUE(isValidUtf8(value)) << length;
    }
    for (std::size_t at = 0; at < good.size(); ++at) {
        for (int bit = 0; bit < 8; ++bit) {
            std::string bad = good;
            bad[at] = static_cast<char>(bad[at] ^ (1 << bit));
            const auto table = StringsTable::parse(bad);
            EXPECT_LE(table.size(), 3u);
            for (const auto& [key, value] : table.texts()) EXPECT_TRUE(isValidUtf8(value)) << at;
        }
    }
}

}  // namespace
}  // namespace lumacast
