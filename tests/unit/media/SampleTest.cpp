#include <gtest/gtest.h>

#include "writer/media/SampleBuffer.h"
#include "writer/media/SampleQueue.h"

namespace lumacast {
namespace {

SampleRef picture(std::int64_t tick) {
    return SampleBuffer::makeVideo(PixelBuffer(), MediaTime::make(tick, 60), MediaTime::make(1, 60));
}

TEST(SampleBuffer, AVideoFrameHasOneTimingEntryWithoutADecodeTime) {
    const SampleRef sample = picture(7);
    EXPECT_EQ(sample->format().type, MediaType::Video);
    EXPECT_EQ(sample->sampleCount(), 1);
    ASSERT_EQ(sample->timing().size(), 1u);
    EXPECT_FALSE(sample->timing()[0].decode.isValid());
    EXPECT_EQ(compare(sample->presentationTime(), MediaTime::make(7, 60)), 0);
    EXPECT_EQ(compare(sample->duration(), MediaTime::make(1, 60)), 0);
    EXPECT_TRUE(sample->image());
    EXPECT_FALSE(sample->data());
}

TEST(SampleBuffer, AudioCarriesItsFormatAndBytes) {
    AudioFormat format;
    format.sampleRate = 44100;
    format.formatID = kAudioFormatLinearPCM;
    const SampleTiming timing{MediaTime::make(1, 44100), MediaTime::make(5, 1), kInvalidMediaTime};
    const SampleRef sample = SampleBuffer::makeAudio(format, Data{1, 2, 3, 4}, 2, timing);
    EXPECT_EQ(sample->format().type, MediaType::Audio);
    EXPECT_EQ(sample->format().audio, format);
    EXPECT_EQ(sample->sampleCount(), 2);
    EXPECT_EQ(*sample->data(), (Data{1, 2, 3, 4}));
    EXPECT_FALSE(sample->image());
    EXPECT_EQ(compare(sample->presentationTime(), MediaTime::make(5, 1)), 0);
}

TEST(SampleBuffer, ACopyWithNewTimingSharesThePayloadAndLeavesTheOriginal) {
    const SampleRef sample =
        SampleBuffer::makeAudio({}, Data{9}, 1, {kZeroMediaTime, kZeroMediaTime, kInvalidMediaTime});
    const SampleRef copy =
        sample->copyWithTiming({{kZeroMediaTime, MediaTime::make(3, 1), kInvalidMediaTime}, {}});
    EXPECT_EQ(copy->data(), sample->data());
    EXPECT_EQ(copy->timing().size(), 2u);
    EXPECT_EQ(compare(copy->presentationTime(), MediaTime::make(3, 1)), 0);
    EXPECT_EQ(compare(sample->presentationTime(), kZeroMediaTime), 0);
}

TEST(SampleBuffer, WithoutTimingItsTimesAreInvalid) {
    const SampleRef copy = picture(1)->copyWithTiming({});
    EXPECT_FALSE(copy->presentationTime().isValid());
    EXPECT_FALSE(copy->duration().isValid());
}

TEST(PixelBuffer, WithoutAPlaneItHasNoSize) {
    EXPECT_EQ(PixelBuffer().width(), 0u);
    EXPECT_EQ(PixelBuffer().height(), 0u);
    EXPECT_FALSE(PixelBuffer().plane());
}

TEST(AudioFormat, AFourCharacterCodeHasItsFirstLetterInTheHighestByte) {
    EXPECT_EQ(fourCC("lpcm"), 0x6C70636Du);
    EXPECT_EQ(kAudioFormatAAC, 0x61616320u);
}

TEST(SampleQueue, WhatWentInFirstComesOutFirstThoughItsStampIsLater) {
    SampleQueue queue;
    const SampleRef late = picture(9), early = picture(1);
    EXPECT_EQ(queue.enqueue(late), 0);
    EXPECT_EQ(queue.enqueue(early), 0);
    EXPECT_EQ(queue.dequeueAndRetain(), late);
    EXPECT_EQ(queue.dequeueAndRetain(), early);
    EXPECT_TRUE(queue.isEmpty());
}

TEST(SampleQueue, AnEmptyOneYieldsNoneAndStaysEmpty) {
    SampleQueue queue;
    EXPECT_TRUE(queue.isEmpty());
    EXPECT_FALSE(queue.dequeueAndRetain());
    EXPECT_TRUE(queue.isEmpty());
}

TEST(SampleQueue, AMissingBufferIsRefusedAndNotQueued) {
    SampleQueue queue;
    EXPECT_NE(queue.enqueue(nullptr), 0);
    EXPECT_TRUE(queue.isEmpty());
}

TEST(SampleQueue, ItHoldsAReferenceUntilTheSampleIsTakenOrDropped) {
    SampleQueue queue;
    SampleRef taken = picture(1), dropped = picture(2);
    const std::weak_ptr<const SampleBuffer> weakTaken = taken, weakDropped = dropped;
    queue.enqueue(std::move(taken));
    queue.enqueue(std::move(dropped));
    EXPECT_FALSE(weakTaken.expired());
    EXPECT_FALSE(weakDropped.expired());
    queue.dequeueAndRetain();
    EXPECT_TRUE(weakTaken.expired());
    queue.reset();
    EXPECT_TRUE(weakDropped.expired());
    EXPECT_TRUE(queue.isEmpty());
}

}  // namespace
}  // namespace lumacast
