// Who is told that an audio queue runs, and what its stop and its end leave behind.

#include <atomic>
#include <chrono>
#include <future>
#include <memory>
#include <thread>
#include <utility>

#include "tests/contract/AudioInputQueueFixture.h"

namespace lumacast {
namespace {

using namespace AudioStatus;
using test::AudioInputQueueContract;
using test::format;
using test::giveBack;
using test::Recorded;

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

}  // namespace
}  // namespace lumacast
