#include <gtest/gtest.h>

#include <cmath>

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

class FinishedMovie : public ::testing::Test {
protected:
    MemorySink sink;
    MovieBoxWriter writer{sink};
    std::optional<TrackId> video;
    std::optional<TrackId> sound;

    void startWithPicture(VideoTrackDescription description = test::videoDescription()) {
        video = writer.addVideoTrack(std::move(description));
        ASSERT_TRUE(video.has_value());
    }

    void add(std::int64_t pts, bool isSync = true, std::uint32_t number = 0, std::size_t size = 40) {
        ASSERT_EQ(writer.addSample(*video, {pts, 0, isSync}, payload(number, size)), MovieError::none);
    }
    void addSound(std::int64_t pts, std::uint32_t duration = 1024) {
        ASSERT_EQ(writer.addSample(*sound, {pts, duration}, payload(9, 11)), MovieError::none);
    }
};

TEST_F(FinishedMovie, IsOneMediaDataBoxAndOneMovieBox) {
    startWithPicture();
    ASSERT_EQ(writer.start(), MovieError::none);
    for (int i = 0; i < 100; ++i) {
        add(i * kSecond / 30, i % 30 == 0);
    }
    ASSERT_EQ(writer.finish(4 * kSecond), MovieError::none);
    const auto boxes = parseBoxes(sink.file());
    ASSERT_EQ(test::typesOf(boxes), "ftyp mdat moov");
    EXPECT_EQ(boxes[1].offset, 32U);
    EXPECT_EQ(boxes[1].headerSize, 16U);
    EXPECT_EQ(boxes[2].offset + boxes[2].size, sink.file().size());
    EXPECT_EQ(boxes[2].childTypes(), "mvhd trak") << "no movie extends box: it is an ordinary movie";
    EXPECT_EQ(boxes[2].at("trak").childTypes(), "tkhd edts mdia");
    EXPECT_EQ(boxes[2].at("trak/mdia").childTypes(), "mdhd hdlr minf");
    EXPECT_EQ(boxes[2].at("trak/mdia/minf").childTypes(), "vmhd dinf stbl");
    EXPECT_EQ(boxes[2].at("trak/mdia/minf/stbl").childTypes(), "stsd stts stss stsc stsz stco");
    EXPECT_EQ(writer.bytesWritten(), sink.file().size());
    EXPECT_FALSE(sink.overwroteBeyondEnd());
}

TEST_F(FinishedMovie, KeepsEveryStampSizeKeyFrameAndByte) {
    startWithPicture();
    ASSERT_EQ(writer.start(), MovieError::none);
    std::vector<std::int64_t> stamps;
    std::int64_t pts = 7'123'457;
    std::uint32_t state = 3;
    for (std::uint32_t i = 0; i < 500; ++i) {
        stamps.push_back(pts);
        add(pts, i % 11 == 0, i, 30 + i % 90);
        state = state * 1664525U + 1013904223U;
        pts += 1 + state % 700'000U;
        if (i % 13 == 0) {
            ASSERT_EQ(writer.flushFragment(), MovieError::none);
        }
    }
    const std::int64_t end = stamps.back() + 123'456;
    ASSERT_EQ(writer.finish(end), MovieError::none);
    const auto boxes = parseBoxes(sink.file());
    const auto tracks = tracksOf(boxes.at(2));
    ASSERT_EQ(tracks.size(), 1U);
    ASSERT_EQ(tracks[0].samples.size(), stamps.size());
    for (std::uint32_t i = 0; i < stamps.size(); ++i) {
        const auto& sample = tracks[0].samples[i];
        ASSERT_EQ(sample.decodeTime, static_cast<std::uint64_t>(stamps[i] - stamps[0]));
        ASSERT_EQ(sample.size, 30 + i % 90);
        ASSERT_EQ(sample.isSync, i % 11 == 0);
        const auto begin = sink.file().begin() + static_cast<std::ptrdiff_t>(sample.offset);
        ASSERT_EQ(test::Bytes(begin, begin + sample.size), payload(i, sample.size));
        ASSERT_GE(sample.offset, boxes[1].offset + boxes[1].headerSize);
        ASSERT_LE(sample.offset + sample.size, boxes[1].offset + boxes[1].size);
    }
    EXPECT_EQ(tracks[0].samples.back().duration, 123'456U);
    EXPECT_EQ(tracks[0].mediaDuration, static_cast<std::uint64_t>(end - stamps[0]));
    EXPECT_EQ(tracks[0].movieDuration, tracks[0].mediaDuration);
    EXPECT_EQ(movieDuration(boxes[2]), tracks[0].mediaDuration);
}

TEST_F(FinishedMovie, ExtendsTheLastPictureOfAStillWindow) {
    startWithPicture();
    ASSERT_EQ(writer.start(), MovieError::none);
    add(0);
    ASSERT_EQ(writer.flushFragment(), MovieError::none);
    ASSERT_EQ(writer.finish(600 * kSecond), MovieError::none);
    const auto boxes = parseBoxes(sink.file());
    EXPECT_EQ(tracksOf(boxes[2])[0].samples[0].duration, 600'000'000U);
    EXPECT_EQ(movieDuration(boxes[2]), 600'000'000U);
}

TEST_F(FinishedMovie, GivesALastPictureOneTickWhenItsEndIsNotLater) {
    startWithPicture();
    ASSERT_EQ(writer.start(), MovieError::none);
    add(5);
    add(100);
    ASSERT_EQ(writer.finish(50), MovieError::none);
    EXPECT_EQ(tracksOf(parseBoxes(sink.file())[2])[0].samples.back().duration, 1U);
}

TEST_F(FinishedMovie, GivesALastPictureWhatThirtyTwoBitsHoldAtMost) {
    startWithPicture();
    ASSERT_EQ(writer.start(), MovieError::none);
    add(0);
    add(100);
    ASSERT_EQ(writer.finish(INT64_MAX), MovieError::none);
    EXPECT_EQ(tracksOf(parseBoxes(sink.file())[2])[0].samples.back().duration, UINT32_MAX);
}

TEST_F(FinishedMovie, NeedsNoSyncTableWhenAllPicturesAreKeyFrames) {
    startWithPicture();
    ASSERT_EQ(writer.start(), MovieError::none);
    add(0);
    add(kSecond);
    ASSERT_EQ(writer.finish(2 * kSecond), MovieError::none);
    const auto boxes = parseBoxes(sink.file());
    EXPECT_EQ(boxes[2].at("trak/mdia/minf/stbl").childTypes(), "stsd stts stsc stsz stco");
}

TEST_F(FinishedMovie, HidesPrimingAndDelaysSoundThatBeganLater) {
    startWithPicture();
    sound = writer.addAudioTrack(test::audioDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    add(kSecond);
    for (std::int64_t frame = 72000 - 1024; frame < 96000; frame += 1024) {  // first real sound at 1.5 s
        addSound(frame);
    }
    ASSERT_EQ(writer.finish(2 * kSecond), MovieError::none);
    const auto tracks = tracksOf(parseBoxes(sink.file())[2]);
    ASSERT_EQ(tracks.size(), 2U);
    ASSERT_EQ(tracks[0].edits.size(), 1U);
    EXPECT_EQ(tracks[0].edits[0].mediaTime, 0);
    EXPECT_EQ(tracks[0].edits[0].duration, 1'000'000U);
    ASSERT_EQ(tracks[1].edits.size(), 2U);
    EXPECT_EQ(tracks[1].edits[0].mediaTime, -1);
    EXPECT_EQ(tracks[1].edits[0].duration, 500'000U);
    EXPECT_EQ(tracks[1].edits[1].mediaTime, 1024);
    const std::uint64_t frames = tracks[1].mediaDuration - 1024;
    EXPECT_EQ(frames, 24U * 1024);
    EXPECT_NEAR(static_cast<double>(tracks[1].edits[1].duration), static_cast<double>(frames) / 48000 * 1e6, 1);
    EXPECT_EQ(tracks[1].movieDuration, tracks[1].edits[0].duration + tracks[1].edits[1].duration);
}

TEST_F(FinishedMovie, HidesSoundFromBeforeTheFirstPicture) {
    startWithPicture();
    sound = writer.addAudioTrack(test::audioDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    for (std::int64_t frame = -1024; frame < 96000; frame += 1024) {
        addSound(frame);
    }
    add(kSecond / 4);
    ASSERT_EQ(writer.finish(2 * kSecond), MovieError::none);
    const auto tracks = tracksOf(parseBoxes(sink.file())[2]);
    ASSERT_EQ(tracks[1].edits.size(), 1U);
    EXPECT_EQ(tracks[1].edits[0].mediaTime, 1024 + 12000);
}

TEST_F(FinishedMovie, KeepsAGapInSoundAsALongerSample) {
    startWithPicture();
    sound = writer.addAudioTrack(test::audioDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    add(0);
    addSound(0);
    addSound(1024);
    addSound(10'000);
    ASSERT_EQ(writer.finish(kSecond), MovieError::none);
    const auto tracks = tracksOf(parseBoxes(sink.file())[2]);
    EXPECT_EQ(tracks[1].samples[1].duration, 10'000U - 1024);
    EXPECT_EQ(tracks[1].samples[2].duration, 1024U);
}

TEST_F(FinishedMovie, LeavesOutTracksThatNeverGotASample) {
    startWithPicture();
    ASSERT_TRUE(writer.addAudioTrack(test::audioDescription()).has_value());
    sound = writer.addAudioTrack(test::audioDescription("Microphone"));
    ASSERT_EQ(writer.start(), MovieError::none);
    add(0);
    addSound(-1024);
    addSound(0);
    ASSERT_EQ(writer.finish(kSecond), MovieError::none);
    const auto tracks = tracksOf(parseBoxes(sink.file())[2]);
    ASSERT_EQ(tracks.size(), 2U);
    EXPECT_EQ(tracks[0].id, 1U);
    EXPECT_EQ(tracks[1].id, 3U);
    EXPECT_EQ(tracks[1].name, "Microphone");
}

TEST_F(FinishedMovie, NamesTracksAndSaysWhatTheyAre) {
    startWithPicture();
    sound = writer.addAudioTrack(test::audioDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    add(0);
    addSound(-1024);
    addSound(0);
    ASSERT_EQ(writer.finish(kSecond), MovieError::none);
    const auto tracks = tracksOf(parseBoxes(sink.file())[2]);
    EXPECT_FALSE(parseBoxes(sink.file())[2].all("trak")[1]->has("mdia/minf/stbl/stss")) << "all sound is sync";
    EXPECT_EQ(tracks[0].handler, "vide");
    EXPECT_EQ(tracks[0].name, "Screen");
    EXPECT_EQ(tracks[0].width, 1920U << 16U);
    EXPECT_EQ(tracks[0].height, 1080U << 16U);
    EXPECT_EQ(tracks[0].timescale, 1'000'000U);
    EXPECT_EQ(tracks[1].handler, "soun");
    EXPECT_EQ(tracks[1].name, "Application audio");
    EXPECT_EQ(tracks[1].width, 0U);
    EXPECT_EQ(tracks[1].timescale, 48000U);
}

TEST_F(FinishedMovie, CarriesTheTransformAsAFixedPointMatrix) {
    auto description = test::videoDescription();
    description.transform = {0, 1, -1, 0, 1080, -2.5};
    startWithPicture(description);
    ASSERT_EQ(writer.start(), MovieError::none);
    add(0);
    ASSERT_EQ(writer.finish(kSecond), MovieError::none);
    const std::vector<std::int32_t> expected{0, 0x10000, 0, -0x10000, 0, 0, 1080 * 0x10000, -0x28000, 0x40000000};
    EXPECT_EQ(tracksOf(parseBoxes(sink.file())[2])[0].matrix, expected);
}

TEST_F(FinishedMovie, ClampsATransformThatIsOutOfRange) {
    auto description = test::videoDescription();
    description.transform = {1e300, std::nan(""), 0, 1, -1e9, 0};
    startWithPicture(description);
    ASSERT_EQ(writer.start(), MovieError::none);
    add(0);
    ASSERT_EQ(writer.finish(kSecond), MovieError::none);
    const auto matrix = tracksOf(parseBoxes(sink.file())[2])[0].matrix;
    EXPECT_EQ(matrix[0], INT32_MAX);
    EXPECT_EQ(matrix[1], 0);
    EXPECT_EQ(matrix[6], INT32_MIN);
}

TEST_F(FinishedMovie, DescribesThePictureByteForByte) {
    auto description = test::videoDescription();
    description.pixelAspectRatio = PixelAspectRatio{4, 3};
    startWithPicture(description);
    ASSERT_EQ(writer.start(), MovieError::none);
    add(0);
    ASSERT_EQ(writer.finish(kSecond), MovieError::none);
    const auto boxes = parseBoxes(sink.file());
    const auto entry = boxes[2].at("trak/mdia/minf/stbl/stsd").payload;
    test::Bytes expected{0, 0, 0, 0, 0, 0, 0, 1};  // version, flags, one entry
    const test::Bytes avc1{0,    0,    0, 174,  'a', 'v', 'c', '1',  0, 0, 0, 0, 0, 0, 0, 1,    0,
                           0,    0,    0, 0,    0,   0,   0,   0,    0, 0, 0, 0, 0, 0, 0, 0x07, 0x80,
                           0x04, 0x38, 0, 0x48, 0,   0,   0,   0x48, 0, 0, 0, 0, 0, 0, 0, 1};
    expected.insert(expected.end(), avc1.begin(), avc1.end());
    expected.insert(expected.end(), 32, 0);  // compressor name
    const test::Bytes middle{0, 0x18, 0xFF, 0xFF, 0, 0, 0, 53, 'a', 'v', 'c', 'C', 1, 0x64, 0, 0x28, 0xFF, 0xE1, 0, 24};
    expected.insert(expected.end(), middle.begin(), middle.end());
    const auto sps = test::sequenceParameterSet();
    expected.insert(expected.end(), sps.begin(), sps.end());
    const test::Bytes beforePicture{1, 0, 6};
    expected.insert(expected.end(), beforePicture.begin(), beforePicture.end());
    const auto pps = test::pictureParameterSet();
    expected.insert(expected.end(), pps.begin(), pps.end());
    const test::Bytes rest{0xFD, 0xF8, 0xF8, 0, 0, 0, 0,  19,  'c', 'o', 'l', 'r', 'n', 'c', 'l', 'x', 0, 6, 0, 6,
                           0,    6,    0,    0, 0, 0, 16, 'p', 'a', 's', 'p', 0,   0,   0,   4,   0,   0, 0, 3};
    expected.insert(expected.end(), rest.begin(), rest.end());
    EXPECT_EQ(test::Bytes(entry.begin(), entry.end()), expected);
    EXPECT_EQ(tracksOf(boxes[2])[0].width, 2560U << 16U) << "the width is that of square pixels";
}

TEST_F(FinishedMovie, DescribesTheSoundByteForByte) {
    startWithPicture();
    sound = writer.addAudioTrack(test::audioDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    add(0);
    addSound(-1024);
    addSound(0);
    ASSERT_EQ(writer.finish(kSecond), MovieError::none);
    const auto boxes = parseBoxes(sink.file());
    const auto entry = boxes[2].all("trak")[1]->at("mdia/minf/stbl/stsd").payload;
    const test::Bytes expected{
        0,    0,    0,    0,    0,   0,   0,   1,                                   // version, flags, one entry
        0,    0,    0,    75,   'm', 'p', '4', 'a', 0, 0, 0, 0,  0,    0,    0, 1,  // data reference 1
        0,    0,    0,    0,    0,   0,   0,   0,   0, 2, 0, 16, 0,    0,    0, 0,  // two channels, 16 bits
        0xBB, 0x80, 0,    0,                                                        // 48000
        0,    0,    0,    39,   'e', 's', 'd', 's', 0, 0, 0, 0,                     //
        3,    25,   0,    0,    0,                                                  // elementary stream
        4,    17,   0x40, 0x15, 0,   0,   0,   0,   0, 0, 0, 0,  0x01, 0xF4, 0,  // decoder: AAC, 128000 bits per second
        5,    2,    0x11, 0x90,                                                  // audio specific config
        6,    1,    2,                                                           // sync layer
    };
    EXPECT_EQ(test::Bytes(entry.begin(), entry.end()), expected);
}

TEST_F(FinishedMovie, TakesWideFieldsForLongTimes) {
    startWithPicture();
    sound = writer.addAudioTrack(test::audioDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    const std::int64_t twoHours = 7200 * kSecond;
    for (int i = 0; i < 8; ++i) {
        add(i * 1800 * kSecond);
    }
    addSound(twoHours / kSecond * 48000);
    addSound(twoHours / kSecond * 48000 + 1024);
    ASSERT_EQ(writer.finish(2 * twoHours), MovieError::none);
    const auto boxes = parseBoxes(sink.file());
    EXPECT_EQ(boxes[2].at("mvhd").version(), 1);
    EXPECT_EQ(boxes[2].at("trak/tkhd").version(), 1);
    EXPECT_EQ(boxes[2].at("trak/edts/elst").version(), 1);
    EXPECT_EQ(boxes[2].at("trak/mdia/mdhd").version(), 1);
    const auto tracks = tracksOf(boxes[2]);
    EXPECT_EQ(tracks[0].mediaDuration, 14'400'000'000U);
    EXPECT_EQ(movieDuration(boxes[2]), 14'400'000'000U);
    EXPECT_EQ(tracks[0].edits[0].duration, 14'400'000'000U);
    ASSERT_EQ(tracks[1].edits.size(), 2U);
    EXPECT_EQ(tracks[1].edits[0].mediaTime, -1) << "an empty edit, whatever the width";
    EXPECT_EQ(tracks[1].edits[0].duration, 7'200'000'000U + 21333);
}

TEST_F(FinishedMovie, LeavesOutWhatIsLaterThanItsGivenEndAndCutsWhatLastsLonger) {
    startWithPicture();
    sound = writer.addAudioTrack(test::audioDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    for (std::uint32_t i = 0; i < 90; ++i) {
        add(i * kSecond / 30, i % 30 == 0, i);
    }
    for (std::int64_t frame = -1024; frame < 3 * 48000; frame += 1024) {
        addSound(frame);
    }
    ASSERT_EQ(writer.finish(3 * kSecond, 1'510'000'000), MovieError::none);  // 1.51 s, in nanoseconds
    const auto boxes = parseBoxes(sink.file());
    const auto tracks = tracksOf(boxes.at(2));
    ASSERT_EQ(tracks.size(), 2U);
    ASSERT_EQ(tracks[0].samples.size(), 46U) << "the pictures up to 1.5 s";
    EXPECT_EQ(tracks[0].samples.back().duration, 10'000U);
    EXPECT_EQ(tracks[0].mediaDuration, 1'510'000U);
    for (std::uint32_t i = 0; i < 46; ++i) {
        const auto begin = sink.file().begin() + static_cast<std::ptrdiff_t>(tracks[0].samples[i].offset);
        EXPECT_EQ(test::Bytes(begin, begin + 40), payload(i, 40));
    }
    EXPECT_EQ(tracks[1].mediaDuration, 1024U + 72'480);
    EXPECT_EQ(tracks[1].movieDuration, 1'510'000U);
    EXPECT_EQ(movieDuration(boxes[2]), 1'510'000U);
}

TEST_F(FinishedMovie, KeepsItsFirstPictureWhateverItsGivenEnd) {
    startWithPicture();
    sound = writer.addAudioTrack(test::audioDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    add(kSecond);
    add(2 * kSecond, false);
    addSound(48000 - 1024);
    addSound(48000);
    ASSERT_EQ(writer.finish(3 * kSecond, 0), MovieError::none);
    const auto tracks = tracksOf(parseBoxes(sink.file()).at(2));
    ASSERT_EQ(tracks.size(), 1U) << "sound has nothing to present";
    ASSERT_EQ(tracks[0].samples.size(), 1U);
    EXPECT_EQ(tracks[0].samples[0].duration, 1U);
}

TEST_F(FinishedMovie, KeepsAPictureAtItsGivenEndForOneTick) {
    startWithPicture();
    ASSERT_EQ(writer.start(), MovieError::none);
    add(0);
    add(kSecond);
    add(2 * kSecond);
    ASSERT_EQ(writer.finish(3 * kSecond, 1'000'000'000), MovieError::none);
    const auto tracks = tracksOf(parseBoxes(sink.file()).at(2));
    ASSERT_EQ(tracks[0].samples.size(), 2U);
    EXPECT_EQ(tracks[0].samples[1].duration, 1U);
}

TEST_F(FinishedMovie, OfSoundAloneBeginsWithTheFirstRealSound) {
    sound = writer.addAudioTrack(test::audioDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    addSound(48000);
    addSound(49024);
    ASSERT_EQ(writer.finish(0), MovieError::none);
    const auto tracks = tracksOf(parseBoxes(sink.file())[2]);
    ASSERT_EQ(tracks[0].edits.size(), 1U);
    EXPECT_EQ(tracks[0].edits[0].mediaTime, 1024);
}

}  // namespace
}  // namespace lumacast::mp4
