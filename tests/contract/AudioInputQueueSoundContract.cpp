// What an audio queue hands over, and how it is stamped.

#include <cmath>
#include <thread>

#include "tests/contract/AudioInputQueueFixture.h"

namespace lumacast {
namespace {

using namespace AudioStatus;
using test::AudioInputQueueContract;
using test::giveBack;
using test::Recorded;

constexpr std::uint32_t kSecond = 88200;  ///< bytes in the recorder's format

TEST_P(AudioInputQueueContract, WhatAProcessPlaysIsHeardAndSilenceOfOneThatPlaysNothing) {
    Recorded playing(queues(), giveBack), quiet(queues(), giveBack), nobodys(queues(), giveBack);
    ASSERT_EQ(playing.queue->setProcessTap(world_->playing()), kSuccess);
    ASSERT_EQ(quiet.queue->setProcessTap(world_->quiet()), kSuccess);
    for (Recorded* one : {&playing, &quiet, &nobodys}) {
        one->enqueue(10, 8820);
        ASSERT_EQ(one->queue->start(), kSuccess);
    }
    EXPECT_TRUE(eventually([&] { return playing.isLoud(); }));
    EXPECT_TRUE(eventually([&] { return quiet.bytes() > kSecond / 2 && nobodys.bytes() > kSecond / 2; }));
    EXPECT_FALSE(quiet.isLoud());
    EXPECT_FALSE(nobodys.isLoud());
}

TEST_P(AudioInputQueueContract, BuffersAreFilledInOrderFromTheStartOnWithoutAHole) {
    Recorded recorded(queues(), giveBack);
    recorded.enqueue(10, 8820);
    const std::int64_t started = world_->clock().captureClock()->now().value;
    ASSERT_EQ(recorded.queue->start(), kSuccess);
    ASSERT_TRUE(eventually([&] { return recorded.count() >= 30; }));
    ASSERT_EQ(recorded.queue->stop(), kSuccess);
    const auto pieces = recorded.pieces();
    constexpr std::uint32_t kValid =
        AudioTimeStamp::kSampleTimeValid | AudioTimeStamp::kHostTimeValid | AudioTimeStamp::kRateScalarValid;
    EXPECT_EQ(pieces[0].start.sampleTime, 0);
    EXPECT_NEAR(static_cast<double>(pieces[0].start.hostTime), static_cast<double>(started), 5e7);
    for (std::size_t i = 0; i < pieces.size(); ++i) {
        EXPECT_GE(pieces[i].bytes.size(), 1764u) << "20 ms";
        EXPECT_EQ(pieces[i].packets, pieces[i].bytes.size() / 2);
        EXPECT_EQ(pieces[i].descriptions, 0u) << "all packets are alike";
        EXPECT_EQ(pieces[i].start.flags, kValid);
        EXPECT_EQ(pieces[i].start.rateScalar, 1);
        EXPECT_NE(pieces[i].thread, std::this_thread::get_id());
        if (i == 0) continue;
        EXPECT_EQ(pieces[i].start.sampleTime, pieces[i - 1].start.sampleTime + pieces[i - 1].packets);
        EXPECT_NEAR(static_cast<double>(pieces[i].start.hostTime - pieces[i - 1].start.hostTime),
                    pieces[i - 1].packets / 44100.0 * 1e9, 30'000);
        if (i >= 10) {
            EXPECT_EQ(pieces[i].buffer, pieces[i - 10].buffer);
        }
    }
}

TEST_P(AudioInputQueueContract, UntilOneHasComeBackTheLastFiveBuffersAreHandedOverOnlyWhenFull) {
    Recorded recorded(queues());
    const auto buffers = recorded.enqueue(8, 17640);  // 200 ms each
    ASSERT_EQ(recorded.queue->start(), kSuccess);
    ASSERT_TRUE(eventually([&] { return recorded.count() == 8; }));
    const auto pieces = recorded.pieces();
    for (std::size_t i = 0; i < 3; ++i) EXPECT_LT(pieces[i].bytes.size(), 17640u) << i;
    for (std::size_t i = 3; i < 8; ++i) EXPECT_EQ(pieces[i].bytes.size(), 17640u) << i;

    // One has come back: from now on none waits until it is full.
    for (const auto& buffer : buffers) ASSERT_EQ(recorded.queue->enqueueBuffer(buffer), kSuccess);
    ASSERT_TRUE(eventually([&] { return recorded.count() == 16; }));
    const auto more = recorded.pieces();
    for (std::size_t i = 8; i < 16; ++i) EXPECT_LT(more[i].bytes.size(), 17640u) << i;
}

TEST_P(AudioInputQueueContract, WhatFindsNoBufferIsThrownAwayAndTheStampsSaySo) {
    Recorded recorded(queues());
    const auto buffers = recorded.enqueue(6, 882);  // 10 ms each
    ASSERT_EQ(recorded.queue->start(), kSuccess);
    ASSERT_TRUE(eventually([&] { return recorded.count() == 6; }));
    world_->pass(0.5);
    EXPECT_EQ(recorded.count(), 6u);
    ASSERT_EQ(recorded.queue->enqueueBuffer(buffers[0]), kSuccess);
    ASSERT_TRUE(eventually([&] { return recorded.count() == 7; }));
    const auto pieces = recorded.pieces();
    const double gap = static_cast<double>(pieces[6].start.hostTime - pieces[5].start.hostTime);
    EXPECT_GT(gap, 0.4e9);
    EXPECT_NEAR((pieces[6].start.sampleTime - pieces[5].start.sampleTime) / 44100 * 1e9, gap, 1e6);
}

TEST_P(AudioInputQueueContract, WhatIsHeardWhileTheCaptureClockStandsIsThrownAway) {
    Recorded recorded(queues(), giveBack);
    recorded.enqueue(10, 8820);
    ASSERT_EQ(recorded.queue->start(), kSuccess);
    ASSERT_TRUE(eventually([&] { return recorded.count() >= 3; }));
    const auto clock = world_->clock().captureClock();
    clock->stand();
    const std::int64_t stoodAt = clock->now().value;
    world_->pass(0.3);
    const std::size_t before = recorded.count();
    world_->pass(0.3);
    EXPECT_EQ(recorded.count(), before);
    clock->run();
    ASSERT_TRUE(eventually([&] { return recorded.count() >= before + 5; }));
    for (const auto& piece : recorded.pieces())
        EXPECT_LE(piece.start.hostTime, static_cast<std::uint64_t>(clock->now().value));
    const auto pieces = recorded.pieces();
    // Time that did not pass on the clock is not in the stamps.
    EXPECT_NEAR(static_cast<double>(pieces[before].start.hostTime), static_cast<double>(stoodAt), 6e7);
}

TEST_P(AudioInputQueueContract, TheClockIsTheOneOfTheStart) {
    Recorded recorded(queues(), giveBack);
    recorded.enqueue(10, 8820);
    ASSERT_EQ(recorded.queue->start(), kSuccess);
    ASSERT_TRUE(eventually([&] { return recorded.count() >= 3; }));
    world_->clock().startCaptureClock();  // the next recording's, which stands
    const std::size_t before = recorded.count();
    EXPECT_TRUE(eventually([&] { return recorded.count() >= before + 5; }));
}

TEST_P(AudioInputQueueContract, WithoutACaptureClockNothingIsHandedOver) {
    const auto fresh = GetParam()();
    Recorded recorded(fresh->queues());
    recorded.enqueue(10, 882);
    ASSERT_EQ(recorded.queue->start(), kSuccess);
    fresh->pass(0.3);
    EXPECT_EQ(recorded.count(), 0u);
}

}  // namespace
}  // namespace lumacast
