// How what a microphone hears becomes samples, and how they wait for a delegate.

#include <gtest/gtest.h>

#include <atomic>

#include "linux/audio/DeviceAudioOutput.h"
#include "linux/audio/DeviceSamples.h"
#include "tests/contract/DeviceCaptureWorld.h"

namespace lumacast {
namespace {

using sound::DeviceAudioOutput;
using sound::SoundTimeline;
using sound::stampedSamples;

/// A clock that ran from 1 s to 2 s and from 3 s to 4 s of host time.
class MicrophoneSamplesTest : public ::testing::Test {
protected:
    MicrophoneSamplesTest() {
        for (const std::int64_t second : {1, 3}) {
            now_ = second * 1'000'000'000;
            clock_.run();
            now_ += 1'000'000'000;
            clock_.stand();
        }
    }
    static std::int64_t frame(double seconds) { return static_cast<std::int64_t>(seconds * 44100); }

    std::atomic<std::int64_t> now_{0};
    CaptureClock clock_{[this] { return HostTime{now_}; }};
    const SoundTimeline timeline_{HostTime{0}, 44100};
};

TEST_F(MicrophoneSamplesTest, OneSampleWhereTheClockRanAllTheTime) {
    const std::vector<float> heard(4410, 0.5f);
    const auto samples = stampedSamples(clock_, timeline_, frame(1.5), heard);
    ASSERT_EQ(samples.size(), 1u);
    EXPECT_EQ(samples[0]->sampleCount(), 4410);
    EXPECT_NEAR(samples[0]->presentationTime().seconds(), 0.5, 1e-6);
    EXPECT_EQ(compare(samples[0]->duration(), MediaTime::make(4410, 44100)), 0);
    EXPECT_EQ((*samples[0]->data())[0], 0x40);
    EXPECT_EQ((*samples[0]->data())[1], 0x00);
}

TEST_F(MicrophoneSamplesTest, NothingOfWhatWasHeardWhileTheClockStood) {
    const std::vector<float> heard(441, 0.5f);
    EXPECT_TRUE(stampedSamples(clock_, timeline_, frame(0.5), heard).empty());
    EXPECT_TRUE(stampedSamples(clock_, timeline_, frame(2.5), heard).empty());
    EXPECT_TRUE(stampedSamples(clock_, timeline_, frame(4.5), heard).empty());
    EXPECT_TRUE(stampedSamples(clock_, timeline_, frame(1.5), {}).empty());
}

TEST_F(MicrophoneSamplesTest, OneSampleForEachRunOfTheClock) {
    std::vector<float> heard(44100 * 4);
    for (std::size_t at = 0; at < heard.size(); ++at) heard[at] = at < 44100 * 2 ? 0.25f : 0.5f;
    const auto samples = stampedSamples(clock_, timeline_, frame(0.5), heard);
    ASSERT_EQ(samples.size(), 2u);
    constexpr double kCut = 33.0 / 44100;
    EXPECT_NEAR(samples[0]->presentationTime().seconds(), 0, kCut);
    EXPECT_NEAR(samples[0]->duration().seconds(), 1, 2 * kCut);
    EXPECT_NEAR(samples[1]->presentationTime().seconds(), 1, kCut);
    EXPECT_NEAR(samples[1]->duration().seconds(), 1, 2 * kCut);
    EXPECT_EQ((*samples[0]->data())[0], 0x20);
    EXPECT_EQ((*samples[1]->data())[0], 0x40);
    for (const SampleRef& sample : samples) {
        const double end = sample->presentationTime().seconds() + sample->duration().seconds();
        EXPECT_LE(end, 2 + 1e-6);
        EXPECT_EQ(sample->data()->size(), static_cast<std::size_t>(sample->sampleCount()) * 2);
    }
}

TEST_F(MicrophoneSamplesTest, WhatIsBeyondFullScaleIsLimitedToIt) {
    const auto samples = stampedSamples(clock_, timeline_, frame(1.5), std::vector<float>{2.0f, -2.0f});
    ASSERT_EQ(samples.size(), 1u);
    EXPECT_EQ(*samples[0]->data(), (Data{0x7F, 0xFF, 0x80, 0x00}));
}

TEST(DeviceAudioOutputTest, WhatFindsItsDelegateTooFarBehindIsDropped) {
    ThreadScheduler scheduler(std::make_shared<ThreadLoop>());
    const auto queue = scheduler.serialQueue("samples");
    const auto listener = std::make_shared<testing::SampleListener>(queue);
    const auto output = std::make_shared<DeviceAudioOutput>();
    output->setSampleBufferDelegate(listener, queue);
    const SampleRef sample = SampleBuffer::makeAudio(
        sound::microphoneFormat(), Data(2), 1, {MediaTime::make(1, 44100), kZeroMediaTime, kInvalidMediaTime});
    const auto behind = std::shared_ptr<Semaphore>(scheduler.semaphore(0));
    queue->async([behind] { behind->wait(); });
    for (int more = 0; more < 2 * DeviceAudioOutput::kMostWaiting; ++more) output->deliver(sample);
    behind->signal();
    queue->sync([] {});
    EXPECT_EQ(listener->count(), static_cast<std::size_t>(DeviceAudioOutput::kMostWaiting));
    output->deliver(sample);
    queue->sync([] {});
    EXPECT_EQ(listener->count(), static_cast<std::size_t>(DeviceAudioOutput::kMostWaiting) + 1);
}

}  // namespace
}  // namespace lumacast
