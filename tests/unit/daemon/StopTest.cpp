// Stopping, discarding, pausing and resuming, and the reports of sessions that stopped by themselves.

#include "tests/fakes/StubExtension.h"
#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

class Stop : public DaemonWorld {
protected:
    TestClient::AskedRef stopped(TestClient& client) {
        auto asked = client.ask(DaemonMessage::StopRecording);
        settle();
        return asked;
    }
    void tell(TestClient& client, DaemonMessage message, Array arguments = {}) {
        fakes_.logSink.clear();
        client.tell(message, std::move(arguments));
        settle();
    }
};

TEST_F(Stop, AStopIsAnsweredWithTheMovieAndThenTheStateIsReset) {
    const auto client = makeRecording();
    advance(seconds(2));
    const auto asked = stopped(*client);
    ASSERT_EQ(asked->answers, 1);
    ASSERT_TRUE(asked->url(0));
    EXPECT_EQ(asked->url(0)->path(), pathOf("Player"));
    EXPECT_TRUE(asked->values[1].isNull());
    EXPECT_NEAR(fakes_.fileSystem.movie(pathOf("Player"))->duration().seconds(), 2, 0.1);
    EXPECT_FALSE(session(*client)->isRecording());
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
    EXPECT_TRUE(client->told.empty());
    EXPECT_EQ(logged("LCRecordingManager:resetStatesForSession:"), 1u);
}

TEST_F(Stop, AnotherApplicationOfTheSameNameDiscardsNothingThatIsBeingRecorded) {
    const auto client = makeRecording("Player", 500, 7);
    TestClient namesake(fakes_, "org.other.Player", "Player", ProcessID{501}, ContextID{8});
    namesake.connect();
    settle();
    const auto discard = namesake.ask(DaemonMessage::DiscardRecording);
    settle();
    EXPECT_EQ(discard->answers, 1);
    EXPECT_TRUE(fakes_.fileSystem.exists(pathOf("Player")));
    const auto stop = stopped(*client);
    ASSERT_TRUE(stop->url(0));
    EXPECT_TRUE(fakes_.fileSystem.movie(pathOf("Player")));
    // Once its owner has gone the name is anybody's.
    client->die();
    settle();
    namesake.ask(DaemonMessage::DiscardRecording);
    settle();
    EXPECT_FALSE(fakes_.fileSystem.exists(pathOf("Player")));
}

TEST_F(Stop, AClipThatFailsAfterItsApplicationHasLeftIsReset) {
    const auto client = makeRecording();
    advance(seconds(10));
    fakes_.containerWriters.lastRecording()->holdFinish(true);
    client->ask(DaemonMessage::StopRecordingWithClipDurations, {1.0, 1.0});
    settle();
    client->die();
    settle();
    EXPECT_EQ(fakes_.keepAlive.open(), 1) << "the movie is still being finished";
    fakes_.faults.failNext("MovieExporter.export");
    fakes_.containerWriters.lastRecording()->holdFinish(false);
    settle();
    EXPECT_EQ(logged("LCMovieWriter: Export Trim succeeded"), 0u);
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
}

/// A link that takes every payload at once.
class Uploader final : public LCBroadcastExtensionProxy {
public:
    Uploader(const Platform& platform, const RecordingErrors& errors) : LCBroadcastExtensionProxy(platform, errors) {}
    void processPayload(Dictionary, std::function<void()> completion) override { completion(); }
    void invalidateConnection() override { ++invalidations; }
    int invalidations = 0;
};

TEST_F(Stop, ABroadcastThatNobodyWaitsForIsFinishedNotThrownAway) {
    const auto client = makeRecording();
    Localization texts(fakes_.bundles);
    const RecordingErrors errors(texts);
    const auto uploader = std::make_shared<Uploader>(fakes_.platform(), errors);
    const auto kept = session(*client);
    kept->setBroadcastExtension(std::make_shared<StubExtension>(BundleIdentifier("org.example.Uploader.upload")));
    kept->setBroadcastUploadExtensionProxy(uploader);
    kept->setBroadcastProcessMode(1);
    client->die();
    settle();
    EXPECT_EQ(logged("recording stopped without handler!"), 0u);
    EXPECT_EQ(logged("LCRecordingSession: finishSessionWithHandler"), 1u);
    EXPECT_EQ(logged("LCRecordingManager:resetStatesForSession:"), 1u);
    EXPECT_EQ(uploader->invalidations, 1);
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
}

TEST_F(Stop, AStopOfAnIdleSessionIsNeverAnswered) {
    const auto client = makeConnected();
    fakes_.logSink.clear();
    const auto asked = stopped(*client);
    advance(seconds(10));
    EXPECT_EQ(asked->answers, 0);
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"LCRecordingManager: stopRecordingWithHandler:",
                     "LCRecordingManager: stopRecordingWithStartTimeOffset:endTimeOffset:handler:",
                     "LCRecordingManager: stopRecordingSession:handler:"}));
}

TEST_F(Stop, ASecondStopIsNeverAnswered) {
    const auto client = makeRecording();
    const auto first = client->ask(DaemonMessage::StopRecording), second = client->ask(DaemonMessage::StopRecording);
    advance(seconds(1));
    EXPECT_EQ(first->answers, 1);
    EXPECT_EQ(second->answers, 0);
}

TEST_F(Stop, AStopWithClipDurationsGivesAClip) {
    const auto client = makeRecording();
    advance(seconds(10));
    const auto asked = client->ask(DaemonMessage::StopRecordingWithClipDurations, {2.4, 3.6});
    settle();
    ASSERT_TRUE(asked->url(0));
    EXPECT_EQ(asked->url(0)->path(), pathOf("Player_trimmed"));
    EXPECT_NEAR(fakes_.fileSystem.movie(pathOf("Player_trimmed"))->duration().seconds(), 4, 0.1);
    EXPECT_EQ(logged("LCRecordingManager: stopRecordingWithHandler:"), 0u);
    EXPECT_EQ(logged("LCRecordingManager: stopRecordingWithStartTimeOffset:endTimeOffset:handler:"), 1u);
}

TEST_F(Stop, AStopWhoseClipCannotBeMadeHoldsItsTransactionUntilTheNextStart) {
    const auto client = makeRecording();
    advance(seconds(10));
    fakes_.faults.failNext("MovieExporter.export");
    const auto asked = client->ask(DaemonMessage::StopRecordingWithClipDurations, {1.0, 1.0});
    advance(seconds(10));
    EXPECT_EQ(asked->answers, 0);
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
    const auto start = client->start();
    settle();
    EXPECT_EQ(start->code(), 0);
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
    stopped(*client);
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
    EXPECT_FALSE(fakes_.keepAlive.endedWithoutBegin());
}

TEST_F(Stop, AClientThatLeavesAfterAnUnansweredStopClosesItsTransaction) {
    const auto client = makeRecording();
    advance(seconds(10));
    fakes_.faults.failNext("MovieExporter.export");
    client->ask(DaemonMessage::StopRecordingWithClipDurations, {1.0, 1.0});
    advance(seconds(1));
    client->die();
    settle();
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
}

TEST_F(Stop, ADiscardWhileRecordingIsNeverAnswered) {
    const auto client = makeRecording();
    const auto asked = client->ask(DaemonMessage::DiscardRecording);
    advance(seconds(10));
    EXPECT_EQ(asked->answers, 0);
    EXPECT_TRUE(session(*client)->isRecording());
    EXPECT_EQ(fakes_.logSink.logged(), (Lines{"LCRecordingManager: discardRecording",
                                              "can't discard recording while recording is in progress"}));
}

TEST_F(Stop, IsAnsweredAfterManyDiscardsWhileRecording) {
    const auto client = makeRecording();
    std::vector<TestClient::AskedRef> discards;
    for (int i = 0; i < 200; ++i) {
        discards.push_back(client->ask(DaemonMessage::DiscardRecording));
        settle();
    }
    advance(seconds(2));
    const auto asked = stopped(*client);
    EXPECT_EQ(asked->failures, 0);
    ASSERT_EQ(asked->answers, 1);
    ASSERT_TRUE(asked->url(0));
    for (const auto& discard : discards) EXPECT_EQ(discard->answers + discard->failures, 0);
    EXPECT_EQ(client->losses, 0);
}

TEST_F(Stop, AreNotUsedUpByStopsOfAnIdleSessionOrByClipsThatFail) {
    const auto client = makeConnected();
    for (int i = 0; i < 100; ++i) EXPECT_EQ(stopped(*client)->answers, 0);
    for (int i = 0; i < 100; ++i) {
        ASSERT_EQ(client->start()->failures, 0);
        advance(seconds(5));
        fakes_.faults.failNext("MovieExporter.export");
        const auto clip = client->ask(DaemonMessage::StopRecordingWithClipDurations, {1.0, 1.0});
        settle();
        ASSERT_EQ(clip->answers + clip->failures, 0) << i;
    }
    const auto start = client->start();
    advance(seconds(1));
    ASSERT_EQ(start->answers, 1);
    EXPECT_EQ(stopped(*client)->answers, 1);
    EXPECT_EQ(client->losses, 0);
}

TEST_F(Stop, ADiscardAfterwardsDeletesTheMovieAndAnswersWithNothing) {
    const auto client = makeRecording();
    stopped(*client);
    ASSERT_TRUE(fakes_.fileSystem.exists(pathOf("Player")));
    const auto asked = client->ask(DaemonMessage::DiscardRecording);
    settle();
    EXPECT_EQ(asked->answers, 1);
    EXPECT_TRUE(asked->values.empty());
    EXPECT_FALSE(fakes_.fileSystem.exists(pathOf("Player")));
}

TEST_F(Stop, WhoComesBackCanDiscardWhatItLeft) {
    const auto client = makeRecording();
    stopped(*client);
    client->connection.reset();
    client->die();
    settle();
    ASSERT_TRUE(fakes_.fileSystem.exists(pathOf("Player")));
    const auto again = makeConnected();
    const auto asked = again->ask(DaemonMessage::DiscardRecording);
    settle();
    EXPECT_EQ(asked->answers, 1);
    EXPECT_FALSE(fakes_.fileSystem.exists(pathOf("Player")));
}

TEST_F(Stop, AClientThatLeavesBeforeItsMovieIsFinishedKeepsTheDaemonUpUntilItIs) {
    const auto client = makeRecording();
    client->ask(DaemonMessage::StopRecording);
    const auto untilLogged = [&](const char* line) {
        return world_.scheduler.runUntil([&] { return logged(line) == 1; }, seconds(1));
    };
    ASSERT_TRUE(untilLogged("LCRecordingSession: finishSessionWithHandler"));
    ASSERT_EQ(logged("LCRecordingSession: finishWritingWithHandler"), 0u);
    client->connection.reset();
    client->die();
    ASSERT_TRUE(untilLogged("LCRecordingManager: applicationDisconnected"));
    EXPECT_EQ(fakes_.keepAlive.open(), logged("LCRecordingSession: finishWritingWithHandler") == 0 ? 1 : 0);
    settle();
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
    EXPECT_EQ(logged("LCRecordingManager:resetStatesForSession:"), 1u);
}

TEST_F(Stop, AStopOfASystemRecordingEndsTheWatchOnTheForeground) {
    const auto client = makeRecording();
    const auto watched = [&] { return fakes_.appStateMonitor.hasHandler(); };
    const auto watch = [&] {
        world_.scheduler.mainQueue().sync([&] { fakes_.appStateMonitor.setHandler([](auto, auto, auto) {}); });
    };
    watch();
    session(*client)->setSystemRecording(true);
    stopped(*client);
    EXPECT_EQ(logged("stop monitoring foreground apps"), 1u);
    EXPECT_FALSE(watched());
    // An idle session that recorded the system before is no exception.
    watch();
    tell(*client, DaemonMessage::StopRecording);
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"LCRecordingManager: stopRecordingWithHandler:",
                     "LCRecordingManager: stopRecordingWithStartTimeOffset:endTimeOffset:handler:",
                     "LCRecordingManager: stopRecordingSession:handler:", "stop monitoring foreground apps"}));
    EXPECT_FALSE(watched());
    // Any other session leaves the watch alone.
    watch();
    session(*client)->setSystemRecording(false);
    tell(*client, DaemonMessage::StopRecording);
    EXPECT_TRUE(watched());
}

TEST_F(Stop, WhatIsToldAClientThatHasGoneEndsInItsErrorLine) {
    const auto client = makeRecording();
    const auto gone = session(*client);
    client->connection.reset();
    client->die();
    settle();
    fakes_.logSink.clear();
    ASSERT_FALSE(session(*client));
    // What is still under way for it tells it.
    gone->clientProxy()->stopRecordingWithError(std::nullopt, std::nullopt);
    settle();
    const auto lines = fakes_.logSink.logged();
    ASSERT_EQ(lines.size(), 2u);
    EXPECT_EQ(lines[0], "LCClientProxy:stopRecordingWithError:movieURL:");
    EXPECT_TRUE(lines[1].starts_with("LCClientProxy:recordingDidStopWithError: error getting remote proxy: "));
}

TEST_F(Stop, AFailedSourceTellsTheClientOnceAndResets) {
    const auto client = makeRecording();
    fakes_.displayCapture.lastSource()->fail(-1);
    settle();
    EXPECT_EQ(client->toldOfStop(-5817), 1);
    EXPECT_EQ(client->told.size(), 1u);
    EXPECT_TRUE(client->told[0].arguments[1].isNull());
    EXPECT_FALSE(session(*client)->isRecording());
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
    EXPECT_EQ(logged("LCRecordingManager:recordingSessionStoppedWithError:movieURL:"), 1u);
}

TEST_F(Stop, APauseHoldsTheRecordingAndAResumeGoesOn) {
    const auto client = makeRecording();
    advance(seconds(1));
    tell(*client, DaemonMessage::PauseRecording);
    EXPECT_TRUE(session(*client)->isPaused());
    EXPECT_EQ(fakes_.logSink.logged(),
              joined({"LCRecordingManager:pauseRecording", "LCRecordingSession: pauseSession"}, captureStops()));
    advance(seconds(30));
    tell(*client, DaemonMessage::ResumeRecording, {number(client->window)});
    EXPECT_FALSE(session(*client)->isPaused());
    EXPECT_EQ(logged("LCRecordingManager: resumeRecording"), 1u);
    advance(seconds(2));
    const auto asked = stopped(*client);
    ASSERT_TRUE(asked->url(0));
    EXPECT_NEAR(fakes_.fileSystem.movie(pathOf("Player"))->duration().seconds(), 3, 0.1);
}

TEST_F(Stop, APauseIsIgnoredWhenIdleWhenPausedAndForASystemRecording) {
    const auto client = makeConnected();
    tell(*client, DaemonMessage::PauseRecording);
    EXPECT_EQ(fakes_.logSink.logged(), Lines{"LCRecordingManager:pauseRecording"});
    client->start();
    settle();
    session(*client)->setSystemRecording(true);
    tell(*client, DaemonMessage::PauseRecording);
    EXPECT_EQ(fakes_.logSink.logged(), Lines{"LCRecordingManager:pauseRecording"});
    EXPECT_FALSE(session(*client)->isPaused());
    session(*client)->setSystemRecording(false);
    tell(*client, DaemonMessage::PauseRecording);
    tell(*client, DaemonMessage::PauseRecording);
    EXPECT_EQ(fakes_.logSink.logged(), Lines{"LCRecordingManager:pauseRecording"});
}

TEST_F(Stop, AResumeOfWhatIsNotPausedOnlyLogs) {
    const auto client = makeRecording();
    tell(*client, DaemonMessage::ResumeRecording, {number(client->window)});
    EXPECT_EQ(fakes_.logSink.logged(), Lines{"LCRecordingManager: resumeRecording"});
    EXPECT_TRUE(session(*client)->isRecording());
}

TEST_F(Stop, AResumeWithAForeignWindowStopsAPausedRecordingAndReportsIt) {
    const auto other = makeConnected("Editor", 501, 8);
    const auto client = makeRecording();
    advance(seconds(1));
    tell(*client, DaemonMessage::PauseRecording);
    tell(*client, DaemonMessage::ResumeRecording, {number(other->window)});
    EXPECT_EQ(client->toldOfStop(-5816), 1);
    ASSERT_EQ(client->told.size(), 1u);
    EXPECT_EQ(client->told[0].arguments[1], Value(URL::file(pathOf("Player"))));
    EXPECT_FALSE(session(*client)->isRecording());
    EXPECT_FALSE(session(*client)->isPaused());
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
    EXPECT_EQ(logged("LCRecordingManager: resumeRecording"), 0u);
}

TEST_F(Stop, AResumeWithAForeignWindowOfWhatIsNotPausedDoesNothing) {
    const auto other = makeConnected("Editor", 501, 8);
    const auto client = makeRecording();
    tell(*client, DaemonMessage::ResumeRecording, {number(other->window)});
    EXPECT_TRUE(fakes_.logSink.logged().empty());
    EXPECT_TRUE(session(*client)->isRecording());
    EXPECT_TRUE(client->told.empty());
}

TEST_F(Stop, AResumeOfABroadcastDoesNothingAtAll) {
    const auto other = makeConnected("Editor", 501, 8);
    const auto client = makeRecording();
    tell(*client, DaemonMessage::PauseRecording);
    session(*client)->setIsBroadcasting(true);
    for (const ContextID window : {client->window, other->window}) {
        tell(*client, DaemonMessage::ResumeRecording, {number(window)});
        EXPECT_TRUE(fakes_.logSink.logged().empty());
        EXPECT_TRUE(session(*client)->isPaused());
    }
    session(*client)->setPaused(false);
    tell(*client, DaemonMessage::ResumeRecording, {number(client->window)});
    EXPECT_TRUE(fakes_.logSink.logged().empty()) << "paused or not";
}

TEST_F(Stop, AResumeLeavesASystemRecordingAndWhatDoesNotRecordAlone) {
    const auto client = makeRecording();
    tell(*client, DaemonMessage::PauseRecording);
    session(*client)->setSystemRecording(true);
    session(*client)->setIsBroadcasting(true);
    tell(*client, DaemonMessage::ResumeRecording, {number(client->window)});
    EXPECT_EQ(fakes_.logSink.logged(), Lines{"LCRecordingManager: resumeRecording"}) << "its window is looked at";
    EXPECT_TRUE(session(*client)->isPaused());
    session(*client)->setSystemRecording(false);
    session(*client)->setIsBroadcasting(false);
    session(*client)->setRecording(false);
    tell(*client, DaemonMessage::ResumeRecording, {number(client->window)});
    EXPECT_EQ(fakes_.logSink.logged(), Lines{"LCRecordingManager: resumeRecording"});
    EXPECT_TRUE(session(*client)->isPaused());
}

TEST_F(Stop, TheReportOfAnOlderStartIsDropped) {
    const auto client = makeRecording();
    const auto recording = session(*client);
    const Error error("test", -42);
    // A start is on its way on the request lane when the frame lane reports the end of the one before.
    fakes_.scheduler.mainQueue().async([recording] { recording->startSessionWithHandler([] {}); });
    process_->manager().recordingSessionStoppedWithError(recording, error);
    settle();
    EXPECT_EQ(client->toldOfStop(-42), 0);
    EXPECT_TRUE(recording->isRecording());
    process_->manager().recordingSessionStoppedWithError(recording, error);
    settle();
    EXPECT_EQ(client->toldOfStop(-42), 1);
}

}  // namespace
}  // namespace lumacast
