#include "linux/system/Json.h"

#include <gtest/gtest.h>

#include <limits>

namespace lumacast {
namespace {

TEST(Json, EveryKindOfValueHasAText) {
    EXPECT_EQ(jsonText(Value()), "null");
    EXPECT_EQ(jsonText(Value(true)), "true");
    EXPECT_EQ(jsonText(Value(std::int64_t{-5})), "-5");
    EXPECT_EQ(jsonText(Value(UINT64_MAX)), "18446744073709551615");
    EXPECT_EQ(jsonText(Value(0.5)), "0.5");
    EXPECT_EQ(jsonText(Value(std::numeric_limits<double>::infinity())), "null");
    EXPECT_EQ(jsonText(Value("a\"b\n")), R"("a\"b\n")");
    EXPECT_EQ(jsonText(Value(Data{1, 2})), R"("<2 bytes>")");
    EXPECT_EQ(jsonText(Value(Date{1.5})), "1.5");
    EXPECT_EQ(jsonText(Value(URL::file("/x"))), R"("file:///x")");
    EXPECT_EQ(jsonText(Value(Error("d", 3, {{"k", 1}}))), R"({"domain":"d","code":3,"userInfo":{"k":1}})");
}

TEST(Json, DictionariesKeepTheirOrder) {
    EXPECT_EQ(jsonText(Dictionary{{"z", 1}, {"a", Array{Value(), 2}}}), R"({"z":1,"a":[null,2]})");
}

TEST(Json, BytesThatAreNotUtf8AreReplaced) { EXPECT_EQ(jsonText(Value("a\xFF" "b")), "\"a\xEF\xBF\xBD" "b\""); }

TEST(Json, ADocumentBecomesAValue) {
    const auto value = valueFromJson(R"({"a": [1, -1, 2.5, "x", true, null, 18446744073709551615], "a2": {}})");
    ASSERT_TRUE(value);
    EXPECT_EQ(*value, Value(Dictionary{{"a", Array{Value(std::int64_t{1}), Value(std::int64_t{-1}), 2.5, "x", true,
                                                   Value(), Value(UINT64_MAX)}},
                                       {"a2", Dictionary()}}));
}

TEST(Json, WhatIsMalformedIsNoValue) {
    for (const char* text : {"", "{", "[1,]", "{\"a\":}", "nul", "1 2", "\"\xFF\"", "{\"a\" 1}", "[1", "'x'", "1e999"})
        EXPECT_FALSE(valueFromJson(text)) << text;
}

TEST(Json, DepthIsLimited) {
    EXPECT_TRUE(valueFromJson("[[[]]]", 3));
    EXPECT_FALSE(valueFromJson("[[[[]]]]", 3));
    EXPECT_FALSE(valueFromJson(std::string(1'000'000, '[')));
}

TEST(Json, TheLastOfTwoValuesOfAKeyCounts) {
    EXPECT_EQ(*valueFromJson(R"({"a": 1, "a": 2})"), Value(Dictionary{{"a", std::int64_t{2}}}));
}

}  // namespace
}  // namespace lumacast
