// How a tap is stopped, replaced, and left behind.

#include "tests/unit/capture/CaptureWorld.h"

namespace lumacast {
namespace {

using AppAudioTapEnd = CaptureWorld;

TEST_F(AppAudioTapEnd, AStopFreesTheBuffersAndDisposesOfTheQueue) {
    start();
    screenHasBegun();
    fakes_.logSink.clear();
    const auto tapped = queue();
    manager_->stopAppAudioCapture();
    Lines expected{"LCRecordingManager:stopAudioCapture: Audio Queue successfully stopped"};
    expected.insert(expected.end(), 10, "LCRecordingManager: Audio Queue buffer released");
    expected.emplace_back("LCRecordingManager: Audio Queue has been disposed");
    EXPECT_EQ(fakes_.logSink.logged(), expected);
    EXPECT_TRUE(tapped->isDisposed());
    EXPECT_FALSE(manager_->audioRecorderQueue());
    fakes_.logSink.clear();
    manager_->stopAppAudioCapture();
    EXPECT_TRUE(fakes_.logSink.logged().empty());
}

TEST_F(AppAudioTapEnd, AStopThatFailsGoesOnToForgetTheTap) {
    start();
    const std::weak_ptr<AudioRecorderState> recorder = manager_->audioRecorderQueue();
    fakes_.logSink.clear();
    fakes_.faults.failNext("AudioInputQueue.stop");
    manager_->stopAppAudioCapture();
    EXPECT_EQ(fakes_.logSink.logged(), Lines{"LCRecordingManager:stopAudioCapture:error: -99"});
    EXPECT_FALSE(manager_->audioRecorderQueue());
    screenHasBegun();
    while (hear()) {
    }
    EXPECT_TRUE(samples_.empty());
    EXPECT_TRUE(recorder.expired()) << "released when its queue has run dry";
}

TEST_F(AppAudioTapEnd, AStopThatFailsTakesTheListenerOffAllTheSame) {
    // A queue that has not said that it runs still has its listener.
    fakes_.faults.failNext("AudioInputQueue.start");
    start();
    const auto recorder = manager_->audioRecorderQueue();
    ASSERT_TRUE(queue()->hasListener());
    fakes_.faults.failNext("AudioInputQueue.stop");
    manager_->stopAppAudioCapture();
    EXPECT_FALSE(recorder->isRunning);
    EXPECT_FALSE(queue()->hasListener());
    EXPECT_EQ(didStart_, 0);
}

TEST_F(AppAudioTapEnd, FailuresToFreeAndToDisposeAreLogged) {
    start();
    fakes_.logSink.clear();
    fakes_.faults.failNext("AudioInputQueue.freeBuffer", 2);
    fakes_.faults.failNext("AudioInputQueue.dispose");
    const auto tapped = queue();
    manager_->stopAppAudioCapture();
    EXPECT_EQ(logged("LCRecordingManager: error: -99"), 3u);
    EXPECT_EQ(logged("LCRecordingManager: Audio Queue buffer released"), 8u);
    EXPECT_EQ(logged("LCRecordingManager: Audio Queue has been disposed"), 0u);
    EXPECT_FALSE(manager_->audioRecorderQueue());
    tapped->dispose();
}

TEST_F(AppAudioTapEnd, BuffersOfATapThatWasStoppedAreDroppedWithoutALine) {
    start();
    screenHasBegun();
    manager_->audioDispatchQueue()->async([&] {
        ASSERT_TRUE(queue()->deliver(Data(100, 1), 0));
        // By then the callback has been, and its work waits behind this task.
        queue()->lane().sync([] {});
        manager_->stopAppAudioCapture();
        fakes_.logSink.clear();
    });
    settle();
    EXPECT_TRUE(samples_.empty());
    EXPECT_TRUE(fakes_.logSink.logged().empty());
}

TEST_F(AppAudioTapEnd, AStartReplacesATapWithoutStoppingItAndTheOldOneEndsWhenItHasRunDry) {
    start();
    screenHasBegun();
    const auto old = queue();
    const std::weak_ptr<AudioRecorderState> recorder = manager_->audioRecorderQueue();
    start(ProcessID{501});
    EXPECT_EQ(fakes_.audioInputQueues.queues().size(), 2u);
    EXPECT_TRUE(old->isRunning());
    for (int i = 0; i < 10; ++i) {
        EXPECT_TRUE(old->deliver(Data(100, 1), 0));
        settle();
    }
    EXPECT_TRUE(samples_.empty());
    EXPECT_TRUE(old->isDisposed());
    EXPECT_TRUE(recorder.expired());
    EXPECT_TRUE(hear());
    EXPECT_EQ(samples_.size(), 1u);
}

TEST_F(AppAudioTapEnd, ATapThatStalledIsDisposedOfWhenItIsReplaced) {
    start();
    while (hear()) {
    }
    const std::weak_ptr<AudioRecorderState> recorder = manager_->audioRecorderQueue();
    start();
    EXPECT_TRUE(recorder.expired());
    EXPECT_EQ(fakes_.audioInputQueues.queues().size(), 1u);
}

TEST_F(AppAudioTapEnd, ABufferThatTheQueueDoesNotTakeBackIsNotWaitedFor) {
    start();
    screenHasBegun();
    const auto old = queue();
    fakes_.faults.failNext("AudioInputQueue.enqueueBuffer");
    fakes_.logSink.clear();
    hear();
    EXPECT_EQ(samples_.size(), 1u);
    EXPECT_TRUE(fakes_.logSink.logged().empty());
    start(ProcessID{501});
    for (int i = 0; i < 9; ++i) {
        EXPECT_TRUE(old->deliver(Data(100, 1), 0));
        settle();
    }
    EXPECT_TRUE(old->isDisposed());
}

TEST_F(AppAudioTapEnd, AReplacedTapThatIsNeverFilledEndsWithTheNextStop) {
    start();
    screenHasBegun();
    const std::weak_ptr<AudioRecorderState> recorder = manager_->audioRecorderQueue();
    start(ProcessID{501});
    manager_->stopAllCapture();
    EXPECT_TRUE(recorder.expired());
    settle();
    EXPECT_TRUE(fakes_.audioInputQueues.queues().empty());
}

TEST_F(AppAudioTapEnd, ATapThatRefusesToStopEndsWithTheNextStop) {
    start();
    const std::weak_ptr<AudioRecorderState> recorder = manager_->audioRecorderQueue();
    fakes_.faults.failNext("AudioInputQueue.stop");
    manager_->stopAppAudioCapture();
    EXPECT_FALSE(recorder.expired());
    EXPECT_TRUE(queue()->isRunning());
    EXPECT_FALSE(manager_->audioRecorderQueue());
    manager_->stopAppAudioCapture();
    EXPECT_TRUE(recorder.expired());
}

TEST_F(AppAudioTapEnd, TheDidStartHandlerIsNotCalledForATapThatWasStopped) {
    manager_->startAppAudioCaptureForProcessID(kPlayer, keep(), [this] { ++didStart_; });
    manager_->stopAppAudioCapture();
    settle();
    EXPECT_EQ(didStart_, 0);
    start();
    EXPECT_EQ(didStart_, 1);
}

TEST_F(AppAudioTapEnd, AResumeHasNoDidStartHandler) {
    start();
    manager_->stopAppAudioCapture();
    resume();
    EXPECT_EQ(didStart_, 1);
    EXPECT_FALSE(manager_->appTapDidStartHandler());
}

TEST_F(AppAudioTapEnd, AStopFromWithinAHandlerIsLegal) {
    manager_->startAppAudioCaptureForProcessID(
        kPlayer, [this](const SampleRef&) { manager_->stopAllCapture(); }, {});
    settle();
    screenHasBegun();
    hear();
    EXPECT_FALSE(manager_->audioRecorderQueue());
    EXPECT_FALSE(manager_->appAudioOutputHandler());
    EXPECT_EQ(compare(manager_->captureStartTime(), kInvalidMediaTime), 0);
}

}  // namespace
}  // namespace lumacast
