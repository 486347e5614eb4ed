#include "base/Utf8.h"

#include <gtest/gtest.h>

#include <string>

namespace lumacast {
namespace {

TEST(Utf8, WellFormedTextIsValid) {
    EXPECT_TRUE(isValidUtf8(""));
    EXPECT_TRUE(isValidUtf8("plain"));
    EXPECT_TRUE(isValidUtf8(std::string_view("a\0b", 3)));
    EXPECT_TRUE(isValidUtf8("\xC2\x80 \xDF\xBF"));                  // U+0080, U+07FF
    EXPECT_TRUE(isValidUtf8("\xE0\xA0\x80 \xEF\xBF\xBF"));          // U+0800, U+FFFF
    EXPECT_TRUE(isValidUtf8("\xED\x9F\xBF \xEE\x80\x80"));          // around the surrogates
    EXPECT_TRUE(isValidUtf8("\xF0\x90\x80\x80 \xF4\x8F\xBF\xBF"));  // U+10000, U+10FFFF
}

TEST(Utf8, OverlongFormsAreNot) {
    EXPECT_FALSE(isValidUtf8("\xC0\x80"));
    EXPECT_FALSE(isValidUtf8("\xC1\xBF"));
    EXPECT_FALSE(isValidUtf8("\xE0\x9F\xBF"));
    EXPECT_FALSE(isValidUtf8("\xF0\x8F\xBF\xBF"));
}

TEST(Utf8, SurrogatesAndWhatIsBeyondUnicodeAreNot) {
    EXPECT_FALSE(isValidUtf8("\xED\xA0\x80"));
    EXPECT_FALSE(isValidUtf8("\xED\xBF\xBF"));
    EXPECT_FALSE(isValidUtf8("\xF4\x90\x80\x80"));
    EXPECT_FALSE(isValidUtf8("\xF8\x88\x80\x80\x80"));
}

TEST(Utf8, LooseAndMissingBytesAreNot) {
    EXPECT_FALSE(isValidUtf8("\x80"));
    EXPECT_FALSE(isValidUtf8("a\xBF"));
    EXPECT_FALSE(isValidUtf8("\xC3"));
    EXPECT_FALSE(isValidUtf8("\xE2\x82"));
    EXPECT_FALSE(isValidUtf8("\xF0\x9F\x98"));
    EXPECT_FALSE(isValidUtf8("\xC3" "a"));
    EXPECT_FALSE(isValidUtf8("\xFF"));
    EXPECT_FALSE(isValidUtf8("\xFE"));
}

TEST(Utf8, EveryCodePointIsValidExactlyWhenItIsNoSurrogate) {
    for (std::uint32_t code = 0; code <= 0x10FFFF; ++code) {
        std::string text;
        if (code < 0x80) {
            text = {static_cast<char>(code)};
        } else if (code < 0x800) {
            text = {static_cast<char>(0xC0 | code >> 6), static_cast<char>(0x80 | (code & 0x3F))};
        } else if (code < 0x10000) {
            text = {static_cast<char>(0xE0 | code >> 12), static_cast<char>(0x80 | (code >> 6 & 0x3F)),
                    static_cast<char>(0x80 | (code & 0x3F))};
        } else {
            text = {static_cast<char>(0xF0 | code >> 18), static_cast<char>(0x80 | (code >> 12 & 0x3F)),
                    static_cast<char>(0x80 | (code >> 6 & 0x3F)), static_cast<char>(0x80 | (code & 0x3F))};
        }
        ASSERT_EQ(isValidUtf8(text), code < 0xD800 || code > 0xDFFF) << std::hex << code;
    }
}

}  // namespace
}  // namespace lumacast
