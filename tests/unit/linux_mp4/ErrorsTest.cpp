#include <gtest/gtest.h>

#include "tests/unit/linux_mp4/BoxParser.h"
#include "tests/unit/linux_mp4/Descriptions.h"
#include "tests/unit/linux_mp4/Times.h"

namespace lumacast::mp4 {
namespace {

using test::MemorySink;
using test::payload;

// A short movie of every kind of operation; answers what the finish answered, or the first error before it.
MovieError writeShortMovie(MemorySink& sink) {
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    const auto sound = writer.addAudioTrack(test::audioDescription());
    if (const auto error = writer.start(); error != MovieError::none) {
        return error;
    }
    for (int i = 0; i < 4; ++i) {
        if (const auto error = writer.addSample(*video, {i * kSecond, 0, true}, payload(1, 50));
            error != MovieError::none) {
            return error;
        }
        if (const auto error = writer.addSample(*sound, {i * 48000, 1024}, payload(2, 20)); error != MovieError::none) {
            return error;
        }
    }
    return writer.finish(4 * kSecond);
}

TEST(MovieErrors, DescriptionsThatCantBeWrittenAreRefused) {
    MemorySink sink;
    MovieBoxWriter writer(sink);
    auto video = test::videoDescription();
    video.width = 0;
    EXPECT_FALSE(writer.addVideoTrack(video).has_value());
    video = test::videoDescription();
    video.timescale = 0;
    EXPECT_FALSE(writer.addVideoTrack(video).has_value());
    video.timescale = 1'000'000'001;
    EXPECT_FALSE(writer.addVideoTrack(video).has_value());
    video = test::videoDescription();
    video.sequenceParameterSets.clear();
    EXPECT_FALSE(writer.addVideoTrack(video).has_value());
    video.sequenceParameterSets = {test::pictureParameterSet()};
    EXPECT_FALSE(writer.addVideoTrack(video).has_value());
    video.sequenceParameterSets.assign(32, test::sequenceParameterSet());
    EXPECT_FALSE(writer.addVideoTrack(video).has_value());
    video = test::videoDescription();
    video.pictureParameterSets = {test::Bytes(70000, 1)};
    EXPECT_FALSE(writer.addVideoTrack(video).has_value());
    video = test::videoDescription();
    video.pixelAspectRatio = PixelAspectRatio{1, 0};
    EXPECT_FALSE(writer.addVideoTrack(video).has_value());
    auto sound = test::audioDescription();
    sound.channels = 0;
    EXPECT_FALSE(writer.addAudioTrack(sound).has_value());
    sound = test::audioDescription();
    sound.sampleRate = 0;
    EXPECT_FALSE(writer.addAudioTrack(sound).has_value());
    sound = test::audioDescription();
    sound.audioSpecificConfig.assign(65, 0);
    EXPECT_FALSE(writer.addAudioTrack(sound).has_value());
    EXPECT_EQ(writer.start(), MovieError::badDescription) << "a movie without a track";
    EXPECT_EQ(sink.attempts(), 0U);
}

TEST(MovieErrors, ASecondVideoTrackANinthTrackAndATrackAfterTheStartAreRefused) {
    MemorySink sink;
    MovieBoxWriter writer(sink);
    EXPECT_TRUE(writer.addVideoTrack(test::videoDescription()).has_value());
    EXPECT_FALSE(writer.addVideoTrack(test::videoDescription()).has_value());
    for (int i = 0; i < 7; ++i) {
        EXPECT_TRUE(writer.addAudioTrack(test::audioDescription()).has_value());
    }
    EXPECT_FALSE(writer.addAudioTrack(test::audioDescription()).has_value());
    MovieBoxWriter other(sink);
    ASSERT_TRUE(other.addVideoTrack(test::videoDescription()).has_value());
    ASSERT_EQ(other.start(), MovieError::none);
    EXPECT_FALSE(other.addAudioTrack(test::audioDescription()).has_value());
}

TEST(MovieErrors, CallsOutOfPlaceAreRefusedAndWriteNothing) {
    MemorySink sink;
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    EXPECT_EQ(writer.addSample(*video, {0, 0, true}, payload(0, 9)), MovieError::badState);
    EXPECT_EQ(writer.flushFragment(), MovieError::badState);
    EXPECT_EQ(writer.finish(0), MovieError::badState);
    EXPECT_EQ(sink.attempts(), 0U);
    ASSERT_EQ(writer.start(), MovieError::none);
    EXPECT_EQ(writer.start(), MovieError::badState);
    ASSERT_EQ(writer.addSample(*video, {0, 0, true}, payload(0, 9)), MovieError::none);
    ASSERT_EQ(writer.finish(kSecond), MovieError::none);
    const std::size_t attempts = sink.attempts();
    EXPECT_EQ(writer.addSample(*video, {kSecond, 0, true}, payload(0, 9)), MovieError::badState);
    EXPECT_EQ(writer.flushFragment(), MovieError::badState);
    EXPECT_EQ(writer.finish(kSecond), MovieError::badState);
    EXPECT_EQ(writer.start(), MovieError::badState);
    EXPECT_EQ(sink.attempts(), attempts);
}

TEST(MovieErrors, RefusedSamplesLeaveTheMovieAsItWas) {
    MemorySink plain;
    MemorySink tried;
    for (MemorySink* sink : {&plain, &tried}) {
        MovieBoxWriter writer(*sink);
        const auto video = writer.addVideoTrack(test::videoDescription());
        const auto sound = writer.addAudioTrack(test::audioDescription());
        ASSERT_EQ(writer.start(), MovieError::none);
        const bool tries = sink == &tried;
        if (tries) {
            EXPECT_EQ(writer.addSample(*video, {0, 0, false}, payload(0, 9)), MovieError::badSample);
            EXPECT_EQ(writer.addSample(TrackId{0}, {0, 0, true}, payload(0, 9)), MovieError::badTrack);
            EXPECT_EQ(writer.addSample(TrackId{3}, {0, 0, true}, payload(0, 9)), MovieError::badTrack);
            EXPECT_EQ(writer.addSample(*video, {INT64_MAX, 0, true}, payload(0, 9)), MovieError::badTime);
            EXPECT_EQ(writer.addSample(*video, {INT64_MIN, 0, true}, payload(0, 9)), MovieError::badTime);
        }
        ASSERT_EQ(writer.addSample(*video, {100, 0, true}, payload(1, 9)), MovieError::none);
        if (tries) {
            EXPECT_EQ(writer.addSample(*video, {100, 0, true}, payload(0, 9)), MovieError::badTime);
            EXPECT_EQ(writer.addSample(*video, {99, 0, true}, payload(0, 9)), MovieError::badTime);
            EXPECT_EQ(writer.addSample(*video, {101 + 0xFFFFFFFFLL, 0, true}, payload(0, 9)), MovieError::badTime);
            EXPECT_EQ(writer.addSample(*video, {200, 0, true}, {}), MovieError::badSample);
            EXPECT_EQ(writer.addSample(*sound, {0, 0}, payload(0, 9)), MovieError::badSample);
            const test::Bytes few = payload(0, 9);
            const std::span<const std::uint8_t> huge(few.data(), std::size_t{kMaxSampleBytes} + 1);
            EXPECT_EQ(writer.addSample(*video, {200, 0, true}, huge), MovieError::badSample);  // its bytes are not read
        }
        ASSERT_EQ(writer.addSample(*video, {50'000, 0, false}, payload(2, 9)), MovieError::none);
        ASSERT_EQ(writer.finish(kSecond), MovieError::none);
    }
    EXPECT_EQ(plain.file(), tried.file());
}

TEST(MovieErrors, FinishingWithoutASampleSaysSoAndWritesNothing) {
    MemorySink sink;
    MovieBoxWriter writer(sink);
    ASSERT_TRUE(writer.addVideoTrack(test::videoDescription()).has_value());
    ASSERT_EQ(writer.start(), MovieError::none);
    const std::size_t attempts = sink.attempts();
    EXPECT_EQ(writer.finish(kSecond), MovieError::empty);
    EXPECT_EQ(writer.finish(kSecond), MovieError::badState);
    EXPECT_EQ(sink.attempts(), attempts);
}

TEST(MovieErrors, PrimingAloneIsNoMovie) {
    MemorySink sink;
    MovieBoxWriter writer(sink);
    const auto sound = writer.addAudioTrack(test::audioDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    ASSERT_EQ(writer.addSample(*sound, {-1024, 1024}, payload(0, 9)), MovieError::none);
    EXPECT_EQ(writer.finish(0), MovieError::empty);
    EXPECT_EQ(test::typesOf(test::parseBoxes(sink.file())), "ftyp free moov moof mdat");
}

TEST(MovieErrors, ASinkThatFailsAtAnyOperationIsReportedAndNotAskedAgain) {
    MemorySink whole;
    ASSERT_EQ(writeShortMovie(whole), MovieError::none);
    const std::size_t operations = whole.operations().size();
    ASSERT_GT(operations, 15U);
    for (std::size_t failing = 0; failing < operations; ++failing) {
        MemorySink sink;
        sink.failFrom = failing;
        EXPECT_EQ(writeShortMovie(sink), MovieError::sinkFailed) << "operation " << failing;
        EXPECT_EQ(sink.attempts(), failing + 1) << "nothing is written after a failure";
    }
}

TEST(MovieErrors, AfterAFailureEveryCallAnswersItAndNothingIsWritten) {
    MemorySink sink;
    sink.failFrom = 1;
    MovieBoxWriter writer(sink);
    const auto video = writer.addVideoTrack(test::videoDescription());
    ASSERT_EQ(writer.start(), MovieError::none);
    ASSERT_EQ(writer.addSample(*video, {0, 0, true}, payload(0, 9)), MovieError::none);
    EXPECT_EQ(writer.addSample(*video, {kSecond, 0, true}, payload(0, 9)), MovieError::sinkFailed);
    sink.failFrom = SIZE_MAX;
    EXPECT_EQ(writer.addSample(*video, {2 * kSecond, 0, true}, payload(0, 9)), MovieError::sinkFailed);
    EXPECT_EQ(writer.flushFragment(), MovieError::sinkFailed);
    EXPECT_EQ(writer.finish(kSecond), MovieError::sinkFailed);
    EXPECT_EQ(writer.start(), MovieError::sinkFailed);
    EXPECT_EQ(sink.attempts(), 2U);
    EXPECT_EQ(nameOf(MovieError::sinkFailed), "sink failed");
}

}  // namespace
}  // namespace lumacast::mp4
