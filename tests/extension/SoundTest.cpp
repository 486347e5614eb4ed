// Sounds as they come, made into one.

#include <gtest/gtest.h>

#include <cmath>

#include "extensions/media/PcmReader.h"
#include "extensions/media/SoundMixer.h"
#include "tests/extension/SamplePayload.h"

namespace lumacast::test {
namespace {

using extensions::PcmReader;
using extensions::SoundMixer;
using extensions::StereoSound;

AudioFormat format(double rate, std::uint32_t channels, std::uint32_t bits, std::uint32_t flags) {
    AudioFormat made;
    made.sampleRate = rate;
    made.formatID = kAudioFormatLinearPCM;
    made.formatFlags = flags | AudioFormat::kFlagPacked;
    made.channelsPerFrame = channels;
    made.bitsPerChannel = bits;
    made.bytesPerFrame = made.bytesPerPacket = channels * bits / 8;
    made.framesPerPacket = 1;
    return made;
}

extension::Sound soundOf(const AudioFormat& format, Data bytes) {
    const auto frames = static_cast<std::int64_t>(bytes.size() / format.bytesPerFrame);
    return {extension::Sound::Source::Application, format, std::move(bytes), frames, {}, nullptr};
}

TEST(PcmReader, ReadsEveryKindOfSample) {
    constexpr auto kSigned = AudioFormat::kFlagSignedInteger, kBig = AudioFormat::kFlagBigEndian;
    const auto first = [](const AudioFormat& kind, Data bytes) {
        const StereoSound read = PcmReader(48'000).read(soundOf(kind, std::move(bytes)));
        EXPECT_EQ(read.size(), 1u);
        return read.size() == 1 ? std::pair(read.channels[0][0], read.channels[1][0]) : std::pair(9.0F, 9.0F);
    };
    EXPECT_EQ(first(format(48'000, 1, 16, kSigned | kBig), {0x40, 0x00}), std::pair(0.5F, 0.5F));
    EXPECT_EQ(first(format(48'000, 2, 16, kSigned), {0x00, 0xC0, 0x00, 0x20}), std::pair(-0.5F, 0.25F));
    EXPECT_EQ(first(format(48'000, 1, 8, kSigned), {0x80}), std::pair(-1.0F, -1.0F));
    EXPECT_EQ(first(format(48'000, 1, 24, kSigned), {0, 0, 0x20}), std::pair(0.25F, 0.25F));
    EXPECT_EQ(first(format(48'000, 1, 32, kSigned), {0, 0, 0, 0xE0}), std::pair(-0.25F, -0.25F));
    EXPECT_EQ(first(format(48'000, 1, 32, AudioFormat::kFlagFloat), bytesOf(0.75F)), std::pair(0.75F, 0.75F));
    EXPECT_EQ(first(format(48'000, 1, 64, AudioFormat::kFlagFloat), bytesOf(-0.75)), std::pair(-0.75F, -0.75F));
    // Three channels: the first two.
    EXPECT_EQ(first(format(48'000, 3, 8, kSigned), {0x40, 0x20, 0x10}), std::pair(0.5F, 0.25F));
}

TEST(PcmReader, WhatCannotBeReadIsEmpty) {
    PcmReader reader(48'000);
    EXPECT_EQ(reader.read(soundOf(format(48'000, 1, 16, 0), {1, 2})).size(), 0u) << "unsigned";
    EXPECT_EQ(reader.read(soundOf(format(48'000, 1, 16, AudioFormat::kFlagFloat), {1, 2})).size(), 0u);
    EXPECT_EQ(reader.read(soundOf(format(48'000, 1, 16, AudioFormat::kFlagSignedInteger), {1, 2})).size(), 1u);
    const Data noNumber = bytesOf(std::nanf(""));
    EXPECT_EQ(reader.read(soundOf(format(48'000, 1, 32, AudioFormat::kFlagFloat), noNumber)).channels[0].at(0), 0.0F);
    // A number, but not of those that samples are made of.
    const Data tooLarge = bytesOf(-1e300);
    EXPECT_EQ(reader.read(soundOf(format(48'000, 1, 64, AudioFormat::kFlagFloat), tooLarge)).channels[0].at(0), 0.0F);
}

TEST(PcmReader, AnotherRateIsBroughtToTheStreams) {
    PcmReader reader(48'000);
    std::size_t made = 0;
    for (int at = 0; at < 50; ++at)
        made += reader.read(soundOf(format(44'100, 1, 16, AudioFormat::kFlagSignedInteger), Data(882 * 2))).size();
    EXPECT_NEAR(static_cast<double>(made), 48'000, 64);
}

StereoSound constant(std::size_t samples, float value) {
    StereoSound sound;
    sound.resize(samples);
    for (auto& channel : sound.channels) std::fill(channel.begin(), channel.end(), value);
    return sound;
}

TEST(SoundMixer, AddsUpWhatSoundsAtTheSameTime) {
    SoundMixer mixer(1000);
    mixer.add(0, constant(100, 0.5F), 0);
    mixer.add(1, constant(100, 0.25F), 40);
    const StereoSound mixed = mixer.take(100);
    ASSERT_EQ(mixed.size(), 100u) << "as far as both are known";
    EXPECT_EQ(mixed.channels[0][39], 0.5F);
    EXPECT_EQ(mixed.channels[1][40], 0.75F);
    mixer.add(0, constant(100, 0.9F), 100);
    const StereoSound more = mixer.take(200);
    ASSERT_EQ(more.size(), 40u);
    EXPECT_EQ(more.channels[0][0], 1.0F) << "never beyond full scale";
}

TEST(SoundMixer, ASourceThatSaysNothingIsNotWaitedForLongerThanAFifthOfASecond) {
    SoundMixer mixer(1000);
    mixer.add(0, constant(500, 0.5F), 0);
    EXPECT_EQ(mixer.take(500).size(), 300u);
    EXPECT_EQ(mixer.position(), 300);
    // What it says too late is cut off, the rest is heard.
    mixer.add(1, constant(100, 0.25F), 250);
    const StereoSound mixed = mixer.take(700);
    ASSERT_EQ(mixed.size(), 200u);
    EXPECT_EQ(mixed.channels[0][49], 0.75F);
    EXPECT_EQ(mixed.channels[0][50], 0.5F);
}

TEST(SoundMixer, HolesAreSilentAndJitterIsNoHole) {
    SoundMixer mixer(1000);
    mixer.add(0, constant(100, 0.5F), 0);
    mixer.add(0, constant(100, 0.5F), 110);  // 10 ms late: jitter
    mixer.add(0, constant(100, 0.5F), 300);
    const StereoSound mixed = mixer.takeAll(400);
    EXPECT_EQ(mixed.channels[0][100], 0.5F);
    EXPECT_EQ(mixed.channels[0][199], 0.5F);
    EXPECT_EQ(mixed.channels[0][200], 0.0F);
    EXPECT_EQ(mixed.channels[0][299], 0.0F);
    EXPECT_EQ(mixed.channels[0][300], 0.5F);
}

TEST(SoundMixer, ATimeFarAwayTakesNoMemory) {
    SoundMixer mixer(1000);
    mixer.add(0, constant(100, 0.5F), 1'000'000'000);
    mixer.add(0, constant(100, 0.5F), 0);
    EXPECT_EQ(mixer.take(100).size(), 0u);
    EXPECT_EQ(mixer.takeAll(100).channels[0].at(99), 0.5F);
}

}  // namespace
}  // namespace lumacast::test
