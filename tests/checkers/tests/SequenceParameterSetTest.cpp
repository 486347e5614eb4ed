#include "tests/checkers/SequenceParameterSet.h"

#include <gtest/gtest.h>

#include <vector>

#include "tests/checkers/BoxChecker.h"
#include "tests/checkers/tests/BoxDoctor.h"
#include "tests/checkers/tests/FileBytes.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/unit/linux_mp4/Descriptions.h"

namespace lumacast::checkers {
namespace {

// As x264 wrote it for 1280x720 in High profile, with the colours of SMPTE 170M in limited range.
const std::vector<std::uint8_t> kSet{0x67, 0x64, 0x00, 0x20, 0xAC, 0xB4, 0x02, 0x80, 0x2D, 0xD3, 0x50, 0x60, 0x60, 0x6A,
                                     0x50, 0x00, 0x00, 0x03, 0x00, 0x10, 0x00, 0x00, 0x07, 0x88, 0xF1, 0x83, 0x2A};

TEST(SequenceParameterSet, TellsProfileSizeDepthAndColours) {
    const auto format = readSequenceParameterSet(kSet);
    ASSERT_TRUE(format.has_value());
    EXPECT_EQ(format->profile, 100);
    EXPECT_EQ(format->level, 32);
    EXPECT_TRUE(format->hasChromaFields);
    EXPECT_EQ(format->chromaFormat, 1U);
    EXPECT_EQ(format->lumaDepth, 8U);
    EXPECT_EQ(format->width, 1280U);
    EXPECT_EQ(format->height, 720U);
    EXPECT_EQ(format->fullRange, false);
    EXPECT_EQ(format->colour, (ColourCodes{6, 6, 6}));
}

TEST(SequenceParameterSet, TellsTheCroppedSize) {
    const auto format = readSequenceParameterSet(mp4::test::sequenceParameterSet());
    ASSERT_TRUE(format.has_value());
    EXPECT_EQ(format->width, 1920U);
    EXPECT_EQ(format->height, 1080U) << "1088 are coded";
}

TEST(SequenceParameterSet, RefusesWhatIsCutOffOrSomethingElse) {
    // What stands at its end is not read: how often pictures come, how many wait.
    for (std::size_t size = 0; size < 14; ++size)
        EXPECT_FALSE(readSequenceParameterSet(std::span(kSet).first(size)).has_value()) << size;
    EXPECT_FALSE(readSequenceParameterSet(mp4::test::pictureParameterSet()).has_value());
}

TEST(SequenceParameterSet, AgreesWithTheBoxesAroundItOrTheyAreNamed) {
    mp4::VideoTrackDescription description = mp4::test::videoDescription();
    description.width = 1280;
    description.height = 720;
    description.sequenceParameterSets = {kSet};
    mp4::test::MemorySink sink;
    mp4::MovieBoxWriter writer(sink);
    const auto track = writer.addVideoTrack(description);
    ASSERT_TRUE(track.has_value());
    ASSERT_EQ(writer.start(), mp4::MovieError::none);
    const std::vector<std::uint8_t> slice{0, 0, 0, 2, 0x65, 0x88};
    ASSERT_EQ(writer.addSample(*track, {0, 1'000'000, true}, slice), mp4::MovieError::none);
    ASSERT_EQ(writer.finish(1'000'000), mp4::MovieError::none);
    const BoxDoctor::Bytes good(sink.file().begin(), sink.file().end());
    const ScratchDirectory folder;
    const std::string path = folder.path("movie.mp4");
    writeBytes(path, good);
    EXPECT_EQ(checkBoxes(path).findings, Findings{});

    const std::string entry = "moov/trak/mdia/minf/stbl/stsd/avc1/";
    const std::size_t chroma = BoxDoctor(good).at(entry + "avcC") + 8 + 8 + kSet.size() + 3 + 6;
    const char *record = "14496-15, 5.3.3.1", *colours = "14496-12, 12.1.5";
    const std::vector<Damage> damages{
        {"another chroma format", "another chroma format or depth", record,
         [&](BoxDoctor& d) { d.setNumber(chroma, 0xFE, 1); }},
        {"another depth", "another chroma format or depth", record, [&](BoxDoctor& d) { d.setNumber(chroma + 1, 0xFA, 1); }},
        {"another depth of chroma", "another chroma format or depth", record,
         [&](BoxDoctor& d) { d.setNumber(chroma + 2, 0xFA, 1); }},
        {"another matrix", "other colours than the sequence", colours, [&](BoxDoctor& d) { d.set(entry + "colr", 16, 1, 2); }},
        {"the full range", "another range than the sequence", colours, [&](BoxDoctor& d) { d.set(entry + "colr", 18, 0x80, 1); }},
    };
    for (const Damage& damage : damages) {
        BoxDoctor doctor(good);
        damage.doctor(doctor);
        ASSERT_NE(doctor.bytes(), good) << damage.what;
        writeBytes(path, doctor.bytes());
        const Findings findings = checkBoxes(path).findings;
        EXPECT_TRUE(isNamed(findings, damage)) << damage.what << " gave:\n" << ::testing::PrintToString(findings);
    }
}

}  // namespace
}  // namespace lumacast::checkers
