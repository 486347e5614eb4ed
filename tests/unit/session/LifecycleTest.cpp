// A session's states: start, pause, resume, stop, finish, clean up, and the failures of its source.

#include "tests/unit/session/SessionWorld.h"

namespace lumacast {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

class SessionLifecycle : public SessionWorld {};

TEST_F(SessionLifecycle, ANewSessionIsIdle) {
    const LCRecordingSession session(services_, id_);
    EXPECT_EQ(session.bundleID(), id_);
    EXPECT_FALSE(session.isRecording());
    EXPECT_FALSE(session.isPaused());
    EXPECT_FALSE(session.isSystemRecording());
    EXPECT_FALSE(session.isBroadcasting());
    EXPECT_FALSE(session.isCapturing());
    EXPECT_FALSE(session.broadcastURL());
    EXPECT_FALSE(session.interruptedMovieURL());
    EXPECT_FALSE(session.movieWriter());
    EXPECT_FALSE(session.screenCaptureController());
    EXPECT_FALSE(session.reportingAgent());
    EXPECT_FALSE(session.captureStartTime());
}

TEST_F(SessionLifecycle, AStartLogsItsStepsInOrderAndIsAnsweredOnce) {
    fakes_.log.setVerbose(false);
    start();
    EXPECT_EQ(startAnswers_, 1);
    EXPECT_EQ(fakes_.logSink.logged(), (Lines{"LCRecordingSession: startSession", "LCMovieWriter: startWritingHandler",
                                              "LCMovieWriter: setupAssetWriter", "bit rate set to 3000000",
                                              "app window mode", "starting capture"}));
}

TEST_F(SessionLifecycle, AStartClonesTheWindowsAndCapturesAtSixtyFramesASecond) {
    session_->setContextIDs({ContextID{7}, ContextID{9}, ContextID{7}});
    start();
    EXPECT_EQ(fakes_.displayCloneControl.mode(), 3);
    EXPECT_EQ(fakes_.displayCloneControl.contexts(), (std::set<ContextID>{ContextID{7}, ContextID{9}}));
    EXPECT_EQ(source()->size(), (Size{640, 360}));
    EXPECT_EQ(compare(source()->minimumInterval(), MediaTime::make(1, 60)), 0);
    EXPECT_EQ(source()->minimumInterval().timescale, 60);
    EXPECT_TRUE(source()->isRunning());
    EXPECT_EQ(session_->captureStartTime(), fakes_.clock.now());
    const UsageMetrics metrics = session_->reportingAgent()->metrics();
    EXPECT_EQ(metrics.videoCaptureSize, (Size{640, 360}));
    EXPECT_EQ(metrics.videoCaptureRate, 60);
}

TEST_F(SessionLifecycle, AStartWhoseWriterFailsCapturesAndAnswersAllTheSame) {
    fakes_.faults.failNext("ContainerWriters.make");
    start();
    EXPECT_EQ(startAnswers_, 1);
    EXPECT_TRUE(source()->isRunning());
}

TEST_F(SessionLifecycle, AStartEndsAPause) {
    start();
    pause();
    start();
    EXPECT_FALSE(session_->isPaused());
    EXPECT_TRUE(source()->isRunning());
}

TEST_F(SessionLifecycle, AFinishedSessionStartsAgainWithTheSameSourceANewWriterAndANewReport) {
    start();
    const auto writer = session_->movieWriter();
    const auto agent = session_->reportingAgent();
    const auto firstSource = source();
    finish();
    start();
    EXPECT_EQ(startAnswers_, 2);
    EXPECT_EQ(source(), firstSource);
    EXPECT_EQ(fakes_.displayCapture.sources().size(), 1u);
    EXPECT_NE(session_->movieWriter(), writer);
    EXPECT_NE(session_->reportingAgent(), agent);
}

TEST_F(SessionLifecycle, AnExistingSourceKeepsItsFirstSize) {
    start();
    finish();
    session_->setWindowSize({320, 180});
    start();
    EXPECT_EQ(source()->size(), (Size{640, 360}));
    EXPECT_EQ(session_->movieWriter()->windowSize(), (Size{320, 180}));
}

TEST_F(SessionLifecycle, ASystemRecordingMirrorsTheWholeDisplayAndIsWrittenUpright) {
    fakes_.log.setVerbose(false);
    session_->setSystemRecording(true);
    session_->setWindowSize({1920, 1080});
    start();
    EXPECT_EQ(session_->movieWriter()->windowSize(), (Size{1080, 1920}));
    EXPECT_EQ(session_->windowSize(), (Size{1920, 1080}));
    EXPECT_TRUE(session_->movieWriter()->systemRecording());
    EXPECT_EQ(fakes_.displayCloneControl.mode(), 1);
    EXPECT_TRUE(fakes_.displayCloneControl.contexts().empty());
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"LCRecordingSession: startSession", "Before windowSize w:1920.000000 h:1080.000000",
                     "After windowSize w:1080.000000 h:1920.000000", "LCMovieWriter: startWritingHandler",
                     "LCMovieWriter: setupAssetWriter", "bit rate set to 5000000", "mirror mode", "starting capture"}));
}

TEST_F(SessionLifecycle, AnUprightSystemRecordingStaysAsItIs) {
    session_->setSystemRecording(true);
    session_->setWindowSize({1080, 1920});
    start();
    EXPECT_EQ(session_->movieWriter()->windowSize(), (Size{1080, 1920}));
    EXPECT_EQ(logged("After windowSize w:1080.000000 h:1920.000000"), 1u);
}

TEST_F(SessionLifecycle, APauseStopsEverythingInOrder) {
    start();
    captureManager_->setCaptureStartTime(MediaTime::make(5, 600));
    fakes_.logSink.clear();
    pause();
    EXPECT_TRUE(session_->isPaused());
    EXPECT_TRUE(session_->isRecording());
    EXPECT_FALSE(source()->isRunning());
    EXPECT_FALSE(source()->isGateOpen());
    EXPECT_EQ(fakes_.displayCloneControl.mode(), 0);
    EXPECT_EQ(compare(captureManager_->captureStartTime(), kInvalidMediaTime), 0);
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"LCRecordingSession: pauseSession", "LCRecordingSession: stopAllCapture",
                     "LCCaptureManager: stopDeviceCaptureSessionWithFinishHandler", "Stop mirroring"}));
}

TEST_F(SessionLifecycle, ASecondPauseDoesNothingAtAll) {
    start();
    pause();
    fakes_.logSink.clear();
    const auto modes = fakes_.displayCloneControl.modes();
    pause();
    EXPECT_TRUE(fakes_.logSink.lines().empty());
    EXPECT_EQ(fakes_.displayCloneControl.modes(), modes);
}

TEST_F(SessionLifecycle, AResumeOfASessionThatIsNotPausedDoesNothingAtAll) {
    start();
    fakes_.logSink.clear();
    resume(ContextID{8});
    EXPECT_TRUE(fakes_.logSink.lines().empty());
    EXPECT_EQ(session_->contextIDs(), std::vector<ContextID>{kWindow});
}

TEST_F(SessionLifecycle, AResumeCapturesTheGivenWindow) {
    fakes_.log.setVerbose(false);
    start();
    advance(milliseconds(100));
    pause();
    fakes_.logSink.clear();
    resume(ContextID{8});
    EXPECT_FALSE(session_->isPaused());
    EXPECT_EQ(session_->contextIDs(), std::vector<ContextID>{ContextID{8}});
    EXPECT_EQ(fakes_.displayCloneControl.contexts(), std::set<ContextID>{ContextID{8}});
    EXPECT_EQ(fakes_.displayCloneControl.mode(), 3);
    EXPECT_TRUE(source()->isRunning());
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"LCRecordingSession: resumeSessionWithContextID:", "app window mode", "starting capture"}));
}

TEST_F(SessionLifecycle, AFinishLogsItsStepsAndHandsTheMovieOver) {
    fakes_.log.setVerbose(false);
    start();
    advance(milliseconds(100));
    fakes_.logSink.clear();
    const Answer answer = finish();
    EXPECT_EQ(answer.count, 1);
    EXPECT_EQ(answer.url, URL::file(path_));
    EXPECT_FALSE(answer.error);
    EXPECT_FALSE(session_->isRecording());
    EXPECT_EQ(
        fakes_.logSink.logged(),
        (Lines{"LCRecordingSession: finishSessionWithHandler", "LCRecordingSession: stop",
               "LCRecordingSession: stopAllCapture", "LCCaptureManager: stopDeviceCaptureSessionWithFinishHandler",
               "Stop mirroring", "recordedFileSize for URL 1000 bytes",
               "LCMovieWriter: finishWritingWithHandler: status = 1", "LCRecordingSession: finishWritingWithHandler"}));
    EXPECT_TRUE(delegate_->stops.empty()) << "a finish notifies nobody";
}

TEST_F(SessionLifecycle, AFinishOfASessionThatIsNotRecordingIsNeverAnswered) {
    EXPECT_EQ(finish().count, 0);
    start();
    EXPECT_EQ(finish().count, 1);
    fakes_.logSink.clear();
    EXPECT_EQ(finish().count, 0);
    EXPECT_TRUE(fakes_.logSink.lines().empty());
}

TEST_F(SessionLifecycle, AFinishOfAPausedSessionGivesTheMovie) {
    start();
    pause();
    EXPECT_EQ(finish().url, URL::file(path_));
}

TEST_F(SessionLifecycle, AFinishWithoutAPictureIsAFailureToSave) {
    fakes_.faults.failNext("ContainerWriters.make");
    start();
    const Answer answer = finish();
    EXPECT_EQ(answer.count, 1);
    EXPECT_FALSE(answer.url);
    ASSERT_TRUE(answer.error);
    EXPECT_EQ(answer.error->code(), -5812);
}

TEST_F(SessionLifecycle, AFinishWithoutAPictureIsNoErrorInCaptureMode) {
    session_->setCaptureRecording(true);
    fakes_.faults.failNext("ContainerWriters.make");
    start();
    const Answer answer = finish();
    EXPECT_EQ(answer.count, 1);
    EXPECT_FALSE(answer.url);
    EXPECT_FALSE(answer.error);
}

TEST_F(SessionLifecycle, BothClipDurationsGiveAClip) {
    fakes_.displayCapture.setAutomatic(true);
    start();
    advance(seconds(10));
    const Answer answer = finish(2, 3);
    EXPECT_EQ(answer.url, URL::file(clipPath_));
    EXPECT_FALSE(answer.error);
    ASSERT_TRUE(fakes_.fileSystem.movie(clipPath_));
    EXPECT_NEAR(fakes_.fileSystem.movie(clipPath_)->duration().seconds(), 5, 0.1);
    const Lines lines = fakes_.logSink.logged();
    const auto trimming = std::find(lines.begin(), lines.end(), "trimming");
    ASSERT_NE(trimming, lines.end());
    EXPECT_EQ(Lines(trimming, lines.end()),
              (Lines{"trimming", "LCMovieWriter: Export Trim succeeded", "finished trimming"}));
}

TEST_F(SessionLifecycle, OneClipDurationAloneGivesTheWholeMovie) {
    start();
    advance(seconds(4));
    EXPECT_EQ(finish(2, 0).url, URL::file(path_));
    start();
    advance(seconds(4));
    EXPECT_EQ(finish(0, 2).url, URL::file(path_));
    EXPECT_EQ(logged("trimming"), 0u);
}

TEST_F(SessionLifecycle, AFailedTrimIsNeverAnswered) {
    start();
    advance(seconds(4));
    fakes_.faults.failNext("MovieExporter.export");
    EXPECT_EQ(finish(1, 1).count, 0);
    EXPECT_EQ(logged("finished trimming"), 0u);
}

TEST_F(SessionLifecycle, AStopWithNotificationTellsTheDelegateOnce) {
    start();
    const Error error("test", -42);
    onRequestLane([&] {
        session_->setIsBroadcasting(true);
        session_->stopRecordingWithNotification(true, error);
        session_->stopRecordingWithNotification(true, error);
    });
    EXPECT_EQ(delegate_->stops, std::vector<std::int64_t>{-42});
    EXPECT_FALSE(delegate_->wasOnWhenTold);
    EXPECT_FALSE(session_->isRecording());
    EXPECT_FALSE(session_->isBroadcasting());
    EXPECT_EQ(logged("LCRecordingSession: stop"), 1u);
    EXPECT_FALSE(session_->reportingAgent());
}

TEST_F(SessionLifecycle, AStopWithoutNotificationTellsNobody) {
    start();
    onRequestLane([&] { session_->stopRecordingWithNotification(false, std::nullopt); });
    EXPECT_TRUE(delegate_->stops.empty());
    EXPECT_FALSE(session_->isRecording());
}

TEST_F(SessionLifecycle, AStopOfAnIdleSessionIsSilent) {
    onRequestLane([&] { session_->stopRecordingWithNotification(true, std::nullopt); });
    EXPECT_TRUE(delegate_->stops.empty());
    EXPECT_TRUE(fakes_.logSink.lines().empty());
}

TEST_F(SessionLifecycle, ACleanUpStopsAndRemovesTheMovie) {
    start();
    ASSERT_TRUE(fakes_.fileSystem.exists(path_));
    fakes_.logSink.clear();
    EXPECT_EQ(cleanUp(), 1);
    EXPECT_FALSE(session_->isRecording());
    EXPECT_FALSE(fakes_.fileSystem.exists(path_));
    EXPECT_EQ(fakes_.logSink.logged().front(), "LCRecordingSession: cleanupSessionFiles");
    EXPECT_EQ(logged("LCRecordingSession: stop"), 1u);
    EXPECT_TRUE(delegate_->stops.empty());
}

TEST_F(SessionLifecycle, ACleanUpOfAnIdleSessionAnswersToo) {
    EXPECT_EQ(cleanUp(), 1);
    EXPECT_EQ(fakes_.logSink.logged(), Lines{"LCRecordingSession: cleanupSessionFiles"});
}

TEST_F(SessionLifecycle, ACleanUpWhoseRemovalFailsLogsTheErrorAndAnswers) {
    start();
    fakes_.faults.failNext("FileSystem.remove");
    EXPECT_EQ(cleanUp(), 1);
    EXPECT_EQ(logged("error removing file with code: 5"), 1u);
}

}  // namespace
}  // namespace lumacast
