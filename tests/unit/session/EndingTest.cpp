// How a session's recordings end beside a plain finish: a source that fails, stops that meet starts, and what is let go.

#include "tests/unit/session/SessionWorld.h"

namespace lumacast {
namespace {

using std::chrono::seconds;

class SessionEnding : public SessionWorld {};

TEST_F(SessionEnding, AFailedSourceStopsTheSessionWithItsError) {
    start();
    fakes_.logSink.clear();
    source()->fail(-3);
    settle();
    EXPECT_EQ(delegate_->stops, std::vector<std::int64_t>{-5817});
    EXPECT_EQ(logged("LCRecordingSession: screenCaptureController: didFailWithStatus:"), 1u);
    EXPECT_FALSE(session_->isRecording());
}

TEST_F(SessionEnding, APreemptedSourceStopsTheSessionAsInterrupted) {
    start();
    source()->preempt();
    settle();
    EXPECT_EQ(delegate_->stops, std::vector<std::int64_t>{-5806});
    EXPECT_EQ(logged("LCRecordingSession: screenCaptureControllerWasPreempted"), 1u);
}

TEST_F(SessionEnding, AfterAResetOfTheMediaServicesNoPictureIsEverDeliveredAgain) {
    start();
    source()->mediaServicesWereReset();
    settle();
    EXPECT_EQ(delegate_->stops, std::vector<std::int64_t>{-5817});
    EXPECT_EQ(logged("LCRecordingSession: screenCaptureControllerMediaServicesWereReset"), 1u);
    start();
    advance(seconds(3));
    EXPECT_TRUE(ticks().empty());
    EXPECT_GT(source()->counters().delivered, 2u) << "the source itself went on";
    const Answer answer = finish();
    ASSERT_TRUE(answer.error);
    EXPECT_EQ(answer.error->code(), -5812);
}

TEST_F(SessionEnding, AStopEndsOnlyTheRecordingItFound) {
    start();
    // The next recording is begun while the frame lane stops this one.
    fakes_.displayCloneControl.setWhenSet([&](int mode) {
        if (mode == DisplayCloneControl::kOff) session_->setRecording(true);
    });
    session_->stopRecordingWithNotification(false, std::nullopt);
    EXPECT_TRUE(session_->isRecording());
}

TEST_F(SessionEnding, TheWindowsAreNamedBeforeTheyAreCloned) {
    std::vector<std::set<ContextID>> named;
    fakes_.displayCloneControl.setWhenSet([&](int) { named.push_back(fakes_.displayCloneControl.contexts()); });
    start();
    EXPECT_EQ(named, std::vector<std::set<ContextID>>{{kWindow}});
}

TEST_F(SessionEnding, AStopEndsTheSourceThenTheMirroringAndClosesTheGate) {
    start();
    std::vector<bool> running;
    fakes_.displayCloneControl.setWhenSet([&](int) { running.push_back(source()->isRunning()); });
    onRequestLane([&] { session_->stopRecordingWithNotification(false, std::nullopt); });
    EXPECT_EQ(running, std::vector<bool>{false});
    EXPECT_FALSE(source()->isGateOpen());
}

TEST_F(SessionEnding, AStoppedSessionHearsNothingMoreOfItsSource) {
    start();
    onRequestLane([&] {
        source()->fail(-3);
        session_->stopRecordingWithNotification(false, std::nullopt);
    });
    settle();
    EXPECT_EQ(logged("LCRecordingSession: screenCaptureController: didFailWithStatus:"), 0u);
}

TEST_F(SessionEnding, AStopLeavesThePauseAsItWas) {
    start();
    pause();
    onRequestLane([&] { session_->stopRecordingWithNotification(false, std::nullopt); });
    EXPECT_TRUE(session_->isPaused());
}

TEST_F(SessionEnding, ANewStartClosesTheGateOfTheOneBefore) {
    start();
    onRequestLane([&] {
        session_->startSessionWithHandler([this] { ++startAnswers_; });
        EXPECT_FALSE(source()->isGateOpen());
    });
    settle();
    EXPECT_TRUE(source()->isGateOpen());
}

TEST_F(SessionEnding, OfTwoStartsOnlyTheLastCapturesAndBothAreAnswered) {
    onRequestLane([&] {
        session_->setRecording(true);
        session_->startSessionWithHandler([this] { ++startAnswers_; });
        session_->startSessionWithHandler([this] { ++startAnswers_; });
    });
    settle();
    EXPECT_EQ(startAnswers_, 2);
    EXPECT_EQ(logged("starting capture"), 1u);
}

TEST_F(SessionEnding, AMovieOfCaptureModeIsHandedOverWhereThereIsOne) {
    start();
    session_->setCaptureRecording(true);
    EXPECT_EQ(finish().url, URL::file(path_));
}

TEST_F(SessionEnding, WhatNothingUsesIsThereAndEmpty) {
    EXPECT_EQ(session_->broadcastServiceInfoQueue()->label(), "com.orvane.lumacastd.ServiceInfoQueue");
    EXPECT_FALSE(session_->broadcastAggregatePayloadQueue());
    EXPECT_TRUE(session_->pendingBroadcastExtensionPayloads().empty());
    session_->setOutputURL(URL("file:///elsewhere.mp4"));
    EXPECT_EQ(session_->outputURL(), URL::file(path_));
    EXPECT_TRUE(LCRecordingSession::isNativeScreenOrientationPortrait());
}

TEST_F(SessionEnding, NeitherItsDelegateNorAFinishUnderWayIsHeld) {
    const auto delegate = std::make_shared<RecordingDelegate>();
    session_->setDelegate(delegate);
    EXPECT_EQ(delegate.use_count(), 1);
    start();
    recording().holdFinish(true);
    onRequestLane([&] { session_->finishSessionWithHandler([](std::optional<URL>, std::optional<Error>) {}); });
    settle();
    const std::weak_ptr<LCRecordingSession> session = session_;
    session_.reset();
    settle();
    EXPECT_TRUE(session.expired());
    recording().holdFinish(false);
    settle();
    EXPECT_EQ(logged("LCRecordingSession: finishWritingWithHandler"), 0u);
}

TEST_F(SessionEnding, AStopBeforeTheWriterIsReadyKeepsTheSourceFromStarting) {
    onRequestLane([&] {
        session_->setRecording(true);
        session_->startSessionWithHandler([this] { ++startAnswers_; });
        session_->stopRecordingWithNotification(false, std::nullopt);
    });
    settle();
    EXPECT_EQ(startAnswers_, 1);
    EXPECT_FALSE(source());
    EXPECT_EQ(fakes_.displayCloneControl.mode(), 0);
}

TEST_F(SessionEnding, APauseBeforeTheWriterIsReadyHoldsUntilTheResume) {
    onRequestLane([&] {
        session_->setRecording(true);
        session_->startSessionWithHandler([this] { ++startAnswers_; });
        session_->pauseSession();
    });
    settle();
    EXPECT_EQ(startAnswers_, 1);
    EXPECT_FALSE(source());
    resume();
    ASSERT_TRUE(source());
    EXPECT_TRUE(source()->isRunning());
}

}  // namespace
}  // namespace lumacast
