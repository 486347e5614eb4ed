// What every audio queue promises: formats, flags and buffers. What is heard, and of whom, is AudioTapTest's.

#include <cmath>
#include <memory>
#include <utility>
#include <vector>

#include "tests/contract/AudioInputQueueFixture.h"

namespace lumacast {
namespace {

using namespace AudioStatus;
using test::AudioInputQueueContract;
using test::format;
using test::kFlags;
using test::recorderFormat;
using test::SoundWorldMaker;

TEST_P(AudioInputQueueContract, EveryFormatThatIsPromisedIsMadeAndCompleted) {
    constexpr std::uint32_t kInteger = AudioFormat::kFlagSignedInteger | AudioFormat::kFlagPacked;
    constexpr std::uint32_t kFloat = AudioFormat::kFlagFloat | AudioFormat::kFlagPacked;
    for (const double rate : {8000.0, 44100.0, 48000.0, 192000.0})
        for (const std::uint32_t channels : {1u, 2u})
            for (const std::uint32_t order : {0u, AudioFormat::kFlagBigEndian})
                for (const auto& [bits, flags] : {std::pair{16u, kInteger}, {24u, kInteger}, {32u, kInteger}, {32u, kFloat}}) {
                    const auto queue = make(format(rate, bits, channels, flags | order));
                    AudioFormat whole;
                    ASSERT_EQ(queue->streamFormat(whole), kSuccess);
                    EXPECT_EQ(whole.sampleRate, rate);
                    EXPECT_EQ(whole.formatFlags, flags | order);
                    EXPECT_EQ(whole.bytesPerFrame, bits / 8 * channels);
                    EXPECT_EQ(whole.bytesPerPacket, bits / 8 * channels);
                    EXPECT_EQ(whole.framesPerPacket, 1u);
                    std::uint32_t bytes = 0;
                    EXPECT_EQ(queue->maximumOutputPacketSize(bytes), kSuccess);
                    EXPECT_EQ(bytes, bits / 8 * channels);
                }
    AudioFormat same;
    ASSERT_EQ(make()->streamFormat(same), kSuccess);
    EXPECT_EQ(same, recorderFormat());
}

TEST_P(AudioInputQueueContract, AFormatThatNobodyDeliversIsRefusedAndTheQueueSaysWhy) {
    constexpr std::uint32_t kInteger = AudioFormat::kFlagSignedInteger | AudioFormat::kFlagPacked;
    constexpr std::uint32_t kFloat = AudioFormat::kFlagFloat | AudioFormat::kFlagPacked;
    std::vector<AudioFormat> bad{format(44100, 8, 1, kInteger),    format(44100, 20, 1, kInteger),
                                 format(44100, 64, 1, kFloat),     format(44100, 16, 1, kFloat),
                                 format(44100, 16, 0, kInteger),   format(44100, 16, 3, kInteger),
                                 format(7999, 16, 1, kInteger),    format(192001, 16, 1, kInteger),
                                 format(0, 16, 1, kInteger),       format(-44100, 16, 1, kInteger),
                                 format(std::nan(""), 16, 1, kInteger), format(44100, 16, 1, 0), AudioFormat{}};
    bad.push_back(format(44100, 32, 1, kInteger | kFloat));
    bad.push_back(recorderFormat());
    bad.back().formatID = 0x61616320;
    bad.push_back(format(44100, 16, 1, kInteger | 0x20));
    bad.push_back(recorderFormat());
    bad.back().bytesPerFrame = 4;
    bad.push_back(recorderFormat());
    bad.back().framesPerPacket = 2;
    for (std::size_t i = 0; i < bad.size(); ++i) {
        const auto made = queues().makeInputQueue(bad[i], {}, kFlags);
        EXPECT_EQ(made.status, kBadFormat) << i;
        ASSERT_NE(made.queue, nullptr) << i;
    }
    const auto refused = queues().makeInputQueue(bad[0], {}, kFlags).queue;
    AudioFormat untouched = format(1, 2, 3, 4);
    std::uint32_t bytes = 99;
    AudioQueueBufferRef buffer;
    EXPECT_EQ(refused->setProcessTap(world_->quiet()), kBadFormat);
    EXPECT_EQ(refused->streamFormat(untouched), kBadFormat);
    EXPECT_EQ(refused->maximumOutputPacketSize(bytes), kBadFormat);
    EXPECT_EQ(refused->allocateBuffer(100, buffer), kBadFormat);
    EXPECT_EQ(refused->enqueueBuffer(buffer), kBadFormat);
    EXPECT_EQ(refused->freeBuffer(buffer), kBadFormat);
    EXPECT_EQ(refused->addIsRunningListener([] {}), kBadFormat);
    EXPECT_EQ(refused->removeIsRunningListener(), kBadFormat);
    EXPECT_EQ(refused->start(), kBadFormat);
    EXPECT_EQ(refused->stop(), kBadFormat);
    EXPECT_EQ(refused->dispose(), kBadFormat);
    EXPECT_EQ(untouched, format(1, 2, 3, 4));
    EXPECT_EQ(bytes, 99u);
    EXPECT_EQ(buffer, nullptr);
}

TEST_P(AudioInputQueueContract, FlagsThatAreNotKnownAreRefused) {
    for (const std::uint32_t flags : {0u, 1u, kFlags | 1, ~0u}) {
        const auto made = queues().makeInputQueue(recorderFormat(), {}, flags);
        EXPECT_EQ(made.status, kBadFlags);
        ASSERT_NE(made.queue, nullptr);
        EXPECT_EQ(made.queue->start(), kBadFlags);
    }
}

TEST_P(AudioInputQueueContract, TheProcessIsSetBeforeTheStartAndIsOne) {
    const auto queue = make();
    EXPECT_EQ(queue->setProcessTap(ProcessID{0}), kNoSuchProcess);
    EXPECT_EQ(queue->setProcessTap(ProcessID{-1}), kNoSuchProcess);
    EXPECT_EQ(queue->setProcessTap(world_->quiet()), kSuccess);
    ASSERT_EQ(queue->start(), kSuccess);
    EXPECT_EQ(queue->setProcessTap(world_->quiet()), kBadState);
    ASSERT_EQ(queue->stop(), kSuccess);
    EXPECT_EQ(queue->setProcessTap(world_->quiet()), kSuccess);
}

TEST_P(AudioInputQueueContract, BuffersAreAsLongAsTheyWereAskedForAndLimitedInSizeAndNumber) {
    const auto queue = make();
    AudioQueueBufferRef buffer;
    EXPECT_EQ(queue->allocateBuffer(0, buffer), kBadSize);
    EXPECT_EQ(queue->allocateBuffer(AudioInputQueue::kMostBufferBytes + 1, buffer), kBadSize);
    EXPECT_EQ(buffer, nullptr);
    std::vector<AudioQueueBufferRef> all;
    for (std::uint32_t i = 0; i < AudioInputQueue::kMostBuffers; ++i) {
        ASSERT_EQ(queue->allocateBuffer(i == 0 ? AudioInputQueue::kMostBufferBytes : i, buffer), kSuccess);
        EXPECT_EQ(buffer->bytes.size(), i == 0 ? AudioInputQueue::kMostBufferBytes : i);
        EXPECT_EQ(buffer->byteSize, 0u);
        all.push_back(std::exchange(buffer, nullptr));
    }
    EXPECT_EQ(queue->allocateBuffer(10, buffer), kTooManyBuffers);
    EXPECT_EQ(buffer, nullptr);
    ASSERT_EQ(queue->freeBuffer(all.back()), kSuccess);
    EXPECT_EQ(queue->allocateBuffer(10, buffer), kSuccess);
}

TEST_P(AudioInputQueueContract, OnlyABufferOfTheQueueThatIsNotEnqueuedIsEnqueued) {
    const auto queue = make(), other = make();
    AudioQueueBufferRef own, foreign;
    ASSERT_EQ(queue->allocateBuffer(100, own), kSuccess);
    ASSERT_EQ(other->allocateBuffer(100, foreign), kSuccess);
    const auto nobodys = std::make_shared<AudioQueueBuffer>();
    for (const AudioQueueBufferRef& bad : {AudioQueueBufferRef(), AudioQueueBufferRef(nobodys), foreign}) {
        EXPECT_EQ(queue->enqueueBuffer(bad), kBadBuffer);
        EXPECT_EQ(queue->freeBuffer(bad), kBadBuffer);
    }
    EXPECT_EQ(queue->enqueueBuffer(own), kSuccess);
    EXPECT_EQ(queue->enqueueBuffer(own), kBadBuffer);
    EXPECT_EQ(queue->freeBuffer(own), kSuccess) << "enqueued or not";
    EXPECT_EQ(queue->freeBuffer(own), kBadBuffer);
    EXPECT_EQ(queue->enqueueBuffer(own), kBadBuffer);
}

INSTANTIATE_TEST_SUITE_P(Fake, AudioInputQueueContract, ::testing::Values(SoundWorldMaker([]() -> std::unique_ptr<test::SoundWorld> {
                             return std::make_unique<test::FakeSoundWorld>();
                         })));
INSTANTIATE_TEST_SUITE_P(Port, AudioInputQueueContract, ::testing::Values(SoundWorldMaker([]() -> std::unique_ptr<test::SoundWorld> {
                             return std::make_unique<test::PortSoundWorld>();
                         })));
INSTANTIATE_TEST_SUITE_P(Headless, AudioInputQueueContract, ::testing::Values(SoundWorldMaker([]() -> std::unique_ptr<test::SoundWorld> {
                             return std::make_unique<test::HeadlessSoundWorld>();
                         })));

}  // namespace
}  // namespace lumacast
