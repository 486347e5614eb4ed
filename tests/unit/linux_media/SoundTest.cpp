// What a player hears of the sound that was appended.

#include <gtest/gtest.h>

#include <fstream>
#include <iterator>

#include "tests/unit/linux_media/RecordedMovie.h"
#include "tests/unit/linux_media/Times.h"
#include "tests/unit/linux_media/Tones.h"

namespace lumacast::testing {
namespace {

/// Of each sound track in turn: the media time of its first edit, -1 for an empty one (ISO/IEC 14496-12 clause 8.6.6).
std::vector<std::int64_t> firstEdits(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    const std::string bytes((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
    const auto number = [&](std::size_t at) {
        std::uint32_t value = 0;
        for (std::size_t i = 0; i < 4; ++i) value = value << 8u | static_cast<std::uint8_t>(bytes.at(at + i));
        return static_cast<std::int32_t>(value);
    };
    std::vector<std::int64_t> edits;
    // Behind the media, where the index of a finished movie stands.
    for (std::size_t track = bytes.find("trak", bytes.rfind("mvhd")); track != std::string::npos;
         track = bytes.find("trak", track + 4)) {
        if (bytes.find("soun", track) > bytes.find("trak", track + 4)) continue;
        const std::size_t list = bytes.find("elst", track);
        edits.push_back(list < bytes.find("trak", track + 4) ? number(list + 4 + 8 + 4) : 0);
    }
    return edits;
}

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

double lengthOfSound(const RecordedMovie& movie) {
    const auto sound = checkers::MovieReader(movie.path()).readSound();
    return sound ? static_cast<double>(sound->samples.size()) / sound->rate : -1;
}

TEST(Sound, ThatIsSilentAtLastIsAsLongAsThePictures) {
    RecordedMovie movie;
    movie.start();
    ASSERT_TRUE(movie.appendGrey(100, 0));
    appendTone(*movie.sound, tapFormat(), 0, 0, 44100);
    ASSERT_TRUE(movie.sound->append(soundBuffer(tapFormat(), Data(2 * 11025, 0), 11025, kSecond)));
    movie.clock.advance(std::chrono::milliseconds(2900));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    EXPECT_NEAR(lengthOfSound(movie), 2.9, 0.005);
    const auto sound = checkers::MovieReader(movie.path()).readSound();
    EXPECT_NEAR(loudness(*sound, 0.1, 0.95), kToneLoudness, 0.01);
    EXPECT_LT(loudness(*sound, 1.05, 2.9), 0.001);
}

TEST(Sound, ThatCanBeHeardAtLastOrEndedLongBeforeEndsWhereItEnded) {
    for (const bool isSilent : {false, true}) {
        RecordedMovie movie;
        movie.start();
        ASSERT_TRUE(movie.appendGrey(100, 0));
        if (isSilent) {
            ASSERT_TRUE(movie.sound->append(soundBuffer(tapFormat(), Data(2 * 44100, 0), 44100, 0)));
        } else {
            appendTone(*movie.sound, tapFormat(), 0, 0, 44100);
        }
        movie.clock.advance(std::chrono::milliseconds(isSilent ? 3500 : 1900));
        ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
        EXPECT_NEAR(lengthOfSound(movie), 1, 0.03);
    }
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

/// The largest step between neighbouring samples, above what the tone itself has, where a jump would stand out.
double largestStep(const checkers::Sound& sound, double from, double to) {
    double step = 0;
    for (auto i = static_cast<std::size_t>(from * sound.rate) + 1; i < static_cast<std::size_t>(to * sound.rate); ++i)
        step = std::max(step, std::abs(static_cast<double>(sound.samples[i]) - sound.samples[i - 1]));
    return step;
}

class Drift : public ::testing::TestWithParam<int> {};

TEST_P(Drift, IsTakenUpWithoutAJumpAndStaysInSync) {
    // A device whose second lasts so many millionths longer by the stamps' clock. In its 50th second it is quiet for
    // 100 ms: where that is heard tells how far the sound is off.
    const double stretch = 1 + GetParam() / 1e6;
    constexpr int kSeconds = 60;
    RecordedMovie movie;
    movie.start();
    ASSERT_TRUE(movie.appendGrey(100, 0));
    const AudioFormat format = tapFormat();
    const std::int64_t block = 882;
    for (std::int64_t frame = 0; static_cast<double>(frame) * stretch < kSeconds * 44100.0; frame += block) {
        const bool isQuiet = frame >= 50 * 44100 && frame < 50 * 44100 + 4410;
        Data data = isQuiet ? Data(static_cast<std::size_t>(2 * block)) : tone(format, 1000, frame, block);
        ASSERT_TRUE(eventually([&] { return movie.sound->isReadyForMoreMediaData(); }));
        const auto stamp = static_cast<std::int64_t>(static_cast<double>(frame) * stretch * 1e9 / 44100);
        ASSERT_TRUE(movie.sound->append(soundBuffer(format, std::move(data), block, stamp)));
    }
    movie.clock.advance(std::chrono::seconds(kSeconds));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    const auto sound = checkers::MovieReader(movie.path()).readSound();
    ASSERT_TRUE(sound);
    EXPECT_NEAR(static_cast<double>(sound->samples.size()) / sound->rate, kSeconds, 0.03);
    const double own = 0.5 * 2 * std::numbers::pi * 1000 / 44100;
    EXPECT_LT(largestStep(*sound, 0.1, 49.9), 1.1 * own);
    for (double at = 0.1; at < 49.8; at += 0.01) ASSERT_GT(loudness(*sound, at, at + 0.01), 0.93 * kToneLoudness) << at;
    double heard = 49.9;
    while (heard < 50.3 && loudness(*sound, heard, heard + 0.001) > 0.1) heard += 0.001;
    EXPECT_NEAR(heard, 50 * stretch, 0.006);
}
INSTANTIATE_TEST_SUITE_P(MillionthsOfASecond, Drift, ::testing::Values(200, 1000, -200, -1000));

TEST(Sound, OfBothTracksBeginsWithThePicture) {
    RecordedMovie movie;
    const std::int64_t zero = 7 * kSecond;
    movie.start(zero);
    appendTone(*movie.microphone, tapFormat(), zero, 22050, 44100);  // before there is a picture
    ASSERT_TRUE(movie.appendGrey(100, zero));
    appendTone(*movie.sound, tapFormat(), zero, 44100, 44100);
    movie.clock.advance(std::chrono::seconds(3));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    checkers::MovieReader reader(movie.path());
    ASSERT_EQ(reader.audioTracks().size(), 2u);
    EXPECT_NEAR(static_cast<double>(reader.audioTracks()[0].duration.count()), 2e9, 3e7) << "silence is in the track";
    EXPECT_NEAR(static_cast<double>(reader.audioTracks()[1].duration.count()), 1.5e9, 3e7);
    EXPECT_EQ(firstEdits(movie.path()), (std::vector<std::int64_t>{1024, 1024})) << "priming, and no empty edit";
    const double begin[] = {1.0, 0.5};
    for (const std::size_t track : {0u, 1u}) {
        const auto sound = reader.readSound(track);
        ASSERT_TRUE(sound);
        EXPECT_LT(loudness(*sound, 0.0, begin[track] - 0.03), 0.001);
        EXPECT_NEAR(loudness(*sound, begin[track] + 0.02, begin[track] + 0.95), kToneLoudness, 0.01);
    }
}

TEST(Sound, StampedInFramesIsInPlace) {
    RecordedMovie movie;
    movie.start();
    ASSERT_TRUE(movie.appendGrey(100, 0));
    for (std::int64_t at = 0; at < 88200; at += 441) {
        ASSERT_TRUE(eventually([&] { return movie.sound->isReadyForMoreMediaData(); }));
        ASSERT_TRUE(movie.sound->append(
            SampleBuffer::makeAudio(tapFormat(), tone(tapFormat(), 441, at, 441), 441,
                                    {MediaTime::make(441, 44100), MediaTime::make(at, 44100), kInvalidMediaTime})));
    }
    movie.clock.advance(std::chrono::seconds(2));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    const auto sound = checkers::MovieReader(movie.path()).readSound();
    ASSERT_TRUE(sound);
    EXPECT_NEAR(phaseDelay(*sound, 0.1, 1.9), 0, 0.05);
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
