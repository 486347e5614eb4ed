// What every audio queue promises: states, buffers, lanes and stamps. What is heard, and of whom, is AudioTapTest's.

#include <gtest/gtest.h>

#include <atomic>
#include <cmath>
#include <future>
#include <mutex>
#include <vector>

#include "tests/contract/HeardSound.h"
#include "tests/contract/SoundWorld.h"

namespace lumacast {
namespace {

using namespace AudioStatus;
using test::recorderFormat;
using Maker = std::function<std::unique_ptr<test::SoundWorld>()>;

constexpr std::uint32_t kFlags = AudioInputQueues::kCaptureProcessOutput;
constexpr std::uint32_t kSecond = 88200;  ///< bytes in the recorder's format

AudioFormat format(double rate, std::uint32_t bits, std::uint32_t channels, std::uint32_t flags) {
    AudioFormat made;
    made.sampleRate = rate;
    made.formatID = kAudioFormatLinearPCM;
    made.formatFlags = flags;
    made.channelsPerFrame = channels;
    made.bitsPerChannel = bits;
    return made;
}

/// A queue and what came of it. Thread-safe.
class Recorded {
public:
    struct Piece {
        AudioQueueBufferRef buffer;
        Data bytes;
        AudioTimeStamp start;
        std::uint32_t packets = 0;
        std::size_t descriptions = 0;
        std::thread::id thread;
    };
    /// Called with each piece, after it was kept.
    using Then = std::function<void(Recorded&, const AudioQueueBufferRef&)>;

    explicit Recorded(AudioInputQueues& queues, Then then = {}) : state_(std::make_shared<State>()) {
        auto made = queues.makeInputQueue(
            recorderFormat(),
            [this, then, state = state_](const AudioQueueBufferRef& buffer, const AudioTimeStamp& start,
                                         std::uint32_t packets, std::span<const AudioPacketDescription> descriptions) {
                {
                    const std::lock_guard lock(state->mutex);
                    Data bytes(buffer->bytes.begin(), buffer->bytes.begin() + buffer->byteSize);
                    state->pieces.push_back({buffer, std::move(bytes), start, packets, descriptions.size(),
                                             std::this_thread::get_id()});
                }
                if (then) then(*this, buffer);
            },
            kFlags);
        EXPECT_EQ(made.status, kSuccess);
        queue = std::move(made.queue);
        letGo_ = state_;
    }
    ~Recorded() {
        if (queue) queue->dispose();
        // One that is in progress uses this, and what the test has on its stack.
        EXPECT_TRUE(eventually([this] { return isCallbackLetGo(); }));
    }
    Recorded(const Recorded&) = delete;
    Recorded& operator=(const Recorded&) = delete;

    std::vector<AudioQueueBufferRef> enqueue(int count, std::uint32_t bytes) {
        std::vector<AudioQueueBufferRef> buffers;
        for (int i = 0; i < count; ++i) {
            AudioQueueBufferRef buffer;
            EXPECT_EQ(queue->allocateBuffer(bytes, buffer), kSuccess);
            EXPECT_EQ(queue->enqueueBuffer(buffer), kSuccess);
            buffers.push_back(std::move(buffer));
        }
        return buffers;
    }
    std::vector<Piece> pieces() const {
        const std::lock_guard lock(state_->mutex);
        return state_->pieces;
    }
    std::size_t count() const { return pieces().size(); }
    std::size_t bytes() const {
        std::size_t sum = 0;
        for (const Piece& piece : pieces()) sum += piece.bytes.size();
        return sum;
    }
    /// Whether anything but silence came.
    bool isLoud() const {
        for (const Piece& piece : pieces())
            for (const std::uint8_t byte : piece.bytes)
                if (byte != 0) return true;
        return false;
    }
    /// Whether the queue has let go of its callback (which holds a share of this).
    bool isCallbackLetGo() const { return letGo_.use_count() == 1; }

    std::shared_ptr<AudioInputQueue> queue;

private:
    struct State {
        mutable std::mutex mutex;
        std::vector<Piece> pieces;
    };
    const std::shared_ptr<State> state_;
    std::weak_ptr<State> letGo_;
};

void giveBack(Recorded& recorded, const AudioQueueBufferRef& buffer) { recorded.queue->enqueueBuffer(buffer); }

class AudioInputQueueContract : public ::testing::TestWithParam<Maker> {
protected:
    AudioInputQueueContract() : world_(GetParam()()) {
        world_->clock().startCaptureClock();
        world_->clock().captureClock()->run();
    }
    AudioInputQueues& queues() { return world_->queues(); }
    std::shared_ptr<AudioInputQueue> make(const AudioFormat& wanted = recorderFormat()) {
        auto made = queues().makeInputQueue(wanted, {}, kFlags);
        EXPECT_EQ(made.status, kSuccess);
        return made.queue;
    }
    bool eventually(const std::function<bool()>& condition) { return world_->eventually(condition); }

    const std::unique_ptr<test::SoundWorld> world_;
};

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

TEST_P(AudioInputQueueContract, TheListenerIsToldOfEachStartAndStopOnAnotherThread) {
    Recorded recorded(queues());
    std::atomic<int> told{0};
    std::atomic<bool> inline_{false};
    const auto caller = std::this_thread::get_id();
    ASSERT_EQ(recorded.queue->addIsRunningListener([&] {
        if (std::this_thread::get_id() == caller) inline_ = true;
        ++told;
    }),
              kSuccess);
    EXPECT_EQ(recorded.queue->stop(), kSuccess) << "nothing when it is not running";
    ASSERT_EQ(recorded.queue->start(), kSuccess);
    ASSERT_EQ(recorded.queue->start(), kSuccess) << "nothing when it was started before";
    EXPECT_TRUE(eventually([&] { return told == 1; }));
    world_->pass(0.1);
    EXPECT_EQ(told, 1);
    ASSERT_EQ(recorded.queue->stop(), kSuccess);
    ASSERT_EQ(recorded.queue->stop(), kSuccess);
    EXPECT_TRUE(eventually([&] { return told == 2; }));
    world_->pass(0.1);
    EXPECT_EQ(told, 2);
    EXPECT_FALSE(inline_);
}

TEST_P(AudioInputQueueContract, ThereIsOneListenerUntilItIsRemovedAlsoByItself) {
    Recorded recorded(queues());
    EXPECT_EQ(recorded.queue->removeIsRunningListener(), kSuccess) << "harmless where there is none";
    std::atomic<int> first{0}, second{0};
    const auto held = std::make_shared<int>(0);
    ASSERT_EQ(recorded.queue->addIsRunningListener([&first, held] { ++first; }), kSuccess);
    EXPECT_EQ(held.use_count(), 2);
    ASSERT_EQ(recorded.queue->addIsRunningListener([&] {
        ++second;
        recorded.queue->removeIsRunningListener();
    }),
              kSuccess);
    EXPECT_EQ(held.use_count(), 1) << "one at a time";
    ASSERT_EQ(recorded.queue->start(), kSuccess);
    EXPECT_TRUE(eventually([&] { return second == 1; }));
    ASSERT_EQ(recorded.queue->stop(), kSuccess);
    world_->pass(0.1);
    EXPECT_EQ(second, 1);
    EXPECT_EQ(first, 0);
}

TEST_P(AudioInputQueueContract, NoCallbackBeginsAfterAStopAndAnotherStartGoesOn) {
    Recorded recorded(queues(), giveBack);
    recorded.enqueue(10, 1764);
    for (int round = 0; round < 5; ++round) {
        const std::size_t before = recorded.count();
        ASSERT_EQ(recorded.queue->start(), kSuccess);
        ASSERT_TRUE(eventually([&] { return recorded.count() > before; })) << round;
        ASSERT_EQ(recorded.queue->stop(), kSuccess);
        const std::size_t stopped = recorded.count();
        world_->pass(0.1);
        // One was in progress at most.
        EXPECT_LE(recorded.count(), stopped + 1);
    }
    // Samples are counted from the last start.
    const std::size_t before = recorded.count();
    ASSERT_EQ(recorded.queue->start(), kSuccess);
    ASSERT_TRUE(eventually([&] { return recorded.count() > before; }));
    EXPECT_LT(recorded.pieces()[before].start.sampleTime, 44100);
}

TEST_P(AudioInputQueueContract, ABufferThatWasFilledBeforeAStopIsStillEnqueued) {
    // The first callback stops the queue, with many more filled by then.
    std::atomic<bool> stops{true};
    Recorded recorded(queues(), [&](Recorded& self, const AudioQueueBufferRef&) {
        if (stops.exchange(false)) self.queue->stop();
    });
    const auto buffers = recorded.enqueue(60, 4);
    ASSERT_EQ(recorded.queue->start(), kSuccess);
    ASSERT_TRUE(eventually([&] { return recorded.count() == 1; }));
    world_->pass(0.1);
    EXPECT_EQ(recorded.count(), 1u);
    EXPECT_EQ(recorded.queue->enqueueBuffer(buffers[30]), kBadBuffer);
    ASSERT_EQ(recorded.queue->start(), kSuccess);
    ASSERT_TRUE(eventually([&] { return recorded.count() == 60; }));
    const auto pieces = recorded.pieces();
    for (std::size_t i = 0; i < 60; ++i) EXPECT_EQ(pieces[i].buffer, buffers[i]) << i;
}

TEST_P(AudioInputQueueContract, ABufferThatIsFreedIsNotHandedOver) {
    AudioQueueBufferRef victim;
    Recorded recorded(queues(), [&](Recorded& self, const AudioQueueBufferRef&) {
        if (const auto freed = std::exchange(victim, nullptr)) self.queue->freeBuffer(freed);
    });
    const auto buffers = recorded.enqueue(20, 4);
    victim = buffers[10];
    ASSERT_EQ(recorded.queue->start(), kSuccess);
    ASSERT_TRUE(eventually([&] { return recorded.count() == 19; }));
    for (const auto& piece : recorded.pieces()) EXPECT_NE(piece.buffer, buffers[10]);
}

TEST_P(AudioInputQueueContract, OperationsWaitForNoCallback) {
    std::promise<void> entered, leave;
    auto left = leave.get_future().share();
    std::atomic<bool> first{true};
    Recorded recorded(queues(), [&, left](Recorded&, const AudioQueueBufferRef&) {
        if (!first.exchange(false)) return;
        entered.set_value();
        left.wait();
    });
    recorded.enqueue(6, 882);
    ASSERT_EQ(recorded.queue->start(), kSuccess);
    auto inside = entered.get_future();
    ASSERT_TRUE(eventually([&] { return inside.wait_for(std::chrono::seconds(0)) == std::future_status::ready; }));
    // Each returns although the queue's thread is in a callback, that does not end before they have.
    AudioQueueBufferRef buffer;
    EXPECT_EQ(recorded.queue->allocateBuffer(882, buffer), kSuccess);
    EXPECT_EQ(recorded.queue->enqueueBuffer(buffer), kSuccess);
    EXPECT_EQ(recorded.queue->freeBuffer(buffer), kSuccess);
    EXPECT_EQ(recorded.queue->addIsRunningListener([] {}), kSuccess);
    EXPECT_EQ(recorded.queue->stop(), kSuccess);
    EXPECT_EQ(recorded.queue->start(), kSuccess);
    EXPECT_EQ(recorded.queue->dispose(), kSuccess);
    leave.set_value();
    EXPECT_TRUE(eventually([&] { return recorded.isCallbackLetGo(); }));
    EXPECT_EQ(recorded.count(), 1u);
}

TEST_P(AudioInputQueueContract, DisposingLetsGoOfEverythingAndAnswersSoFromThenOn) {
    Recorded recorded(queues(), giveBack);
    auto buffers = recorded.enqueue(3, 8820);
    const auto held = std::make_shared<int>(0);
    ASSERT_EQ(recorded.queue->addIsRunningListener([held] {}), kSuccess);
    ASSERT_EQ(recorded.queue->start(), kSuccess);
    world_->pass(0.1);
    ASSERT_EQ(recorded.queue->dispose(), kSuccess);
    const std::size_t before = recorded.count();
    EXPECT_TRUE(eventually([&] { return recorded.isCallbackLetGo() && held.use_count() == 1; }));
    world_->pass(0.1);
    EXPECT_LE(recorded.count(), before + 1);

    AudioInputQueue& queue = *recorded.queue;
    AudioFormat untouched = format(1, 2, 3, 4);
    std::uint32_t bytes = 99;
    AudioQueueBufferRef buffer;
    EXPECT_EQ(queue.setProcessTap(world_->quiet()), kDisposed);
    EXPECT_EQ(queue.streamFormat(untouched), kDisposed);
    EXPECT_EQ(queue.maximumOutputPacketSize(bytes), kDisposed);
    EXPECT_EQ(queue.allocateBuffer(100, buffer), kDisposed);
    EXPECT_EQ(queue.enqueueBuffer(buffers[0]), kDisposed);
    EXPECT_EQ(queue.freeBuffer(buffers[0]), kDisposed);
    EXPECT_EQ(queue.addIsRunningListener([] {}), kDisposed);
    EXPECT_EQ(queue.removeIsRunningListener(), kDisposed);
    EXPECT_EQ(queue.start(), kDisposed);
    EXPECT_EQ(queue.stop(), kDisposed);
    EXPECT_EQ(queue.dispose(), kDisposed);
    EXPECT_EQ(untouched, format(1, 2, 3, 4));
    EXPECT_EQ(bytes, 99u);
    EXPECT_EQ(buffer, nullptr);
}

TEST_P(AudioInputQueueContract, AQueueCanBeStoppedAndDisposedOfWithinItsCallback) {
    std::atomic<int> stopped{-100}, disposed{-100};
    Recorded recorded(queues(), [&](Recorded& self, const AudioQueueBufferRef&) {
        if (stopped == -100) stopped = self.queue->stop();
        disposed = self.queue->dispose();
    });
    recorded.enqueue(10, 882);
    ASSERT_EQ(recorded.queue->start(), kSuccess);
    EXPECT_TRUE(eventually([&] { return disposed == kSuccess; }));
    EXPECT_EQ(stopped, kSuccess);
    EXPECT_TRUE(eventually([&] { return recorded.isCallbackLetGo(); }));
    EXPECT_EQ(recorded.count(), 1u);
}

TEST_P(AudioInputQueueContract, ReleasingTheLastReferenceDisposesOfItAlsoWithinItsCallback) {
    {
        Recorded recorded(queues());
        recorded.enqueue(10, 882);
        ASSERT_EQ(recorded.queue->start(), kSuccess);
        recorded.queue.reset();
        EXPECT_TRUE(eventually([&] { return recorded.isCallbackLetGo(); }));
    }
    Recorded recorded(queues(), [](Recorded& self, const AudioQueueBufferRef&) { self.queue.reset(); });
    recorded.enqueue(1, 882);
    const std::weak_ptr<AudioInputQueue> weak = recorded.queue;
    ASSERT_EQ(weak.lock()->start(), kSuccess);
    EXPECT_TRUE(eventually([&] { return weak.expired() && recorded.isCallbackLetGo(); }));
    EXPECT_EQ(recorded.count(), 1u);
}

TEST_P(AudioInputQueueContract, WithoutACaptureClockNothingIsHandedOver) {
    const auto fresh = GetParam()();
    Recorded recorded(fresh->queues());
    recorded.enqueue(10, 882);
    ASSERT_EQ(recorded.queue->start(), kSuccess);
    fresh->pass(0.3);
    EXPECT_EQ(recorded.count(), 0u);
}

INSTANTIATE_TEST_SUITE_P(Fake, AudioInputQueueContract, ::testing::Values(Maker([]() -> std::unique_ptr<test::SoundWorld> {
                             return std::make_unique<test::FakeSoundWorld>();
                         })));
INSTANTIATE_TEST_SUITE_P(Port, AudioInputQueueContract, ::testing::Values(Maker([]() -> std::unique_ptr<test::SoundWorld> {
                             return std::make_unique<test::PortSoundWorld>();
                         })));
INSTANTIATE_TEST_SUITE_P(Headless, AudioInputQueueContract, ::testing::Values(Maker([]() -> std::unique_ptr<test::SoundWorld> {
                             return std::make_unique<test::HeadlessSoundWorld>();
                         })));

}  // namespace
}  // namespace lumacast
