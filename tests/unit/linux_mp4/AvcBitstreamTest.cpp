#include "linux/media/mp4/AvcBitstream.h"

#include <gtest/gtest.h>

#include <random>

#include "tests/unit/linux_mp4/Descriptions.h"

namespace lumacast::mp4 {
namespace {

using test::Bytes;

Bytes join(std::initializer_list<Bytes> parts) {
    Bytes all;
    for (const Bytes& part : parts) {
        all.insert(all.end(), part.begin(), part.end());
    }
    return all;
}

TEST(AvcBitstream, SplitsAtStartCodesOfThreeAndFourBytesAndDropsTrailingZeros) {
    const Bytes stream{0, 0, 0, 1, 0x09, 0xF0, 0, 0, 1, 0x65, 0x88, 0, 0, 3, 0, 0x80, 0, 0, 0, 0, 0, 1, 0x41, 0x9A, 0};
    const auto units = splitAnnexB(stream);
    ASSERT_EQ(units.size(), 3U);
    EXPECT_EQ(Bytes(units[0].begin(), units[0].end()), (Bytes{0x09, 0xF0}));
    EXPECT_EQ(Bytes(units[1].begin(), units[1].end()), (Bytes{0x65, 0x88, 0, 0, 3, 0, 0x80}));
    EXPECT_EQ(Bytes(units[2].begin(), units[2].end()), (Bytes{0x41, 0x9A}));
}

TEST(AvcBitstream, FindsNothingWithoutAStartCode) {
    EXPECT_TRUE(splitAnnexB({}).empty());
    EXPECT_TRUE(splitAnnexB(Bytes{0, 0}).empty());
    EXPECT_TRUE(splitAnnexB(Bytes{1, 2, 3, 4}).empty());
    EXPECT_TRUE(splitAnnexB(Bytes{0, 0, 1}).empty());
}

TEST(AvcBitstream, CollectsTheParameterSetsOfAGlobalHeader) {
    const Bytes header = join({{0, 0, 0, 1}, test::sequenceParameterSet(), {0, 0, 1}, test::pictureParameterSet()});
    const ParameterSets sets = parameterSetsOf(header);
    ASSERT_EQ(sets.sequence.size(), 1U);
    ASSERT_EQ(sets.picture.size(), 1U);
    EXPECT_EQ(sets.sequence[0], test::sequenceParameterSet());
    EXPECT_EQ(sets.picture[0], test::pictureParameterSet());
}

TEST(AvcBitstream, PutsLengthsBeforeSlicesAndLeavesDelimitersAndParameterSetsOut) {
    const Bytes unit = join({{0, 0, 0, 1, 0x09, 0xF0},
                             {0, 0, 0, 1},
                             test::sequenceParameterSet(),
                             {0, 0, 0, 1},
                             test::pictureParameterSet(),
                             {0, 0, 1, 0x06, 0x05, 0x01, 0xAA, 0x80},
                             {0, 0, 1, 0x65, 0x11, 0x22}});
    Bytes sample{0x77};
    ASSERT_TRUE(appendLengthPrefixed(unit, sample));
    EXPECT_EQ(sample, (Bytes{0x77, 0, 0, 0, 5, 0x06, 0x05, 0x01, 0xAA, 0x80, 0, 0, 0, 3, 0x65, 0x11, 0x22}));
}

TEST(AvcBitstream, LeavesTheSampleAloneWhenThereIsNoSlice) {
    Bytes sample{1, 2};
    EXPECT_FALSE(appendLengthPrefixed(Bytes{0, 0, 1, 0x06, 0x05, 0x01, 0xAA, 0x80}, sample));
    EXPECT_EQ(sample, (Bytes{1, 2}));
}

TEST(AvcBitstream, ReadsProfileLevelAndChromaOfAHighProfileSet) {
    const auto info = parseSequenceParameterSet(test::sequenceParameterSet());
    ASSERT_TRUE(info.has_value());
    EXPECT_EQ(info->profile, 100);
    EXPECT_EQ(info->compatibility, 0);
    EXPECT_EQ(info->level, 40);
    EXPECT_TRUE(info->hasChromaFields);
    EXPECT_EQ(info->chromaFormat, 1);
    EXPECT_EQ(info->bitDepthLumaMinus8, 0);
    EXPECT_EQ(info->bitDepthChromaMinus8, 0);
}

TEST(AvcBitstream, ReadsTenBitFourTwoTwo) {
    // Profile 122, id 0 "1", chroma 2 "011", luma and chroma depth 10: "011" twice, padded.
    const auto info = parseSequenceParameterSet(Bytes{0x67, 122, 0x10, 31, 0b10110110, 0b11000000});
    ASSERT_TRUE(info.has_value());
    EXPECT_EQ(info->chromaFormat, 2);
    EXPECT_EQ(info->bitDepthLumaMinus8, 2);
    EXPECT_EQ(info->bitDepthChromaMinus8, 2);
}

TEST(AvcBitstream, SkipsEmulationPreventionBeforeTheChromaFields) {
    // An id so large that the set has 00 00 03 in it: 16 zeros, then 1 and 16 bits, then chroma 1 "010", depths "1"
    // "1".
    const auto info = parseSequenceParameterSet(Bytes{0x67, 100, 0, 40, 0, 0, 3, 0b10000000, 0, 0b00101110});
    ASSERT_TRUE(info.has_value());
    EXPECT_EQ(info->chromaFormat, 1);
    EXPECT_EQ(info->bitDepthLumaMinus8, 0);
    EXPECT_EQ(info->bitDepthChromaMinus8, 0);
}

TEST(AvcBitstream, RefusesWhatIsNoSequenceParameterSet) {
    EXPECT_FALSE(parseSequenceParameterSet({}).has_value());
    EXPECT_FALSE(parseSequenceParameterSet(Bytes{0x67, 100, 0, 40}).has_value());
    EXPECT_FALSE(parseSequenceParameterSet(Bytes{0x68, 100, 0, 40, 0x80}).has_value());
    EXPECT_FALSE(parseSequenceParameterSet(Bytes{0x67, 100, 0, 40, 0, 0, 0, 0, 0, 0}).has_value());
    EXPECT_FALSE(parseSequenceParameterSet(Bytes{0x67, 100, 0, 40, 0xFF & 0b10000100}).has_value());
}

TEST(AvcBitstream, SurvivesRandomBytes) {
    std::mt19937 random(7);
    for (int round = 0; round < 20000; ++round) {
        Bytes bytes(random() % 40);
        for (std::uint8_t& byte : bytes) {
            byte = static_cast<std::uint8_t>(random() % 3 == 0 ? random() : random() % 2);
        }
        if (!bytes.empty() && round % 2 == 0) {
            bytes[0] = 0x67;
        }
        std::size_t total = 0;
        for (const auto unit : splitAnnexB(bytes)) {
            total += unit.size() + 3;
        }
        EXPECT_LE(total, bytes.size());
        Bytes sample;
        const bool taken = appendLengthPrefixed(bytes, sample);
        EXPECT_EQ(taken, !sample.empty());
        if (const auto info = parseSequenceParameterSet(bytes)) {
            EXPECT_LE(info->chromaFormat, 3);
        }
    }
}

}  // namespace
}  // namespace lumacast::mp4
