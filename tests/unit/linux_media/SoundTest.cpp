// What a player hears of the sound that was appended.

#include <gtest/gtest.h>


#include "tests/unit/linux_media/RecordedMovie.h"
#include "tests/unit/linux_media/Tones.h"

namespace lumacast::testing {
namespace {

constexpr std::int64_t kSecond = 1'000'000'000;

class SoundFormats : public ::testing::TestWithParam<AudioFormat> {};

TEST_P(SoundFormats, AreHeardInPlaceAndAsLoudAsTheyWere) {
    RecordedMovie movie;
    movie.start();
    ASSERT_TRUE(movie.appendGrey(100, 0));
    appendTone(*movie.sound, GetParam(), 0, 0, static_cast<std::int64_t>(GetParam().sampleRate * 2));
    movie.clock.advance(std::chrono::seconds(2));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);

    checkers::MovieReader reader(movie.path());
    ASSERT_EQ(reader.audioTracks().size(), 1u) << "the microphone's track got nothing and is not there";
    EXPECT_EQ(reader.audioTracks()[0].codec, "aac");
    EXPECT_EQ(reader.audioTracks()[0].sampleRate, 44100);
    EXPECT_EQ(reader.audioTracks()[0].channels, 2);
    EXPECT_NEAR(static_cast<double>(reader.duration().count()), 2e9, 1e6);
    const auto sound = reader.readSound();
    ASSERT_TRUE(sound);
    EXPECT_NEAR(loudness(*sound, 0.1, 1.9), kToneLoudness, 0.01);
    EXPECT_NEAR(loudness(*sound, 0.0, 0.05), kToneLoudness, 0.03) << "priming is not heard";
    EXPECT_NEAR(phaseDelay(*sound, 0.1, 1.9), 0, 0.1);
}
INSTANTIATE_TEST_SUITE_P(
    Port, SoundFormats,
    ::testing::Values(tapFormat(), formatOf(44100, 16, 2, AudioFormat::kFlagSignedInteger),
                      formatOf(48000, 32, 2, AudioFormat::kFlagFloat),
                      formatOf(48000, 32, 1, AudioFormat::kFlagFloat | AudioFormat::kFlagBigEndian),
                      formatOf(44100, 64, 1, AudioFormat::kFlagFloat),
                      formatOf(16000, 24, 1, AudioFormat::kFlagSignedInteger | AudioFormat::kFlagBigEndian),
                      formatOf(48000, 32, 6, AudioFormat::kFlagSignedInteger), formatOf(44100, 8, 1, 0)));

TEST(Sound, OfBothTracksIsKeptApart) {
    RecordedMovie movie;
    movie.start();
    ASSERT_TRUE(movie.appendGrey(100, 0));
    appendTone(*movie.sound, tapFormat(), 0, 0, 44100, 441);
    appendTone(*movie.microphone, tapFormat(), 0, 0, 44100, 882);
    movie.clock.advance(std::chrono::seconds(1));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    checkers::MovieReader reader(movie.path());
    ASSERT_EQ(reader.audioTracks().size(), 2u);
    for (const std::size_t track : {0u, 1u}) {
        const auto sound = reader.readSound(track);
        ASSERT_TRUE(sound);
        EXPECT_NEAR(phaseDelay(*sound, 0.1, 0.9, track == 0 ? 441 : 882), 0, 0.1);
    }
}

TEST(Sound, ThatBeginsLaterIsHeardLater) {
    RecordedMovie movie;
    const std::int64_t zero = 3 * kSecond;
    movie.start(zero);
    ASSERT_TRUE(movie.appendGrey(100, zero));
    appendTone(*movie.sound, tapFormat(), zero, 44100, 44100);
    movie.clock.advance(std::chrono::seconds(5));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    const auto sound = checkers::MovieReader(movie.path()).readSound();
    ASSERT_TRUE(sound);
    EXPECT_LT(loudness(*sound, 0.0, 0.97), 0.001);
    EXPECT_NEAR(loudness(*sound, 1.02, 1.98), kToneLoudness, 0.01);
    EXPECT_NEAR(phaseDelay(*sound, 1.1, 1.9), 0, 0.1);
}

TEST(Sound, FromBeforeTheSessionIsCutOff) {
    RecordedMovie movie;
    const std::int64_t zero = 10 * kSecond;
    movie.start(zero);
    ASSERT_TRUE(movie.appendGrey(100, zero));
    appendTone(*movie.sound, tapFormat(), zero, -22050 - 100, 44100);  // the cut is inside a buffer
    movie.writer->endSession(atNanoseconds(zero + kSecond));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    const auto sound = checkers::MovieReader(movie.path()).readSound();
    ASSERT_TRUE(sound);
    EXPECT_NEAR(phaseDelay(*sound, 0.05, 0.4), 0, 0.1);
    EXPECT_NEAR(loudness(*sound, 0.0, 0.45), kToneLoudness, 0.01);
}

TEST(Sound, AfterTheEndOfTheSessionIsNotInTheMovie) {
    RecordedMovie movie;
    movie.start();
    ASSERT_TRUE(movie.appendGrey(100, 0));
    appendTone(*movie.sound, tapFormat(), 0, 0, 3 * 44100);
    movie.writer->endSession(atNanoseconds(kSecond));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    checkers::MovieReader reader(movie.path());
    EXPECT_NEAR(static_cast<double>(reader.duration().count()), 1e9, 1e5);
    const auto sound = reader.readSound();
    ASSERT_TRUE(sound);
    EXPECT_NEAR(static_cast<double>(sound->samples.size()), 44100, 1024);
}

TEST(Sound, HolesAreSilentAndMoveNothing) {
    RecordedMovie movie;
    movie.start();
    ASSERT_TRUE(movie.appendGrey(100, 0));
    appendTone(*movie.sound, tapFormat(), 0, 0, 44100);
    appendTone(*movie.sound, tapFormat(), 0, 3 * 44100, 44100);
    movie.clock.advance(std::chrono::seconds(4));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    const auto sound = checkers::MovieReader(movie.path()).readSound();
    ASSERT_TRUE(sound);
    EXPECT_NEAR(phaseDelay(*sound, 0.1, 0.9), 0, 0.1);
    EXPECT_LT(loudness(*sound, 1.05, 2.95), 0.001);
    EXPECT_NEAR(phaseDelay(*sound, 3.1, 3.9), 0, 0.1);
}

TEST(Sound, ThatOverlapsIsHeardOnce) {
    RecordedMovie movie;
    movie.start();
    ASSERT_TRUE(movie.appendGrey(100, 0));
    appendTone(*movie.sound, tapFormat(), 0, 0, 44100, 441, 100);
    appendTone(*movie.sound, tapFormat(), 0, 41000, 44100, 441, 100);  // 70 ms of its first buffer are there already
    movie.clock.advance(std::chrono::seconds(2));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    const auto sound = checkers::MovieReader(movie.path()).readSound();
    ASSERT_TRUE(sound);
    EXPECT_NEAR(phaseDelay(*sound, 1.1, 1.8), 0, 0.1);
}

TEST(Sound, OfAClockThatDriftsStaysWithTheStamps) {
    // A device that plays 0.1 % too slowly: 44056 frames come in each second of the stamps' clock.
    RecordedMovie movie;
    movie.start();
    ASSERT_TRUE(movie.appendGrey(100, 0));
    const AudioFormat format = tapFormat();
    const double seconds = 40;
    const std::int64_t block = 882;
    std::int64_t frame = 0;
    for (double at = 0; at < seconds; at += 0.02 * 1.001, frame += block) {
        ASSERT_TRUE(eventually([&] { return movie.sound->isReadyForMoreMediaData(); }));
        Data data = tone(format, 441, frame, block);
        ASSERT_TRUE(
            movie.sound->append(soundBuffer(format, std::move(data), block, static_cast<std::int64_t>(at * 1e9))));
    }
    movie.clock.advance(std::chrono::seconds(40));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    checkers::MovieReader reader(movie.path());
    ASSERT_EQ(reader.audioTracks().size(), 1u);
    // Without correction 40 ms would be missing, or stand as two holes.
    EXPECT_NEAR(static_cast<double>(reader.audioTracks()[0].duration.count()) / 1e6, seconds * 1000, 25);
    const auto sound = reader.readSound();
    ASSERT_TRUE(sound);
    double quietest = 1;
    for (double at = 0.1; at < seconds - 0.2; at += 0.02)
        quietest = std::min(quietest, loudness(*sound, at, at + 0.02));
    EXPECT_GT(quietest, 0.9 * kToneLoudness) << "no hole was cut into it";
}

TEST(Sound, OfAnUnreadableFormatIsLeftOut) {
    RecordedMovie movie;
    movie.start();
    ASSERT_TRUE(movie.appendGrey(100, 0));
    AudioFormat odd = tapFormat();
    odd.bitsPerChannel = 12;
    ASSERT_TRUE(movie.sound->append(soundBuffer(odd, Data(2000), 1000, 0)));
    AudioFormat none = tapFormat();
    none.bytesPerFrame = 0;
    ASSERT_TRUE(movie.microphone->append(soundBuffer(none, Data(2000), 1000, 0)));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    EXPECT_TRUE(checkers::MovieReader(movie.path()).audioTracks().empty());
}

TEST(Sound, ClaimingMoreFramesThanItHasIsReadAsFarAsItGoes) {
    RecordedMovie movie;
    movie.start();
    ASSERT_TRUE(movie.appendGrey(100, 0));
    ASSERT_TRUE(movie.sound->append(soundBuffer(tapFormat(), tone(tapFormat(), 441, 0, 4410), 44100, 0)));
    movie.clock.advance(std::chrono::seconds(2));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    checkers::MovieReader reader(movie.path());
    ASSERT_EQ(reader.audioTracks().size(), 1u);
    EXPECT_NEAR(static_cast<double>(reader.audioTracks()[0].duration.count()) / 1e6, 100, 1);
}

}  // namespace
}  // namespace lumacast::testing
