#include "tests/unit/capture/CaptureWorld.h"

namespace lumacast {
namespace {

class Microphone : public CaptureWorld {
protected:
    void startMicrophone() {
        manager_->startMicrophoneCaptureWithOutput([this](const SampleRef& s) { samples_.push_back(s); },
                                                   [this] { ++didStart_; });
        settle();
    }
    std::shared_ptr<FakeDeviceCaptureSession> session() { return fakes_.deviceCapture.lastSession(); }
    /// 20 ms of sound at a time, in milliseconds.
    SampleRef sound(std::int64_t at) {
        return SampleBuffer::makeAudio(manager_->audioBasicDescription(), Data(1764, 5), 882,
                                       {MediaTime::make(20, 1000), MediaTime::make(at, 1000), kInvalidMediaTime});
    }
    void speak(std::int64_t at) {
        session()->deliver(sound(at));
        settle();
    }
};

TEST_F(Microphone, ThereIsNoneToOffer) { EXPECT_FALSE(manager_->hasAudioCaptureDevice()); }

TEST_F(Microphone, TheManagerPlaysAndRecordsAndMixesWithOthers) {
    EXPECT_EQ(fakes_.deviceCapture.sharedAudioSession().category(), AudioSession::kPlayAndRecord);
    EXPECT_EQ(fakes_.deviceCapture.sharedAudioSession().options(), 5u);
    EXPECT_EQ(fakes_.deviceCapture.sharedAudioSession().observerCount(), 1u);
    auto other = LCCaptureManager::init(fakes_.platform());
    EXPECT_EQ(fakes_.deviceCapture.sharedAudioSession().observerCount(), 2u);
    other.reset();
    EXPECT_EQ(fakes_.deviceCapture.sharedAudioSession().observerCount(), 1u);
}

TEST_F(Microphone, AStartMakesASessionAndTellsOnceThatItRuns) {
    startMicrophone();
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"LCCaptureManager: setAudioCaptureEnabled: YES", "LCCaptureManager: startCaptureSession"}));
    ASSERT_TRUE(session());
    EXPECT_TRUE(session()->usesApplicationAudioSession);
    EXPECT_FALSE(session()->configuresAutomatically);
    EXPECT_TRUE(session()->isRunning());
    EXPECT_EQ(session()->inputCount(), 1u);
    EXPECT_EQ(session()->outputCount(), 1u);
    EXPECT_TRUE(manager_->isRecordingMicrophone());
    EXPECT_TRUE(manager_->sessionInProgress());
    EXPECT_EQ(didStart_, 1);
    EXPECT_EQ(session()->observed(), Lines{"running"}) << "removed under another key path, which fails";
    session()->stopRunning();
    settle();
    EXPECT_EQ(didStart_, 1);
}

TEST_F(Microphone, AStopEndsTheSessionOfAStartThatIsStillUnderWay) {
    manager_->startMicrophoneCaptureWithOutput([this](const SampleRef& s) { samples_.push_back(s); },
                                               [this] { ++didStart_; });
    ASSERT_FALSE(session()) << "it has not got so far yet";
    manager_->stopAllCapture();
    settle();
    EXPECT_FALSE(manager_->isRecordingMicrophone());
    EXPECT_FALSE(manager_->sessionInProgress());
    EXPECT_FALSE(session() && session()->isRunning());
}

TEST_F(Microphone, ASecondStartKeepsTheFirstHandlers) {
    startMicrophone();
    int others = 0;
    manager_->startMicrophoneCaptureWithOutput([&](const SampleRef&) { ++others; }, [&] { ++others; });
    settle();
    speak(0);
    EXPECT_EQ(samples_.size(), 1u);
    EXPECT_EQ(others, 0);
    EXPECT_EQ(logged("LCCaptureManager: setAudioCaptureEnabled: YES"), 1u);
}

TEST_F(Microphone, AStopLeavesTheSessionRunningAndANewStartIsToldAtOnce) {
    startMicrophone();
    manager_->stopMicrophoneCapture();
    EXPECT_EQ(logged("LCCaptureManager: setAudioCaptureEnabled: NO"), 1u);
    EXPECT_EQ(session()->inputCount(), 0u);
    EXPECT_EQ(session()->outputCount(), 0u);
    EXPECT_TRUE(session()->isRunning());
    EXPECT_FALSE(manager_->isRecordingMicrophone());
    manager_->stopMicrophoneCapture();
    EXPECT_EQ(logged("LCCaptureManager: setAudioCaptureEnabled: NO"), 1u);
    startMicrophone();
    EXPECT_EQ(didStart_, 2);
    EXPECT_FALSE(manager_->micDidStartHandler());
}

TEST_F(Microphone, AStopForgetsNothingOfWhatWasHeard) {
    startMicrophone();
    speak(1000);
    manager_->handleAudioSessionInterruption(1);
    const auto date = manager_->lastMicAudioDate();
    manager_->stopMicrophoneCapture();
    EXPECT_TRUE(manager_->micInterrupted());
    EXPECT_TRUE(date);
    EXPECT_EQ(manager_->lastMicAudioDate(), date);
    EXPECT_EQ(compare(manager_->micInterruptionPresentationTimeStamp(), MediaTime::make(1020, 1000)), 0);
    EXPECT_TRUE(manager_->microphoneOutputHandler());
    // A start without a handler keeps the one before.
    manager_->startMicrophoneCaptureWithOutput({}, {});
    settle();
    samples_.clear();
    manager_->setMicInterrupted(false);
    speak(2000);
    EXPECT_EQ(samples_.size(), 1u);
}

TEST_F(Microphone, OnlyTheKeyPathThatIsObservedTellsOfTheStart) {
    manager_->setMicDidStartHandler([this] { ++didStart_; });
    manager_->observeValueForKeyPath("isRunning");
    EXPECT_EQ(didStart_, 0);
    EXPECT_TRUE(manager_->micDidStartHandler());
    manager_->observeValueForKeyPath("running");
    EXPECT_EQ(didStart_, 1);
    EXPECT_FALSE(manager_->micDidStartHandler());
    manager_->observeValueForKeyPath("running");
    EXPECT_EQ(didStart_, 1);
}

TEST_F(Microphone, StoppingEverythingGoesInOrderAndKeepsTheSessionObject) {
    startMicrophone();
    start();
    screenHasBegun();
    hear();
    speak(0);
    manager_->setCameraOutputHandler([](const SampleRef&) {});
    manager_->setMicInterrupted(true);
    fakes_.logSink.clear();
    manager_->stopAllCapture();
    Lines expected{"LCCaptureManager: stopDeviceCaptureSessionWithFinishHandler",
                   "LCCaptureManager: setAudioCaptureEnabled: NO",
                   "LCRecordingManager:stopAudioCapture: Audio Queue successfully stopped"};
    expected.insert(expected.end(), 10, "LCRecordingManager: Audio Queue buffer released");
    expected.emplace_back("LCRecordingManager: Audio Queue has been disposed");
    EXPECT_EQ(fakes_.logSink.logged(), expected);
    EXPECT_FALSE(session()->isRunning());
    EXPECT_EQ(manager_->captureSession(), session());
    EXPECT_FALSE(manager_->sessionInProgress());
    EXPECT_FALSE(manager_->microphoneOutputHandler());
    EXPECT_FALSE(manager_->cameraOutputHandler());
    EXPECT_FALSE(manager_->appAudioOutputHandler());
    EXPECT_FALSE(manager_->captureStartTime().isValid());
    EXPECT_FALSE(manager_->lastAudioDate());
    EXPECT_FALSE(manager_->lastMicAudioDate());
    EXPECT_TRUE(manager_->micInterrupted()) << "that stays";
    EXPECT_TRUE(manager_->micInterruptionPresentationTimeStamp().isValid());
    fakes_.logSink.clear();
    manager_->stopAllCapture();
    EXPECT_EQ(fakes_.logSink.logged(), Lines{"LCCaptureManager: stopDeviceCaptureSessionWithFinishHandler"});
}

TEST_F(Microphone, ANewSessionTakesTheManagerOffTheOldOne) {
    startMicrophone();
    const auto old = session();
    manager_->stopAllCapture();
    EXPECT_EQ(old->observed(), Lines{"running"});
    manager_->startCaptureSession();
    EXPECT_NE(manager_->captureSession(), old);
    EXPECT_TRUE(old->observed().empty());
    manager_->startCaptureSession();
    EXPECT_EQ(logged("LCCaptureManager: startCaptureSession"), 3u) << "said also when there is nothing to do";
}

TEST_F(Microphone, AnInterruptionIsFilledWithSilenceFromTheEndOfTheLastSample) {
    startMicrophone();
    speak(1000);
    manager_->handleAudioSessionInterruption(1);
    manager_->handleAudioSessionInterruption(0);
    manager_->setLastMicAudioDate(Date{fakes_.clock.now().secondsSince1970 - 1.2});
    speak(2220);
    ASSERT_EQ(samples_.size(), 3u);
    EXPECT_EQ(compare(samples_[1]->presentationTime(), MediaTime::make(1020, 1000)), 0);
    EXPECT_EQ(samples_[1]->duration().timescale, 44100);
    EXPECT_NEAR(samples_[1]->duration().seconds(), 1.2, 1e-4);
    EXPECT_NEAR(static_cast<double>(samples_[1]->sampleCount()), 52920, 1);
    EXPECT_EQ(*samples_[1]->data(), Data(samples_[1]->data()->size(), 0));
    EXPECT_EQ(compare(samples_[2]->presentationTime(), MediaTime::make(2220, 1000)), 0);
    EXPECT_EQ(logged("LCCaptureManager: SoundRouteInterruptionTypeBegan"), 1u);
    EXPECT_EQ(logged("LCCaptureManager: SoundRouteInterruptionTypeEnded"), 1u);
    EXPECT_EQ(logged("gap since last mic tap, filling with empty sample buffer"), 1u);
}

TEST_F(Microphone, AnInterruptionBeforeAnySampleClearsTheFlagAndInsertsNothing) {
    startMicrophone();
    fakes_.deviceCapture.sharedAudioSession().interrupt(1);
    EXPECT_TRUE(manager_->micInterrupted());
    speak(0);
    EXPECT_FALSE(manager_->micInterrupted());
    EXPECT_EQ(samples_.size(), 1u);
}

TEST_F(Microphone, AnInterruptionWithoutAGapClearsTheFlagAndInsertsNothing) {
    startMicrophone();
    for (const double ahead : {0.0, 1.0}) {
        manager_->handleAudioSessionInterruption(1);
        manager_->setLastMicAudioDate(Date{fakes_.clock.now().secondsSince1970 + ahead});
        samples_.clear();
        speak(0);
        EXPECT_EQ(samples_.size(), 1u) << ahead;
        EXPECT_FALSE(manager_->micInterrupted()) << ahead;
    }
    EXPECT_EQ(logged("gap since last mic tap, filling with empty sample buffer"), 0u);
}

TEST_F(Microphone, TheEndOfAnInterruptionChangesNothing) {
    manager_->handleAudioSessionInterruption(0);
    EXPECT_FALSE(manager_->micInterrupted());
    manager_->handleAudioSessionInterruption(1);
    manager_->handleAudioSessionInterruption(0);
    EXPECT_TRUE(manager_->micInterrupted());
}

TEST_F(Microphone, WhereTheNextSampleBeginsIsNotedBeforeTheHandlerIsCalledAndAfterTheSilence) {
    std::vector<std::pair<std::optional<Date>, MediaTime>> seen;
    const auto handler = [&](const SampleRef&) {
        EXPECT_TRUE(manager_->sessionSampleBufferQueue()->isCurrent());
        seen.emplace_back(manager_->lastMicAudioDate(), manager_->micInterruptionPresentationTimeStamp());
    };
    manager_->startMicrophoneCaptureWithOutput(handler, {});
    settle();
    speak(1000);
    manager_->handleAudioSessionInterruption(1);
    const Date before{fakes_.clock.now().secondsSince1970 - 2}, after{fakes_.clock.now().secondsSince1970 + 0.02};
    manager_->setLastMicAudioDate(before);
    speak(3020);
    ASSERT_EQ(seen.size(), 3u);
    EXPECT_DOUBLE_EQ(seen[0].first->secondsSince1970, after.secondsSince1970);
    EXPECT_EQ(compare(seen[0].second, MediaTime::make(1020, 1000)), 0);
    EXPECT_EQ(seen[1].first, before) << "the silence changes nothing";
    EXPECT_EQ(compare(seen[1].second, MediaTime::make(1020, 1000)), 0);
    EXPECT_DOUBLE_EQ(seen[2].first->secondsSince1970, after.secondsSince1970);
    EXPECT_EQ(compare(seen[2].second, MediaTime::make(3040, 1000)), 0);
}

TEST_F(Microphone, WithoutAHandlerTheInterruptionIsRemembered) {
    manager_->handleAudioSessionInterruption(1);
    manager_->setLastMicAudioDate(Date{fakes_.clock.now().secondsSince1970 - 5});
    manager_->checkAndHandleMicInterruption();
    EXPECT_TRUE(manager_->micInterrupted());
    EXPECT_EQ(logged("gap since last mic tap, filling with empty sample buffer"), 0u);
}

TEST_F(Microphone, OtherKindsOfInterruptionDoNothing) {
    fakes_.logSink.clear();
    fakes_.deviceCapture.sharedAudioSession().interrupt(2);
    EXPECT_FALSE(manager_->micInterrupted());
    EXPECT_TRUE(fakes_.logSink.logged().empty());
}

TEST_F(Microphone, SamplesGoByTheirOutput) {
    const auto camera = std::make_shared<FakeCaptureOutput>(), unknown = std::make_shared<FakeCaptureOutput>();
    std::vector<SampleRef> pictures;
    manager_->setCaptureSessionVideoDataOutput(camera);
    manager_->captureOutputDidOutputSampleBuffer(camera, sound(0));
    manager_->setCameraOutputHandler([&](const SampleRef& s) { pictures.push_back(s); });
    manager_->captureOutputDidOutputSampleBuffer(camera, sound(1));
    manager_->captureOutputDidOutputSampleBuffer(unknown, sound(2));
    EXPECT_EQ(pictures.size(), 1u);
    startMicrophone();
    manager_->setMicrophoneOutputHandler({});
    speak(3);
    EXPECT_TRUE(samples_.empty());
    EXPECT_FALSE(manager_->lastMicAudioDate()) << "a dropped sample leaves no trace";
}

TEST_F(Microphone, WithoutADeviceOrWhereTheSessionRefusesThereIsSilenceAndNoError) {
    fakes_.deviceCapture.setMicrophone(false);
    startMicrophone();
    EXPECT_EQ(session()->inputCount(), 0u);
    EXPECT_EQ(didStart_, 1);
    manager_->stopAllCapture();
    fakes_.deviceCapture.setAccepts(false);
    startMicrophone();
    EXPECT_EQ(session()->outputCount(), 0u);
    EXPECT_EQ(didStart_, 2);
}

}  // namespace
}  // namespace lumacast
