#include "tests/unit/capture/CaptureWorld.h"

namespace lumacast {
namespace {

using AppAudioTap = CaptureWorld;

TEST_F(AppAudioTap, AStartMakesTenBuffersAndSaysSoStepByStep) {
    start();
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"LCRecordingManager: startAudioCapture: Created Audio Queue Input",
                     "LCRecordingManager: startAudioCapture: Successfully set Audio Queue to PID",
                     "LCRecordingManager: startAudioCapture: Successfully started Audio Queue Recording"}));
    EXPECT_EQ(queue()->process(), kPlayer);
    EXPECT_EQ(queue()->enqueuedBuffers(), 10u);
    EXPECT_EQ(queue()->bufferBytes(), 57344u);
    EXPECT_EQ(fakes_.audioInputQueues.lastFlags(), 0x800u);
    const auto recorder = manager_->audioRecorderQueue();
    ASSERT_TRUE(recorder);
    EXPECT_TRUE(recorder->isRunning);
    EXPECT_EQ(recorder->format, manager_->audioBasicDescription());
    EXPECT_EQ(recorder->audioFile, nullptr);
    EXPECT_EQ(didStart_, 1);
    EXPECT_FALSE(queue()->hasListener()) << "it fires once";
}

TEST_F(AppAudioTap, TheFormatAskedForIsBigEndianMono) {
    const AudioFormat format = manager_->audioBasicDescription();
    EXPECT_EQ(format.sampleRate, 44100.0);
    EXPECT_EQ(format.formatID, kAudioFormatLinearPCM);
    EXPECT_EQ(format.formatFlags, 14u);
    EXPECT_EQ(format.bytesPerPacket, 2u);
    EXPECT_EQ(format.framesPerPacket, 1u);
    EXPECT_EQ(format.bytesPerFrame, 2u);
    EXPECT_EQ(format.channelsPerFrame, 1u);
    EXPECT_EQ(format.bitsPerChannel, 16u);
    EXPECT_EQ(manager_->initialTimestamp(), (AudioTimeStamp{0.0, 0, 1.0, 0}));
    EXPECT_EQ(manager_->audioDispatchQueue()->label(), "com.orvane.Lumacast.CaptureQueue");
    EXPECT_EQ(manager_->sessionSampleBufferQueue()->label(), "com.orvane.lumacast.capture.session");
}

TEST_F(AppAudioTap, EveryErrorOfAStartIsLoggedAndNoneEndsIt) {
    for (const char* call : {"setProcessTap", "streamFormat", "start"})
        fakes_.faults.failNext(std::string("AudioInputQueue.") + call);
    start();
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"LCRecordingManager: startAudioCapture: Created Audio Queue Input",
                     "LCRecordingManager: startAudioCapture error: -99",
                     "LCRecordingManager: startAudioCapture: Successfully set Audio Queue to PID",
                     "LCRecordingManager: startAudioCapture error: -99",
                     "LCRecordingManager: startAudioCapture error: -99",
                     "LCRecordingManager: startAudioCapture: Successfully started Audio Queue Recording"}));
    EXPECT_EQ(queue()->enqueuedBuffers(), 10u);
    EXPECT_TRUE(manager_->audioRecorderQueue());
}

TEST_F(AppAudioTap, FailuresOfBuffersAndOfTheListenerAreNotLookedAt) {
    fakes_.faults.failNext("AudioInputQueue.allocateBuffer", 3);
    fakes_.faults.failNext("AudioInputQueue.enqueueBuffer");
    fakes_.faults.failNext("AudioInputQueue.addIsRunningListener");
    start();
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"LCRecordingManager: startAudioCapture: Created Audio Queue Input",
                     "LCRecordingManager: startAudioCapture: Successfully set Audio Queue to PID",
                     "LCRecordingManager: startAudioCapture: Successfully started Audio Queue Recording"}));
    EXPECT_EQ(queue()->allocatedBuffers(), 7u);
    EXPECT_EQ(didStart_, 0) << "nobody says that it runs";
    EXPECT_TRUE(manager_->audioRecorderQueue()->isRunning);
}

TEST_F(AppAudioTap, AQueueThatCannotBeMadeIsStartedAndStoppedAllTheSame) {
    fakes_.faults.failNext("AudioInputQueues.makeInputQueue");
    start();
    EXPECT_EQ(logged("LCRecordingManager: startAudioCapture error: -8"), 4u);
    EXPECT_EQ(logged("LCRecordingManager: startAudioCapture: Successfully started Audio Queue Recording"), 1u);
    ASSERT_TRUE(manager_->audioRecorderQueue());
    manager_->stopAppAudioCapture();
    EXPECT_EQ(logged("LCRecordingManager:stopAudioCapture:error: -8"), 1u);
    EXPECT_FALSE(manager_->audioRecorderQueue());
    EXPECT_EQ(didStart_, 0);
}

TEST_F(AppAudioTap, WithoutBytesPerPacketTheQueueSaysHowLargeItsPacketsAre) {
    fakes_.audioInputQueues.setMaximumPacketSize(1);
    start();
    EXPECT_EQ(queue()->bufferBytes(), 44100u);
}

TEST_F(AppAudioTap, BuffersOfTheSizeTheQueueSaidAreCappedTooAndAFailureToSayItIsNotLogged) {
    fakes_.audioInputQueues.setMaximumPacketSize(4);
    start();
    EXPECT_EQ(queue()->bufferBytes(), 57344u);
    manager_->stopAppAudioCapture();
    fakes_.logSink.clear();
    fakes_.faults.failNext("AudioInputQueue.maximumOutputPacketSize");
    start();
    EXPECT_EQ(queue()->allocatedBuffers(), 0u) << "of no bytes there is none";
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"LCRecordingManager: startAudioCapture: Created Audio Queue Input",
                     "LCRecordingManager: startAudioCapture: Successfully set Audio Queue to PID",
                     "LCRecordingManager: startAudioCapture: Successfully started Audio Queue Recording"}));
}

TEST_F(AppAudioTap, ABufferBecomesASampleAndGoesBackToTheQueue) {
    start();
    screenHasBegun();
    fakes_.logSink.clear();
    ASSERT_TRUE(hear(1764, 5'000'000, 9));
    ASSERT_EQ(samples_.size(), 1u);
    EXPECT_TRUE(onCaptureQueue_);
    EXPECT_EQ(samples_[0]->format().audio, manager_->audioBasicDescription());
    EXPECT_EQ(samples_[0]->sampleCount(), 882);
    EXPECT_EQ(*samples_[0]->data(), Data(1764, 9));
    EXPECT_EQ(compare(samples_[0]->presentationTime(), MediaTime::make(5, 1000)), 0);
    EXPECT_EQ(compare(samples_[0]->duration(), MediaTime::make(20, 1000)), 0);
    EXPECT_EQ(queue()->enqueuedBuffers(), 10u);
    EXPECT_EQ(manager_->audioRecorderQueue()->currentPacket, 882);
    EXPECT_EQ(fakes_.logSink.logged(),
              Lines{"LCRecordingManager: HandleInputBuffer: Successfully enqueued the audio buffer"});
    EXPECT_DOUBLE_EQ(manager_->lastAudioDate()->secondsSince1970, fakes_.clock.now().secondsSince1970 + 0.02);
}

TEST_F(AppAudioTap, TheSampleHasTheCallbacksCountAndTheTotalTheComputedOne) {
    start();
    screenHasBegun();
    ASSERT_TRUE(queue()->deliver(Data(100, 1), 0, 0));
    settle();
    ASSERT_EQ(samples_.size(), 1u);
    EXPECT_EQ(samples_[0]->sampleCount(), 0);
    EXPECT_EQ(samples_[0]->data()->size(), 100u);
    EXPECT_EQ(manager_->audioRecorderQueue()->currentPacket, 50);
}

TEST_F(AppAudioTap, ASampleThatCannotBeMadeIsCountedAndItsBufferGoesBack) {
    start();
    screenHasBegun();
    ASSERT_TRUE(queue()->deliver(Data(100, 1), 0, 50, {{90, 0, 20}}));
    settle();
    EXPECT_TRUE(samples_.empty());
    EXPECT_FALSE(manager_->lastAudioDate());
    EXPECT_EQ(manager_->audioRecorderQueue()->currentPacket, 50);
    EXPECT_EQ(queue()->enqueuedBuffers(), 10u);
}

TEST_F(AppAudioTap, OnlyTheCallbackLooksAtTheStartTime) {
    start();
    screenHasBegun();
    manager_->audioDispatchQueue()->async([&] {
        ASSERT_TRUE(queue()->deliver(Data(100, 1), 0));
        queue()->lane().sync([] {});  // the callback has been
        manager_->setCaptureStartTime(kInvalidMediaTime);
    });
    settle();
    EXPECT_EQ(samples_.size(), 1u);
    EXPECT_EQ(queue()->enqueuedBuffers(), 10u);
}

TEST_F(AppAudioTap, TheDateIsThereBeforeTheHandlerIsCalled) {
    std::optional<Date> seen;
    manager_->startAppAudioCaptureForProcessID(
        kPlayer, [&](const SampleRef&) { seen = manager_->lastAudioDate(); }, {});
    settle();
    screenHasBegun();
    hear();
    ASSERT_TRUE(seen);
    EXPECT_DOUBLE_EQ(seen->secondsSince1970, fakes_.clock.now().secondsSince1970 + 0.02);
}

TEST_F(AppAudioTap, UntilTheScreenHasBegunTheBuffersAreLostAndAfterTenTheTapStallsForGood) {
    start();
    for (int i = 0; i < 10; ++i) EXPECT_TRUE(hear());
    EXPECT_FALSE(hear());
    screenHasBegun();
    EXPECT_FALSE(hear());
    EXPECT_TRUE(samples_.empty());
    EXPECT_EQ(queue()->enqueuedBuffers(), 0u);
    EXPECT_FALSE(queue()->isDisposed()) << "it is still the current one";
}

TEST_F(AppAudioTap, AResumeAfterSilenceDeliversSilenceFirst) {
    start();
    screenHasBegun();
    hear(2, 1);
    samples_.clear();
    manager_->stopAppAudioCapture();
    advance(std::chrono::milliseconds(2500));
    manager_->setLastAudioDate(Date{fakes_.clock.now().secondsSince1970 - 2.5});
    fakes_.logSink.clear();
    resume();
    hear(1764, 9, 3);
    ASSERT_EQ(samples_.size(), 2u);
    EXPECT_EQ(samples_[0]->sampleCount(), 110250);
    EXPECT_EQ(*samples_[0]->data(), Data(220500, 0));
    EXPECT_EQ(samples_[0]->duration().value, 110250);
    EXPECT_EQ(samples_[0]->duration().timescale, 44100);
    EXPECT_EQ(compare(samples_[0]->presentationTime(), kZeroMediaTime), 0);
    EXPECT_FALSE(samples_[0]->timing()[0].decode.isValid());
    EXPECT_EQ(samples_[1]->data()->front(), 3);
    EXPECT_EQ(logged("gap since last audio tap, filling with empty sample buffer"), 1u);
    hear();
    EXPECT_EQ(samples_.size(), 3u) << "once";
}

TEST_F(AppAudioTap, AResumeWithoutAnythingBeforeOrWithoutAGapInsertsNothing) {
    screenHasBegun();
    resume();
    hear();
    EXPECT_EQ(samples_.size(), 1u);
    EXPECT_FALSE(manager_->isResumed());
    manager_->stopAppAudioCapture();
    manager_->setLastAudioDate(Date{fakes_.clock.now().secondsSince1970 + 1});
    resume();
    hear();
    EXPECT_EQ(samples_.size(), 2u);
    EXPECT_EQ(logged("gap since last audio tap, filling with empty sample buffer"), 0u);
}

TEST_F(AppAudioTap, AGapOfNoLengthIsNoGap) {
    screenHasBegun();
    manager_->setLastAudioDate(fakes_.clock.now());
    resume();
    hear();
    EXPECT_EQ(samples_.size(), 1u);
    EXPECT_FALSE(manager_->isResumed());
    EXPECT_EQ(logged("gap since last audio tap, filling with empty sample buffer"), 0u);
}

TEST_F(AppAudioTap, AResumeCountsFromItsCallOn) {
    manager_->resumeAppAudioCaptureForProcessID(kPlayer, keep());
    EXPECT_TRUE(manager_->isResumed()) << "before the tap has been started";
    settle();
    hear();
    EXPECT_TRUE(manager_->isResumed()) << "a buffer that is lost leaves it";
}

TEST_F(AppAudioTap, ABufferOfAReplacedTapLeavesTheGapToTheNewOne) {
    start();
    screenHasBegun();
    const auto old = queue();
    manager_->setLastAudioDate(Date{fakes_.clock.now().secondsSince1970 - 1});
    resume(ProcessID{501});
    ASSERT_TRUE(old->deliver(Data(100, 1), 0));
    settle();
    EXPECT_TRUE(samples_.empty());
    EXPECT_TRUE(manager_->isResumed());
    hear();
    EXPECT_EQ(samples_.size(), 2u);
}

TEST_F(AppAudioTap, SilenceIsInTheFormatAskedForWhateverTheQueueDelivers) {
    fakes_.audioInputQueues.setMaximumPacketSize(2);
    screenHasBegun();
    manager_->setLastAudioDate(Date{fakes_.clock.now().secondsSince1970 - 1});
    resume();
    hear();
    ASSERT_EQ(samples_.size(), 2u);
    EXPECT_EQ(samples_[0]->format().audio, manager_->audioBasicDescription());
    EXPECT_EQ(samples_[1]->format().audio.bytesPerPacket, 0u);
}

TEST_F(AppAudioTap, TheSilenceComesBeforeTheLookAtTheRecorder) {
    start();
    screenHasBegun();
    manager_->setLastAudioDate(Date{fakes_.clock.now().secondsSince1970 - 1});
    manager_->setResumed(true);
    manager_->audioRecorderQueue()->isRunning = false;
    hear();
    EXPECT_EQ(samples_.size(), 1u) << "the silence";
    EXPECT_EQ(logged("recorder is not running, ignoring audio data"), 1u);
    EXPECT_EQ(queue()->enqueuedBuffers(), 9u) << "the buffer stays out";
}

TEST(SilentSample, OfAFormatWithoutFramesPerPacketThereIsNone) {
    AudioFormat format{.sampleRate = 44100, .formatID = kAudioFormatLinearPCM, .bytesPerPacket = 2, .bytesPerFrame = 2};
    EXPECT_FALSE(makeSilentSample(format, 1, kZeroMediaTime));
    format.framesPerPacket = 2;
    const auto half = makeSilentSample(format, 1, kZeroMediaTime);
    ASSERT_TRUE(half);
    EXPECT_EQ(half->sampleCount(), 22050);
    EXPECT_EQ(half->data()->size(), 44100u);
    format.bytesPerFrame = 0;
    EXPECT_EQ(makeSilentSample(format, 1, kZeroMediaTime)->data()->size(), 22050u) << "a byte a sample";
    EXPECT_FALSE(makeSilentSample(format, 0, kZeroMediaTime));
    EXPECT_FALSE(makeSilentSample(format, 601, kZeroMediaTime)) << "more than any interruption is worth";
}

TEST(SilentSample, IsCountedAt44100ASecondWhateverTheFormatsRateAndCutToWholeSamples) {
    const AudioFormat format{.sampleRate = 48000,
                             .formatID = kAudioFormatLinearPCM,
                             .bytesPerPacket = 4,
                             .framesPerPacket = 1,
                             .bytesPerFrame = 2};
    const auto silence = makeSilentSample(format, 2.99999 / 44100, MediaTime::make(7, 10));
    ASSERT_TRUE(silence);
    EXPECT_EQ(silence->sampleCount(), 2);
    EXPECT_EQ(silence->data()->size(), 8u) << "as large as a packet is, not as a frame";
    EXPECT_EQ(silence->duration().timescale, 44100);
    EXPECT_EQ(compare(silence->presentationTime(), MediaTime::make(7, 10)), 0);
    EXPECT_EQ(makeSilentSample(format, 1, kZeroMediaTime)->sampleCount(), 44100);
}

}  // namespace
}  // namespace lumacast
