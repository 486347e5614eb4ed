// Where a session's sound comes from, and where it goes.

#include "tests/fakes/StubExtension.h"
#include "tests/unit/session/SessionWorld.h"

namespace lumacast {
namespace {

constexpr ProcessID kPlayer{500}, kEditor{501};

/// Notes what leaves the session as a payload.
class NotingSession final : public LCRecordingSession {
public:
    using LCRecordingSession::LCRecordingSession;
    struct Sent {
        char where;  ///< 'e'xtension, 'c'apture, 'm'ovie clip
        SampleType type;
        Data bytes;
        bool operator==(const Sent&) const = default;
    };
    std::vector<Sent> sent;
    std::vector<std::string> announced;

protected:
    void _notifyExtensionOfAudioSampleBuffer(const SampleRef& sample, SampleType type) override {
        sent.push_back({'e', type, *sample->data()});
    }
    void packageAudioSampleBufferForCapture(const SampleRef& sample, SampleType type) override {
        sent.push_back({'c', type, *sample->data()});
    }
    void _processAudioSampleBufferForMP4ClipHandler(const SampleRef& sample) override {
        sent.push_back({'m', SampleType::AppAudio, *sample->data()});
    }
    void _notifyExtensionOfFrontmostProcessBundleID(const BundleIdentifier& id) override {
        announced.push_back(id.text());
    }
};

class SessionAudio : public SessionWorld {
protected:
    SessionAudio() {
        fakes_.bundles.installApplication(BundleIdentifier("org.example.Editor"), "Editor");
        fakes_.bundles.run(kPlayer, id_);
        fakes_.bundles.run(kEditor, BundleIdentifier("org.example.Editor"));
        noting_ = std::make_shared<NotingSession>(services_, id_);
        session_ = noting_;
        session_->setDelegate(delegate_);
        session_->setContextIDs({kWindow});
        session_->setWindowSize({640, 360});
    }
    void startTapped() {
        session_->setFrontmostPIDForAudioTap(kPlayer);
        start();
        advance(std::chrono::milliseconds(100));
    }
    std::shared_ptr<FakeAudioInputQueue> tap() { return fakes_.audioInputQueues.lastQueue(); }
    void hear(std::uint64_t at = 60'000'000) {
        ASSERT_TRUE(tap() && tap()->deliver(Data(1764, 7), at));
        settle();
    }
    void speak(std::int64_t at = 60'000'000) {
        const auto microphone = fakes_.deviceCapture.lastSession();
        ASSERT_TRUE(microphone);
        microphone->deliver(SampleBuffer::makeAudio(
            captureManager_->audioBasicDescription(), Data(1764, 9), 882,
            {MediaTime::make(20, 1000), MediaTime::make(at, CaptureClock::kTimescale), kInvalidMediaTime}));
        settle();
    }
    std::vector<SampleRef> track(std::size_t index) { return recording().movie().tracks.at(index).samples; }
    UsageMetrics metrics() { return session_->reportingAgent()->metrics(); }
    void retarget(ProcessID pid) {
        onRequestLane([&] { session_->updateProcessIDForAudioCaptureWithPID(pid); });
        settle();
    }

    std::shared_ptr<NotingSession> noting_;
};

TEST_F(SessionAudio, TheTapRunsBeforeTheScreenIsCaptured) {
    session_->setFrontmostPIDForAudioTap(kPlayer);
    start();
    ASSERT_TRUE(tap());
    EXPECT_EQ(tap()->process(), kPlayer);
    EXPECT_TRUE(source()->isRunning());
    EXPECT_EQ(logged("starting capture"), 1u);
    const Lines lines = fakes_.logSink.logged();
    const auto at = [&](std::string_view text) { return std::find(lines.begin(), lines.end(), text) - lines.begin(); };
    EXPECT_LT(at("LCRecordingManager: startAudioCapture: Successfully started Audio Queue Recording"),
              at("starting capture"));
}

TEST_F(SessionAudio, SilenceMayComeLateIntoAMovieAndNowhereElse) {
    struct Case {
        const char* what;
        bool extension, frames, late;
    };
    for (const Case& c : {Case{"movie", false, false, true}, Case{"broadcast", true, false, false},
                          Case{"frames for the client", false, true, false}}) {
        SCOPED_TRACE(c.what);
        session_->setBroadcastExtension(c.extension ? std::make_shared<StubExtension>(BundleIdentifier("org.example.Upload")) : nullptr);
        session_->setCaptureRecording(c.frames);
        startTapped();
        ASSERT_TRUE(tap());
        EXPECT_EQ(tap()->mayBeLateWithSilence(), c.late);
        retarget(kEditor);
        EXPECT_EQ(tap()->process(), kEditor);
        EXPECT_EQ(tap()->mayBeLateWithSilence(), c.late) << "after a change of the process too";
        finish();
    }
}

TEST_F(SessionAudio, WithoutAProcessThereIsNoTap) {
    start();
    EXPECT_EQ(fakes_.audioInputQueues.made(), 0u);
    EXPECT_TRUE(source()->isRunning());
}

TEST_F(SessionAudio, AppAudioIsTheFirstTrackAndTheMicrophoneTheSecond) {
    session_->setMicrophoneEnabled(true);
    startTapped();
    EXPECT_TRUE(session_->haveMicTap());
    hear();
    speak();
    ASSERT_EQ(track(1).size(), 1u);
    ASSERT_EQ(track(2).size(), 1u);
    EXPECT_EQ(*track(1)[0]->data(), Data(1764, 7));
    EXPECT_EQ(*track(2)[0]->data(), Data(1764, 9));
    EXPECT_EQ(metrics().appAudioFrameCount, 1);
    EXPECT_EQ(metrics().micFrameCount, 1);
    EXPECT_EQ(logged("starting mic capture"), 1u);
    pause();
    EXPECT_FALSE(session_->haveMicTap());
}

TEST_F(SessionAudio, AMicrophoneThatIsOffIsRecordedAsSilenceAndCounted) {
    session_->setMicrophoneEnabled(true);
    startTapped();
    onRequestLane([&] { session_->setMicrophoneEnabled(false); });
    speak();
    ASSERT_EQ(track(2).size(), 1u);
    EXPECT_EQ(*track(2)[0]->data(), Data(1764, 0));
    EXPECT_EQ(metrics().micFrameCount, 1);
}

TEST_F(SessionAudio, AMutedBroadcastStillSendsTheMicrophoneAllZero) {
    session_->setBroadcastExtension(std::make_shared<StubExtension>(BundleIdentifier("org.example.Upload")));
    start();
    advance(std::chrono::milliseconds(100));
    session_->setBroadcastProcessMode(1);
    speak();
    EXPECT_EQ(noting_->sent, (std::vector<NotingSession::Sent>{{'e', SampleType::Microphone, Data(1764, 0)}}));
}

TEST_F(SessionAudio, TheMicrophoneIsTappedOnlyWhereThereIsOneAndItIsWanted) {
    start();
    EXPECT_EQ(logged("starting mic capture"), 0u) << "not wanted";
    finish();
    devices_.there = false;
    session_->setMicrophoneEnabled(true);
    start();
    EXPECT_EQ(logged("starting mic capture"), 0u) << "no device";
    finish();
    devices_.there = true;
    session_->setMicrophoneEnabled(false);
    session_->setSystemRecording(true);
    session_->setBroadcastExtension(std::make_shared<StubExtension>(BundleIdentifier("org.example.Upload")));
    start();
    EXPECT_EQ(logged("starting mic capture"), 0u) << "a system recording is not sent silence";
}

TEST_F(SessionAudio, TurningTheMicrophoneOnMakesATapOnlyForARunningSystemRecording) {
    start();
    onRequestLane([&] { session_->setMicrophoneEnabled(true); });
    settle();
    EXPECT_EQ(logged("starting mic capture"), 0u);
    finish();
    session_->setMicrophoneEnabled(false);
    session_->setSystemRecording(true);
    onRequestLane([&] { session_->setMicrophoneEnabled(true); });
    settle();
    EXPECT_EQ(logged("starting mic capture"), 0u) << "it does not record";
    session_->setMicrophoneEnabled(false);
    start();
    onRequestLane([&] { session_->setMicrophoneEnabled(false); });
    settle();
    EXPECT_EQ(logged("starting mic capture"), 0u) << "off";
    onRequestLane([&] {
        session_->setMicrophoneEnabled(true);
        EXPECT_FALSE(session_->haveMicTap()) << "only once it runs";
    });
    settle();
    EXPECT_EQ(logged("starting mic capture"), 1u);
    EXPECT_TRUE(session_->haveMicTap());
    onRequestLane([&] { session_->setMicrophoneEnabled(true); });
    settle();
    EXPECT_EQ(logged("starting mic capture"), 1u);
}

TEST_F(SessionAudio, WhatIsHeardInAPauseIsDroppedAndNotCountedUntilARetarget) {
    session_->setMicrophoneEnabled(true);
    startTapped();
    session_->setPaused(true);
    delegate_->durations.clear();
    hear();
    EXPECT_TRUE(track(1).empty());
    EXPECT_EQ(metrics().appAudioFrameCount, 0);
    EXPECT_EQ(delegate_->durations.size(), 1u) << "the time is told all the same";
    speak();
    EXPECT_TRUE(track(2).empty());
    EXPECT_EQ(metrics().micFrameCount, 0);
    EXPECT_EQ(delegate_->durations.size(), 2u);
    retarget(kEditor);
    hear();
    EXPECT_EQ(track(1).size(), 1u);
    EXPECT_EQ(metrics().appAudioFrameCount, 1);
}

TEST_F(SessionAudio, EachKindOfRecordingSendsItsSoundItsOwnWay) {
    struct Case {
        bool extension;
        std::int64_t mode;
        bool capture;
        char start, resumed, microphone;  ///< as in NotingSession; 'w' for the movie writer
    };
    const Case cases[] = {{false, 0, false, 'w', 'w', 'w'}, {false, 0, true, 'c', 'c', 'c'},
                          {true, 0, false, 'm', 'm', 'w'},  {true, 0, true, 'm', 'm', 'c'},
                          {true, 1, true, 'e', 'e', 'e'},   {false, 1, false, 'e', 'w', 'e'},
                          {false, 1, true, 'e', 'c', 'e'},  {true, 2, false, 'w', 'w', 'w'},
                          {true, 2, true, 'c', 'c', 'c'}};
    session_->setMicrophoneEnabled(true);
    startTapped();
    for (const Case& c : cases) {
        session_->setBroadcastExtension(c.extension ? std::make_shared<StubExtension>(BundleIdentifier("org.example.Upload")) : nullptr);
        session_->setBroadcastProcessMode(c.mode);
        session_->setCaptureRecording(c.capture);
        const auto way = [&](const std::function<void()>& deliver) {
            noting_->sent.clear();
            const std::size_t written = track(1).size() + track(2).size();
            deliver();
            if (!noting_->sent.empty()) return noting_->sent.front().where;
            return track(1).size() + track(2).size() > written ? 'w' : '-';
        };
        static std::int64_t time = 60'000'000;
        time += 20'000'000;
        session_->setFrontmostPIDForAudioTap(kPlayer);
        captureManager_->stopAppAudioCapture();
        pause();
        resume();
        advance(std::chrono::milliseconds(100));
        EXPECT_EQ(way([&] { hear(static_cast<std::uint64_t>(time)); }), c.start);
        EXPECT_EQ(way([&] { speak(time); }), c.microphone);
        time += 20'000'000;
        retarget(kEditor);
        EXPECT_EQ(way([&] { hear(static_cast<std::uint64_t>(time)); }), c.resumed);
    }
}

TEST_F(SessionAudio, ARetargetLogsItsStepsAndTapsTheOtherProcess) {
    startTapped();
    hear();
    fakes_.logSink.clear();
    retarget(kEditor);
    EXPECT_EQ(tap()->process(), kEditor);
    EXPECT_EQ(fakes_.audioInputQueues.queues().size(), 1u);
    Lines lines = fakes_.logSink.logged();
    std::erase(lines, "LCRecordingManager: Audio Queue buffer released");
    EXPECT_EQ(lines, (Lines{"updateProcessIDForAudioCaptureWithPID: 501", "stopping audio capture",
                            "LCRecordingManager:stopAudioCapture: Audio Queue successfully stopped",
                            "LCRecordingManager: Audio Queue has been disposed", "update foreground app bundleId",
                            "resuming audio capture for pid: 501",
                            "LCRecordingManager: startAudioCapture: Created Audio Queue Input",
                            "LCRecordingManager: startAudioCapture: Successfully set Audio Queue to PID",
                            "LCRecordingManager: startAudioCapture: Successfully started Audio Queue Recording"}));
    hear(80'000'000);
    hear(100'000'000);
    EXPECT_EQ(logged("resumed audio capture for pid: 501"), 2u) << "for every buffer";
    EXPECT_EQ(logged("resuming audio capture for pid: 501"), 1u);
}

TEST_F(SessionAudio, ARetargetToNobodyLeavesTheOldSoundRunning) {
    startTapped();
    fakes_.logSink.clear();
    retarget(ProcessID{0});
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"updateProcessIDForAudioCaptureWithPID: 0", "stopping audio capture",
                     "invalid pid stopping audio capture"}));
    EXPECT_EQ(session_->frontmostPIDForAudioTap(), ProcessID{0});
    EXPECT_EQ(tap()->process(), kPlayer);
    hear();
    EXPECT_EQ(track(1).size(), 1u);
}

TEST_F(SessionAudio, ARetargetOfAnIdleSessionOnlyLogs) {
    retarget(kEditor);
    EXPECT_EQ(fakes_.logSink.logged(), Lines{"updateProcessIDForAudioCaptureWithPID: 501"});
    EXPECT_EQ(session_->frontmostPIDForAudioTap(), ProcessID{0});
}

TEST_F(SessionAudio, ARetargetBeforeTheTapRunsStartsTheScreenItself) {
    session_->setFrontmostPIDForAudioTap(kPlayer);
    onRequestLane([&] {
        session_->setRecording(true);
        session_->startSessionWithHandler([&] {
            // The tap was asked for, and has not been started yet.
            session_->updateProcessIDForAudioCaptureWithPID(kEditor);
        });
    });
    settle();
    EXPECT_TRUE(source()->isRunning());
    EXPECT_EQ(logged("starting capture"), 1u);
    EXPECT_EQ(tap()->process(), kEditor);
    advance(std::chrono::seconds(1));
    EXPECT_EQ(finish().url, URL::file(path_));
}

TEST_F(SessionAudio, ATapThatIsStoppedBeforeItRunsStartsTheScreenInItsPlace) {
    session_->setFrontmostPIDForAudioTap(kPlayer);
    fakes_.faults.failNext("AudioInputQueue.start");  // it never says that it runs
    start();
    ASSERT_EQ(logged("starting capture"), 0u);
    onRequestLane([&] { session_->checkAndStopAppAudioForPID(kPlayer); });
    EXPECT_FALSE(captureManager_->audioRecorderQueue());
    EXPECT_TRUE(source()->isRunning());
    onRequestLane([&] { session_->checkAndStopAppAudioForPID(kPlayer); });
    retarget(kEditor);
    EXPECT_EQ(logged("starting capture"), 1u) << "once";
}

TEST_F(SessionAudio, ARetargetInAPauseLeavesTheScreenAlone) {
    session_->setFrontmostPIDForAudioTap(kPlayer);
    fakes_.faults.failNext("AudioInputQueue.start");
    start();
    pause();
    retarget(kEditor);
    EXPECT_EQ(logged("starting capture"), 0u);
    resume();
    EXPECT_EQ(logged("starting capture"), 1u);
    EXPECT_TRUE(source()->isRunning());
    EXPECT_EQ(tap()->process(), kEditor);
}

TEST_F(SessionAudio, ARetargetWhileAStartIsPendingLeavesTheScreenToTheStart) {
    session_->setFrontmostPIDForAudioTap(kPlayer);
    fakes_.faults.failNext("AudioInputQueue.start");
    start();
    finish();
    onRequestLane([&] {
        session_->setRecording(true);
        session_->startSessionWithHandler([] {});
        session_->updateProcessIDForAudioCaptureWithPID(kEditor);
        EXPECT_EQ(logged("starting capture"), 0u);
    });
    settle();
    EXPECT_EQ(logged("starting capture"), 1u);
    EXPECT_TRUE(source()->isRunning());
}

TEST_F(SessionAudio, TheSoundOfAProcessIsStoppedOnlyIfItIsThatProcesss) {
    startTapped();
    onRequestLane([&] { session_->checkAndStopAppAudioForPID(kEditor); });
    EXPECT_TRUE(captureManager_->audioRecorderQueue());
    onRequestLane([&] { session_->checkAndStopAppAudioForPID(kPlayer); });
    EXPECT_FALSE(captureManager_->audioRecorderQueue());
    EXPECT_EQ(session_->frontmostPIDForAudioTap(), kPlayer) << "it is left as it is";
}

TEST_F(SessionAudio, TheFirstApplicationOfABroadcastIsAnnouncedOnceByARetarget) {
    startTapped();
    retarget(kPlayer);
    EXPECT_TRUE(noting_->announced.empty()) << "no broadcast";
    session_->setIsBroadcasting(true);
    retarget(kEditor);
    retarget(kPlayer);
    EXPECT_EQ(noting_->announced, std::vector<std::string>{"org.example.Editor"});
    EXPECT_EQ(session_->bundleIDOfFirstForegroundApp(), BundleIdentifier("org.example.Editor"));
}

TEST_F(SessionAudio, SoundThatTheWriterRefusesStopsNothing) {
    startTapped();
    for (int i = 0; i < 3; ++i) hear(1);
    EXPECT_EQ(track(1).size(), 1u);
    EXPECT_TRUE(session_->isRecording());
    EXPECT_EQ(metrics().appAudioFrameCount, 3);
    EXPECT_TRUE(delegate_->stops.empty());
}

TEST_F(SessionAudio, AStopWithinASoundHandlerEndsTheSession) {
    startTapped();
    captureManager_->audioDispatchQueue()->async([&] { session_->stopRecordingWithNotification(true, std::nullopt); });
    settle();
    EXPECT_FALSE(session_->isRecording());
    EXPECT_FALSE(captureManager_->audioRecorderQueue());
}

}  // namespace
}  // namespace lumacast
