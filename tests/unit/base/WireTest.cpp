#include "base/Wire.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <limits>

#include "base/Limits.h"
#include "tests/fakes/FakePlane.h"
#include "tests/fakes/SimRandom.h"
#include "tests/unit/base/NamelessEndpoint.h"

namespace lumacast {
namespace {

std::optional<Value> roundTrip(const Value& value) {
    WireBody body;
    if (!encode(value, body)) return std::nullopt;
    return decode(body.bytes, body.handles);
}

std::optional<Value> decodeBytes(const Data& bytes) { return decode(bytes, {}); }

Value nested(std::uint64_t depth) {
    Value value(1);
    for (std::uint64_t i = 0; i < depth; ++i) value = Value(Array{value});
    return value;
}

/// One value with every kind in it.
Value everything() {
    return Dictionary{
        {"null", Value()},
        {"bools", Array{true, false}},
        {"ints",
         Array{std::numeric_limits<std::int64_t>::min(), std::int64_t{-1}, std::numeric_limits<std::int64_t>::max()}},
        {"uint", std::numeric_limits<std::uint64_t>::max()},
        {"doubles",
         Array{0.1, -0.0, std::numeric_limits<double>::infinity(), std::numeric_limits<double>::denorm_min()}},
        {"text", "sch\u00f6n \U0001F600"},
        {"empty", ""},
        {"zero", std::string("a\0b", 3)},
        {"bytes", Data{0, 255, 128}},
        {"date", Date{-12.5}},
        {"url", URL("file:///a%20b")},
        {"dictionary", Dictionary{{"z", 1}, {"a", Dictionary{}}, {"", Array{}}}},
        {"error", Error("domain", -5803, {{"k", Array{1}}})},
        {"endpoint", Value::EndpointRef(std::make_shared<NamelessEndpoint>())},
        {"plane", Value::PlaneRef(std::make_shared<FakePlane>(2, 2, 1, std::vector<PixelRect>()))},
    };
}

TEST(Wire, EveryKindComesBackAsItWent) {
    const Value value = everything();
    const auto back = roundTrip(value);
    ASSERT_TRUE(back);
    EXPECT_EQ(*back, value);
}

TEST(Wire, TheBytesAreWhatTheLayoutSays) {
    WireBody body;
    ASSERT_TRUE(encode(Value(Array{true, std::int64_t{-2}, "ab"}), body));
    EXPECT_EQ(body.bytes,
              (Data{9, 3, 0, 0, 0, 1, 1, 2, 0xFE, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 5, 2, 0, 0, 0, 'a', 'b'}));
}

TEST(Wire, HandlesTravelBesideTheBytesInTheOrderOfTheirNumbers) {
    const auto first = std::make_shared<NamelessEndpoint>(), second = std::make_shared<NamelessEndpoint>();
    WireBody body;
    ASSERT_TRUE(encode(Value(Array{Value::EndpointRef(first), Value::EndpointRef(second)}), body));
    EXPECT_EQ(body.bytes, (Data{9, 2, 0, 0, 0, 12, 0, 12, 1}));
    ASSERT_EQ(body.handles.size(), 2u);
    EXPECT_EQ(*body.handles[1].as<Value::EndpointRef>(), second);
}

TEST(Wire, AnythingCutShortIsRefused) {
    WireBody body;
    ASSERT_TRUE(encode(everything(), body));
    for (std::size_t length = 0; length < body.bytes.size(); ++length)
        EXPECT_FALSE(decode(std::span(body.bytes).first(length), body.handles)) << length;
}

TEST(Wire, TrailingBytesAreRefused) {
    EXPECT_TRUE(decodeBytes({0}));
    EXPECT_FALSE(decodeBytes({0, 0}));
}

TEST(Wire, UnknownTagsAreRefused) {
    for (int tag = 14; tag < 256; ++tag)
        EXPECT_FALSE(decodeBytes({static_cast<std::uint8_t>(tag), 0, 0, 0, 0, 0, 0, 0, 0}));
}

TEST(Wire, ATruthIsZeroOrOne) {
    EXPECT_TRUE(decodeBytes({1, 1}));
    EXPECT_FALSE(decodeBytes({1, 2}));
}

TEST(Wire, CountsAndLengthsBeyondTheBytesAreRefused) {
    for (const std::uint8_t tag : {5, 6, 8, 9, 10, 11}) {
        EXPECT_FALSE(decodeBytes({tag, 0xFF, 0xFF, 0xFF, 0xFF})) << int{tag};
        EXPECT_FALSE(decodeBytes({tag, 2, 0, 0, 0, 0})) << int{tag};
    }
}

TEST(Wire, TextMustBeUtf8) {
    EXPECT_TRUE(decodeBytes({5, 2, 0, 0, 0, 0xC3, 0xB6}));
    EXPECT_FALSE(decodeBytes({5, 2, 0, 0, 0, 0xC3, 0x28}));
    EXPECT_FALSE(decodeBytes({8, 1, 0, 0, 0, 0xFF}));
    EXPECT_FALSE(decodeBytes({10, 1, 0, 0, 0, 1, 0, 0, 0, 0xFF, 0})) << "a key";
    EXPECT_FALSE(decodeBytes({11, 1, 0, 0, 0, 0xFF, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0})) << "an error's domain";
}

TEST(Wire, AKeyGivenTwiceIsRefused) {
    EXPECT_TRUE(decodeBytes({10, 2, 0, 0, 0, 1, 0, 0, 0, 'a', 0, 1, 0, 0, 0, 'b', 0}));
    EXPECT_FALSE(decodeBytes({10, 2, 0, 0, 0, 1, 0, 0, 0, 'a', 0, 1, 0, 0, 0, 'a', 0}));
}

TEST(Wire, NestingEndsAtTheLimit) {
    const std::uint64_t limit = limitOf(Limit::MessageDepth);
    EXPECT_TRUE(roundTrip(nested(limit)));
    WireBody body;
    EXPECT_FALSE(encode(nested(limit + 1), body));
    const auto bytesNested = [](std::uint64_t depth) {
        Data bytes;
        for (std::uint64_t i = 0; i < depth; ++i) bytes.insert(bytes.end(), {9, 1, 0, 0, 0});
        bytes.push_back(0);
        return bytes;
    };
    EXPECT_TRUE(decodeBytes(bytesNested(limit)));
    EXPECT_FALSE(decodeBytes(bytesNested(limit + 1)));
    EXPECT_FALSE(decodeBytes(bytesNested(200'000))) << "nor is the stack in danger";
}

TEST(Wire, BytesEndAtTheLimit) {
    const std::uint64_t limit = limitOf(Limit::MessageBytes);
    EXPECT_TRUE(roundTrip(Value(Data(limit - 5))));
    WireBody body;
    EXPECT_FALSE(encode(Value(Data(limit - 4)), body));
    WireBody many;
    EXPECT_FALSE(encode(Value(Array(limit, Value())), many));
}

TEST(Wire, TheLastValueDoesNotGoOverTheLimitEither) {
    const std::uint64_t limit = limitOf(Limit::MessageBytes);
    const auto ending = [&](std::uint64_t size, const Value& last) { return Array{Data(size - 10), last}; };
    for (const Value& last : {Value(1), Value(true), Value(Array{}), Value(Dictionary{})}) {
        WireBody alone;
        ASSERT_TRUE(encode(last, alone));
        const std::uint64_t room = limit - alone.bytes.size();
        WireBody fits, fitsAsArray, tooLong, tooLongAsArray;
        EXPECT_TRUE(encode(Value(ending(room, last)), fits));
        EXPECT_EQ(fits.bytes.size(), limit);
        EXPECT_TRUE(encodeArray(ending(room, last), fitsAsArray));
        EXPECT_FALSE(encode(Value(ending(room + 1, last)), tooLong));
        EXPECT_FALSE(encodeArray(ending(room + 1, last), tooLongAsArray));
    }
}

TEST(Wire, HandlesEndAtTheLimit) {
    const auto handles = [](std::uint64_t count) {
        return Value(Array(count, Value(Value::EndpointRef(std::make_shared<NamelessEndpoint>()))));
    };
    EXPECT_TRUE(roundTrip(handles(limitOf(Limit::HandlesPerMessage))));
    WireBody body;
    EXPECT_FALSE(encode(handles(limitOf(Limit::HandlesPerMessage) + 1), body));
}

TEST(Wire, AHandleMustBeThereAndOfItsKind) {
    const std::vector<Value> handles{Value(Value::EndpointRef(std::make_shared<NamelessEndpoint>()))};
    EXPECT_TRUE(decode(Data{12, 0}, handles));
    EXPECT_FALSE(decode(Data{12, 1}, handles));
    EXPECT_FALSE(decode(Data{13, 0}, handles));
    EXPECT_FALSE(decode(Data{12, 0}, {}));
}

/// `count` dictionaries of `entries` entries.
WireBody dictionaries(int count, int entries) {
    Dictionary one;
    for (int i = 0; i < entries; ++i) one.addNew("a key with the number " + std::to_string(i), Value());
    WireBody body;
    EXPECT_TRUE(encode(Value(Array(static_cast<std::size_t>(count), Value(one))), body));
    return body;
}

TEST(Wire, LargeDictionariesTakeNoLongerThanAsManyEntriesInSmallOnes) {
    // The shortest of several times says how much work it is, however busy the machine.
    const auto shortestTime = [](const WireBody& body) {
        auto shortest = std::chrono::steady_clock::duration::max();
        for (int round = 0; round < 9; ++round) {
            const auto begin = std::chrono::steady_clock::now();
            EXPECT_TRUE(decode(body.bytes, body.handles));
            shortest = std::min(shortest, std::chrono::steady_clock::now() - begin);
        }
        return shortest;
    };
    EXPECT_LT(shortestTime(dictionaries(16, 1000)), 6 * shortestTime(dictionaries(1000, 15)));
}

TEST(Wire, AnyChangedByteIsRefusedOrStillAValueThatTravels) {
    WireBody body;
    ASSERT_TRUE(encode(everything(), body));
    for (std::size_t at = 0; at < body.bytes.size(); ++at) {
        for (const int change : {1, 0x80, 0xFF}) {
            Data bytes = body.bytes;
            bytes[at] = static_cast<std::uint8_t>(bytes[at] ^ change);
            const auto value = decode(bytes, body.handles);
            EXPECT_TRUE(!value || roundTrip(*value)) << at;
        }
    }
}

TEST(Wire, RandomBytesNeverDoHarm) {
    SimRandom random(1);
    std::size_t accepted = 0;
    for (int round = 0; round < 20'000; ++round) {
        Data bytes(random.below(40) + 1);
        // Small numbers, so that tags and counts are often right.
        for (std::uint8_t& byte : bytes) byte = static_cast<std::uint8_t>(random.below(random.chance(1, 8) ? 256 : 14));
        const auto value = decodeBytes(bytes);
        accepted += value ? 1 : 0;
        EXPECT_TRUE(!value || roundTrip(*value));
    }
    EXPECT_GT(accepted, 100u) << "or the bytes are too wild to say anything";
}

}  // namespace
}  // namespace lumacast
