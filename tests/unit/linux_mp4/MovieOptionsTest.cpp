// Where a movie's presentation starts, and when it says that it was made.

#include <gtest/gtest.h>

#include "tests/unit/linux_mp4/BoxParser.h"
#include "tests/unit/linux_mp4/Descriptions.h"
#include "tests/unit/linux_mp4/Times.h"

namespace lumacast::mp4 {
namespace {

using test::MemorySink;
using test::movieDuration;
using test::parseBoxes;
using test::ParsedBox;
using test::payload;
using test::tracksOf;

TEST(MovieStart, GivenWithinTheMediaSkipsWhatLiesBeforeInEveryTrack) {
    MemorySink sink;
    MovieOptions options;
    options.presentationStart = 700'000'000;
    MovieBoxWriter writer(sink, options);
    const auto video = writer.addVideoTrack(test::videoDescription());
    const auto sound = writer.addAudioTrack(test::audioDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    for (std::int64_t i = 0; i < 20; ++i) {
        ASSERT_EQ(writer.addSample(*video, {i * kSecond / 10, 0, i == 0}, payload(1, 30)), MovieError::none);
    }
    for (std::int64_t frame = -1024; frame < 96000; frame += 1024) {
        ASSERT_EQ(writer.addSample(*sound, {frame, 1024}, payload(2, 10)), MovieError::none);
    }
    ASSERT_EQ(writer.flushFragment(), MovieError::none);
    const auto recording = sink.file();
    const auto initial = tracksOf(parseBoxes(recording).at(2));
    ASSERT_EQ(writer.finish(2 * kSecond), MovieError::none);
    const auto boxes = parseBoxes(sink.file());
    const auto tracks = tracksOf(boxes.at(2));
    ASSERT_EQ(tracks[0].edits.size(), 1U);
    EXPECT_EQ(tracks[0].edits[0].mediaTime, 700'000);
    EXPECT_EQ(tracks[0].edits[0].duration, 1'300'000U);
    ASSERT_EQ(tracks[1].edits.size(), 1U);
    EXPECT_EQ(tracks[1].edits[0].mediaTime, 1024 + 33'600);
    EXPECT_EQ(tracks[0].samples.size(), 20U) << "all pictures are there to decode from";
    ASSERT_EQ(initial[0].edits.size(), 1U);
    EXPECT_EQ(initial[0].edits[0].mediaTime, 700'000);
    ASSERT_EQ(initial[1].edits.size(), 1U);
    EXPECT_EQ(initial[1].edits[0].mediaTime, 1024 + 33'600) << "though no sound had come with the first fragment";
}

TEST(MovieStart, GivenBeforeTheFirstPictureDelaysIt) {
    MemorySink sink;
    MovieOptions options;
    options.presentationStart = 0;
    MovieBoxWriter writer(sink, options);
    const auto video = writer.addVideoTrack(test::videoDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    ASSERT_EQ(writer.addSample(*video, {kSecond / 4, 0, true}, payload(1, 30)), MovieError::none);
    ASSERT_EQ(writer.finish(kSecond), MovieError::none);
    const auto boxes = parseBoxes(sink.file());
    const auto tracks = tracksOf(boxes.at(2));
    ASSERT_EQ(tracks[0].edits.size(), 2U);
    EXPECT_EQ(tracks[0].edits[0].mediaTime, -1);
    EXPECT_EQ(tracks[0].edits[0].duration, 250'000U);
    EXPECT_EQ(movieDuration(boxes[2]), 1'000'000U);
}

TEST(MovieCreationTime, IsStatedInEveryHeaderAndTakesWideFieldsAfter2040) {
    for (const std::uint64_t when : {std::uint64_t{3'800'000'000}, std::uint64_t{5'000'000'000}}) {
        MemorySink sink;
        MovieOptions options;
        options.creationTime = when;
        MovieBoxWriter writer(sink, options);
        const auto video = writer.addVideoTrack(test::videoDescription());
        ASSERT_EQ(writer.start(), MovieError::none);
        ASSERT_EQ(writer.addSample(*video, {0, 0, true}, payload(0, 10)), MovieError::none);
        ASSERT_EQ(writer.finish(1000), MovieError::none);
        const auto boxes = parseBoxes(sink.file());
        for (const char* path : {"mvhd", "trak/tkhd", "trak/mdia/mdhd"}) {
            const ParsedBox& box = boxes[2].at(path);
            const std::size_t wide = box.version() == 1 ? 8 : 4;
            EXPECT_EQ(wide, when > UINT32_MAX ? 8U : 4U);
            test::Fields fields(box.payload);
            fields.skip(4);
            EXPECT_EQ(fields.number(wide), when);
        }
    }
}

}  // namespace
}  // namespace lumacast::mp4
