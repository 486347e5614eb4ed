#include <gtest/gtest.h>

#include "tests/unit/linux_mp4/BoxParser.h"
#include "tests/unit/linux_mp4/Descriptions.h"
#include "tests/unit/linux_mp4/Times.h"

namespace lumacast::mp4 {
namespace {

using test::MemorySink;
using test::parseBoxes;
using test::ParsedBox;
using test::parseFragment;
using test::payload;

std::vector<const ParsedBox*> fragmentsOf(const std::vector<ParsedBox>& boxes) {
    std::vector<const ParsedBox*> found;
    for (const ParsedBox& box : boxes) {
        if (box.type == "moof") {
            found.push_back(&box);
        }
    }
    return found;
}

class Fragments : public ::testing::Test {
protected:
    MemorySink sink;

    static MovieError picture(MovieBoxWriter& writer, TrackId track, std::int64_t pts, bool isSync,
                              std::uint32_t number = 0, std::size_t size = 100) {
        return writer.addSample(track, {pts, 0, isSync}, payload(number, size));
    }
};

TEST_F(Fragments, NothingButTheFileTypeAndTheReserveIsWrittenAtTheStart) {
    MovieBoxWriter writer(sink);
    ASSERT_TRUE(writer.addVideoTrack(test::videoDescription()).has_value());
    ASSERT_EQ(writer.start(), MovieError::none);
    const test::Bytes expected{0,   0,   0,   32,  'f', 't', 'y', 'p', 'm', 'p', '4', '2', 0,   0,   0,   0,
                               'm', 'p', '4', '2', 'i', 's', 'o', 'm', 'i', 's', 'o', '5', 'a', 'v', 'c', '1',
                               0,   0,   0,   16,  'f', 'r', 'e', 'e', 0,   0,   0,   0,   0,   0,   0,   0};
    EXPECT_EQ(sink.file(), expected);
    EXPECT_EQ(writer.bytesWritten(), expected.size());
}

TEST_F(Fragments, TheFirstBringsTheMovieBoxWithEveryTrackDeclaredAndNoSamples) {
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    ASSERT_TRUE(writer.addAudioTrack(test::audioDescription()).has_value());
    ASSERT_TRUE(writer.addAudioTrack(test::audioDescription("Microphone")).has_value());
    ASSERT_EQ(writer.start(), MovieError::none);
    ASSERT_EQ(picture(writer, *video, 0, true), MovieError::none);
    ASSERT_EQ(writer.flushFragment(), MovieError::none);
    const auto boxes = parseBoxes(sink.file());
    ASSERT_EQ(test::typesOf(boxes), "ftyp free moov moof mdat");
    const ParsedBox& movie = boxes[2];
    EXPECT_EQ(movie.childTypes(), "mvhd trak trak trak mvex uuid");
    EXPECT_EQ(movie.at("mvex").childTypes(), "trex trex trex");
    for (const ParsedBox* trak : movie.all("trak")) {
        const auto track = test::parseTrack(*trak);
        EXPECT_TRUE(track.samples.empty());
        EXPECT_EQ(track.mediaDuration, 0U);
    }
    // A track without priming needs no edit; sound hides its priming, however long it will be.
    EXPECT_FALSE(movie.all("trak")[0]->has("edts"));
    const auto sound = test::parseTrack(*movie.all("trak")[1]);
    ASSERT_EQ(sound.edits.size(), 1U);
    EXPECT_EQ(sound.edits[0].duration, 0U);
    EXPECT_EQ(sound.edits[0].mediaTime, 1024);
}

TEST_F(Fragments, CloseWithEachSecondOfPicturesAndBeginWithKeyFrames) {
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    for (int i = 0; i < 181; ++i) {
        ASSERT_EQ(picture(writer, *video, i * kSecond / 60, i % 60 == 0), MovieError::none);
    }
    const auto boxes = parseBoxes(sink.file());
    ASSERT_EQ(test::typesOf(boxes), "ftyp free moov moof mdat moof mdat moof mdat");
    std::uint32_t number = 0;
    for (const ParsedBox* moof : fragmentsOf(boxes)) {
        test::Fields header(moof->at("mfhd").payload);
        header.skip(4);
        EXPECT_EQ(header.u32(), ++number);
        const auto runs = parseFragment(*moof);
        ASSERT_EQ(runs.size(), 1U);
        EXPECT_EQ(runs[0].samples.size(), 60U);
        EXPECT_TRUE(runs[0].samples[0].isSync);
        EXPECT_FALSE(runs[0].samples[1].isSync);
        EXPECT_EQ(runs[0].decodeTime, (number - 1) * static_cast<std::uint64_t>(kSecond));
        EXPECT_EQ(runs[0].samples.back().decodeTime + runs[0].samples.back().duration, number * 1'000'000U);
    }
}

TEST_F(Fragments, CloseAtAKeyFrameFromHalfASecondOn) {
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    for (int i = 0; i < 100; ++i) {
        ASSERT_EQ(picture(writer, *video, i * kSecond / 100, i == 0 || i == 49 || i == 70), MovieError::none);
    }
    const auto boxes = parseBoxes(sink.file());
    const auto fragments = fragmentsOf(boxes);
    ASSERT_EQ(fragments.size(), 1U);
    EXPECT_EQ(parseFragment(*fragments[0])[0].samples.size(), 70U);
}

TEST_F(Fragments, CloseAfterASecondWithoutAKeyFrame) {
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    for (int i = 0; i < 151; ++i) {
        ASSERT_EQ(picture(writer, *video, i * kSecond / 50, i == 0), MovieError::none);
    }
    const auto boxes = parseBoxes(sink.file());
    ASSERT_EQ(fragmentsOf(boxes).size(), 3U);
    for (const ParsedBox* moof : fragmentsOf(boxes)) {
        const auto run = parseFragment(*moof)[0];
        EXPECT_EQ(run.samples.size(), 50U);
        EXPECT_EQ(run.samples.back().duration, 20'000U);
    }
}

TEST_F(Fragments, HoldTheBytesOfEachSampleWhereTheyAreSaidToBe) {
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    const auto sound = writer.addAudioTrack(test::audioDescription());
    const auto voice = writer.addAudioTrack(test::audioDescription("Microphone"));
    ASSERT_EQ(writer.start(), MovieError::none);
    std::map<std::uint32_t, std::vector<std::uint32_t>> numbers;  // track to the payload numbers in order
    std::uint32_t number = 0;
    std::int64_t frames = 0;
    for (int i = 0; i < 90; ++i) {
        numbers[1].push_back(number);
        ASSERT_EQ(picture(writer, *video, i * kSecond / 30, i % 30 == 0, number, 50 + number % 31), MovieError::none);
        ++number;
        for (; frames * 30 < i * 48000; frames += 1024) {
            for (const TrackId track : {*sound, *voice}) {
                numbers[static_cast<std::uint32_t>(track)].push_back(number);
                ASSERT_EQ(writer.addSample(track, {frames, 1024}, payload(number, 20 + number % 17)), MovieError::none);
                ++number;
            }
        }
    }
    ASSERT_EQ(writer.flushFragment(), MovieError::none);
    const auto boxes = parseBoxes(sink.file());
    std::map<std::uint32_t, std::size_t> seen;
    std::size_t checked = 0;
    for (std::size_t b = 0; b < boxes.size(); ++b) {
        if (boxes[b].type != "moof") {
            continue;
        }
        ASSERT_EQ(boxes[b + 1].type, "mdat");
        std::uint64_t expected = boxes[b + 1].offset + 8;
        for (const auto& run : parseFragment(boxes[b])) {
            for (const auto& sample : run.samples) {
                ASSERT_EQ(sample.offset, expected);
                expected += sample.size;
                const auto begin = sink.file().begin() + static_cast<std::ptrdiff_t>(sample.offset);
                const std::uint32_t which = numbers[run.trackId].at(seen[run.trackId]++);
                ASSERT_EQ(test::Bytes(begin, begin + sample.size), payload(which, sample.size));
                ++checked;
            }
        }
        EXPECT_EQ(expected, boxes[b + 1].offset + boxes[b + 1].size) << "bytes nobody claims";
    }
    EXPECT_EQ(checked, number);
}

TEST_F(Fragments, AreAtMostASecondLongWhateverTheRates) {
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    const auto sound = writer.addAudioTrack(test::audioDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    std::uint32_t state = 5;
    std::int64_t pts = 0;
    std::int64_t frames = -1024;
    for (int i = 0; i < 400; ++i) {
        ASSERT_EQ(picture(writer, *video, pts, i == 0 || i % 7 == 0), MovieError::none);
        for (; frames * 1000 < pts * 48; frames += 1024) {
            ASSERT_EQ(writer.addSample(*sound, {frames, 1024}, payload(1, 10)), MovieError::none);
        }
        state = state * 1664525U + 1013904223U;
        pts += 1 + state % 1'000'000U;
    }
    ASSERT_EQ(writer.flushFragment(), MovieError::none);
    const auto boxes = parseBoxes(sink.file());
    std::map<std::uint32_t, std::uint64_t> end;
    std::size_t count = 0;
    for (const ParsedBox* moof : fragmentsOf(boxes)) {
        for (const auto& run : parseFragment(*moof)) {
            const auto& last = run.samples.back();
            const std::uint64_t limit = run.trackId == 1 ? 1'000'000 : 48000;
            EXPECT_LE(last.decodeTime + last.duration - run.decodeTime, limit);
            EXPECT_GE(run.decodeTime, end[run.trackId]) << "fragments overlap";
            end[run.trackId] = last.decodeTime + last.duration;
            ++count;
        }
    }
    EXPECT_GT(count, 300U);
}

TEST_F(Fragments, OfAStillWindowAreNotClosedByTheSoundThatCameLate) {
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    const auto sound = writer.addAudioTrack(test::audioDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    std::int64_t frames = 0;
    for (int i = 0; i < 10; ++i) {  // each picture with the 0.9 s of sound that lie before it
        for (; frames * 10 < (i - 1) * 9 * 48000; frames += 1024) {
            ASSERT_EQ(writer.addSample(*sound, {frames, 1024}, payload(1, 10)), MovieError::none);
        }
        ASSERT_EQ(picture(writer, *video, i * 9 * kSecond / 10, true), MovieError::none);
        EXPECT_EQ(writer.fragmentCount(), static_cast<std::uint32_t>(i));
        ASSERT_EQ(writer.flushFragment(), MovieError::none);
    }
}

TEST_F(Fragments, GiveAPictureOneTickWhenFlushedAndItsTrueTimeWithTheNext) {
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    const std::vector<std::int64_t> stamps{0, 990'001, 2'000'003};
    for (const std::int64_t pts : stamps) {
        ASSERT_EQ(picture(writer, *video, pts, true), MovieError::none);
        ASSERT_EQ(writer.flushFragment(), MovieError::none);
        ASSERT_EQ(writer.flushFragment(), MovieError::none);  // nothing is pending: nothing is written
    }
    const auto boxes = parseBoxes(sink.file());
    const auto fragments = fragmentsOf(boxes);
    ASSERT_EQ(fragments.size(), 3U);
    for (std::size_t i = 0; i < 3; ++i) {
        const auto runs = parseFragment(*fragments[i]);
        EXPECT_EQ(runs[0].decodeTime, static_cast<std::uint64_t>(stamps[i]));
        ASSERT_EQ(runs[0].samples.size(), 1U);
        EXPECT_EQ(runs[0].samples[0].duration, 1U);
    }
}

TEST_F(Fragments, OfAStillWindowAreWrittenWithEachPictureWithoutAFlush) {
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    for (std::int64_t second = 0; second < 5; ++second) {
        ASSERT_EQ(picture(writer, *video, second * kSecond, true), MovieError::none);
        EXPECT_EQ(writer.fragmentCount(), second) << "all pictures but the newest are in the file";
    }
}

TEST_F(Fragments, StateTheTrueDurationOfALastPictureOnlyUpToTheLimit) {
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    for (const std::int64_t pts : {std::int64_t{0}, std::int64_t{900'000}, std::int64_t{1'500'000}}) {
        ASSERT_EQ(picture(writer, *video, pts, pts != 900'000), MovieError::none);
    }
    const auto boxes = parseBoxes(sink.file());
    const auto fragments = fragmentsOf(boxes);
    ASSERT_EQ(fragments.size(), 1U);
    const auto runs = parseFragment(*fragments[0]);
    ASSERT_EQ(runs[0].samples.size(), 2U);
    EXPECT_EQ(runs[0].samples[0].duration, 900'000U);
    EXPECT_EQ(runs[0].samples[1].duration, 100'000U);
}

TEST_F(Fragments, CloseEarlyWhenTheyGrowTooLarge) {
    MovieOptions options;
    options.fragmentBytes = 1000;
    MovieBoxWriter writer(sink, options);
    const auto video = writer.addVideoTrack(test::videoDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    for (int i = 0; i < 10; ++i) {
        ASSERT_EQ(picture(writer, *video, i * kSecond / 60, i == 0, 0, 400), MovieError::none);
    }
    const auto boxes = parseBoxes(sink.file());
    ASSERT_EQ(fragmentsOf(boxes).size(), 4U);
    for (const ParsedBox* moof : fragmentsOf(boxes)) {
        EXPECT_EQ(parseFragment(*moof)[0].samples.size(), 2U);
    }
}

TEST_F(Fragments, AreSyncedBeforeTheyAreShown) {
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    for (int i = 0; i < 7; ++i) {
        ASSERT_EQ(picture(writer, *video, i * kSecond, true), MovieError::none);
    }
    using Kind = MemorySink::Kind;
    std::vector<Kind> expected{Kind::append};
    for (int i = 0; i < 6; ++i) {
        for (const Kind kind : {Kind::append, Kind::append, Kind::sync, Kind::overwrite}) {
            expected.push_back(kind);
        }
    }
    std::vector<Kind> kinds;
    for (const auto& operation : sink.operations()) {
        kinds.push_back(operation.kind);
    }
    EXPECT_EQ(kinds, expected);
}

TEST_F(Fragments, WaitForTheFirstPictureAndHideSoundFromBeforeIt) {
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    const auto sound = writer.addAudioTrack(test::audioDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    for (std::int64_t pts = -1024; pts < 96000; pts += 1024) {
        ASSERT_EQ(writer.addSample(*sound, {pts, 1024}, payload(1, 10)), MovieError::none);
    }
    ASSERT_EQ(writer.flushFragment(), MovieError::none);
    EXPECT_EQ(writer.fragmentCount(), 0U);
    ASSERT_EQ(picture(writer, *video, 2 * kSecond, true), MovieError::none);
    ASSERT_EQ(writer.flushFragment(), MovieError::none);
    const auto boxes = parseBoxes(sink.file());
    ASSERT_EQ(test::typesOf(boxes), "ftyp free moov moof mdat");
    const auto runs = parseFragment(boxes[3]);
    ASSERT_EQ(runs.size(), 2U);
    EXPECT_EQ(runs[0].decodeTime, 0U);
    EXPECT_EQ(runs[1].decodeTime, 0U);
    EXPECT_EQ(runs[1].samples.back().duration, 1024U) << "what was stated, in a fragment longer than a second too";
    const auto track = test::parseTrack(*boxes[2].all("trak")[1]);
    ASSERT_EQ(track.edits.size(), 1U);
    EXPECT_EQ(track.edits[0].mediaTime, 1024 + 96000);  // priming and the two seconds before the picture
}

TEST_F(Fragments, PlaceSoundThatBeginsLaterByItsDecodingTime) {
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    const auto sound = writer.addAudioTrack(test::audioDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    const std::int64_t start = 500 * kSecond;  // the common zero is long ago
    for (int i = 0; i < 4; ++i) {
        ASSERT_EQ(picture(writer, *video, start + i * kSecond, true), MovieError::none);
    }
    const std::int64_t pts = 48000 * 503 - 1024;
    ASSERT_EQ(writer.addSample(*sound, {pts, 1024}, payload(1, 10)), MovieError::none);
    ASSERT_EQ(writer.flushFragment(), MovieError::none);
    const auto boxes = parseBoxes(sink.file());
    const auto runs = parseFragment(*fragmentsOf(boxes).back());
    ASSERT_EQ(runs.size(), 2U);
    EXPECT_EQ(runs[0].decodeTime, 3'000'000U);
    EXPECT_EQ(runs[1].decodeTime, 3U * 48000);  // its priming is hidden by the edit list of 1024
}

TEST_F(Fragments, RefuseSoundFromBeforeTheMovieOnceItHasBegun) {
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    const auto sound = writer.addAudioTrack(test::audioDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    ASSERT_EQ(picture(writer, *video, 0, true), MovieError::none);
    ASSERT_EQ(writer.flushFragment(), MovieError::none);
    EXPECT_EQ(writer.addSample(*sound, {-1025, 1024}, payload(1, 10)), MovieError::badTime);
    EXPECT_EQ(writer.addSample(*sound, {-1024, 1024}, payload(1, 10)), MovieError::none);
}

}  // namespace
}  // namespace lumacast::mp4
