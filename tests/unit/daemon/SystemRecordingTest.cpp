// Recordings of the whole display.

#include "tests/unit/daemon/SystemRecordingWorld.h"

namespace lumacast {
namespace {

using std::chrono::seconds;

class SystemRecording : public SystemRecordingWorld {};

TEST_F(SystemRecording, AnEntitledClientRecordsTheWholeDisplayWhateverWindowsItNames) {
    const auto client = makeEntitled();
    const auto asked = client->start({ContextID{4711}}, kSystem);
    settle();
    ASSERT_EQ(asked->answers, 1);
    EXPECT_EQ(asked->code(), 0);
    EXPECT_TRUE(session(*client)->isSystemRecording());
    EXPECT_TRUE(session(*client)->isRecording());
    EXPECT_EQ(fakes_.displayCloneControl.mode(), DisplayCloneControl::kMirrorDisplay);
    EXPECT_EQ(logged("mirror mode"), 1u);
    const auto name = session(*client)->movieWriter()->outputPath();
    EXPECT_NE(name.find("/ScreenRecording_"), std::string::npos);
    // Portrait, though it was asked for as landscape.
    EXPECT_EQ(session(*client)->movieWriter()->windowSize(), (Size{360, 640}));
}

TEST_F(SystemRecording, ItsClientMayGoAndComeBack) {
    auto client = makeSystemRecording();
    const auto recorded = session(*client);
    client->connection->invalidate();
    settle();
    EXPECT_TRUE(recorded->isRecording());
    client->connect();
    settle();
    EXPECT_EQ(session(*client), recorded);
    const auto asked = stopped(*client);
    ASSERT_TRUE(asked->url(0));
    EXPECT_TRUE(fakes_.fileSystem.exists(asked->url(0)->path()));
}

TEST_F(SystemRecording, ItWorksAgainAfterTheDisplayServerHasEnded) {
    const auto client = makeSystemRecording();
    fakes_.displayCapture.lastSource()->mediaServicesWereReset();
    settle();
    EXPECT_EQ(client->toldOfStop(-5817), 1);
    client->connection->invalidate();
    settle();
    client->connect();
    settle();
    fakes_.ipc.grant(client->pid, "com.orvane.private.luma-cast", true);
    ASSERT_EQ(started(*client)->code(), 0);
    advance(seconds(2));
    const auto asked = stopped(*client);
    ASSERT_TRUE(asked->url(0));
    const auto movie = fakes_.fileSystem.movie(asked->url(0)->path());
    ASSERT_TRUE(movie);
    EXPECT_GT(movie->tracks[0].samples.size(), 1u);
}

TEST_F(SystemRecording, OnlySystemRecordingsUnderWayAreToldThatTheyMayBeStopped) {
    fakes_.displayCapture.setAutomatic(true);
    const auto client = makeSystemRecording();
    advance(seconds(1));
    onRequestLane([](LCRecordingManager& manager) { manager.notifySystemRecordingMayBeStopped(); });
    advance(seconds(1));
    const auto cut = stopped(*client);
    ASSERT_TRUE(cut->url(0));
    EXPECT_NEAR(fakes_.fileSystem.movie(cut->url(0)->path())->duration().seconds(), 1, 0.1);
    advance(seconds(1));
    ASSERT_EQ(started(*client)->code(), 0);
    advance(seconds(1));
    onRequestLane([](LCRecordingManager& manager) {
        manager.notifySystemRecordingMayBeStopped();
        manager.notifySystemRecordingResumed();
    });
    advance(seconds(1));
    const auto whole = stopped(*client);
    ASSERT_TRUE(whole->url(0));
    EXPECT_NEAR(fakes_.fileSystem.movie(whole->url(0)->path())->duration().seconds(), 2, 0.1);
}

TEST_F(SystemRecording, ItsSoundFollowsTheForeground) {
    const auto game = makeConnected("Game", 700, 70), player = makeConnected("Player", 701, 71);
    auto client = makeEntitled();
    for (const auto* other : {&game, &player}) fakes_.appStateMonitor.setProcess((*other)->id, (*other)->pid);
    fakes_.appStateMonitor.setState(player->id, 4);
    ASSERT_EQ(started(*client)->code(), 0);
    ASSERT_TRUE(fakes_.appStateMonitor.hasHandler());
    // What is in front now.
    update(8, true, player->pid);
    EXPECT_EQ(heard(*client), 701);
    // Another one goes to the back: that is not the one that is heard.
    update(4, false, game->pid);
    EXPECT_EQ(heard(*client), 701);
    update(4, false, player->pid);
    EXPECT_EQ(heard(*client), -1);
    update(8, true, game->pid);
    EXPECT_EQ(heard(*client), 700);
}

TEST_F(SystemRecording, TheSoundOfAnApplicationThatEndsIsStopped) {
    const auto client = makeEntitled();
    const auto game = makeConnected("Game", 700, 70);
    ASSERT_EQ(started(*client)->code(), 0);
    update(8, true, game->pid);
    ASSERT_EQ(heard(*client), 700);
    const auto stops = [&] { return logged("LCRecordingManager:stopAudioCapture: Audio Queue successfully stopped"); };
    const auto before = stops();
    update(1, false, ProcessID{999});  // another one
    EXPECT_EQ(stops(), before);
    update(1, false, game->pid);
    EXPECT_EQ(stops(), before + 1);
    EXPECT_EQ(heard(*client), -1);
    EXPECT_TRUE(session(*client)->isRecording());
}

TEST_F(SystemRecording, TheForegroundIsWatchedForASystemRecordingAloneAndNoLongerThanIt) {
    const auto client = makeSystemRecording();
    EXPECT_TRUE(fakes_.appStateMonitor.hasHandler());
    stopped(*client);
    EXPECT_FALSE(fakes_.appStateMonitor.hasHandler());
    ASSERT_EQ(started(*client)->code(), 0);
    ASSERT_TRUE(fakes_.appStateMonitor.hasHandler());
    const auto player = makeRecording("Player", 500, 7);
    EXPECT_FALSE(fakes_.appStateMonitor.hasHandler());
}

TEST_F(SystemRecording, TheSoundsArePlayedForItAloneAndOnlyWhereTheRegionOrTheScreenReaderAsks) {
    struct Case {
        std::optional<bool> rule;
        bool reader;
        bool heard;
    };
    const auto client = makeEntitled();
    const auto player = makeConnected("Player", 500, 7);
    for (const Case& device : {Case{std::nullopt, false, false}, Case{false, false, false}, Case{true, false, true},
                               Case{std::nullopt, true, true}, Case{false, true, true}, Case{true, true, true}}) {
        fakes_.deviceInfo.setRegionalRule("RegionalBehaviorShutterClick", device.rule);
        fakes_.screenReader.setRunning(device.reader);
        fakes_.systemSounds.forget();
        ASSERT_EQ(player->start()->answers, 0);
        settle();
        stopped(*player);
        EXPECT_EQ(fakes_.systemSounds.played(), Sounds{});
        ASSERT_EQ(started(*client)->code(), 0);
        EXPECT_EQ(fakes_.systemSounds.played(), device.heard ? Sounds{1117} : Sounds{});
        stopped(*client);
        EXPECT_EQ(fakes_.systemSounds.played(), device.heard ? (Sounds{1117, 1118}) : Sounds{});
    }
}

TEST_F(SystemRecording, OneThatIsPreemptedIsKeptInItsUsersLibrary) {
    const auto client = makeSystemRecording();
    const std::string path = session(*client)->movieWriter()->outputPath();
    advance(seconds(2));
    const auto player = makeRecording("Player", 500, 7);
    EXPECT_EQ(client->toldOfStop(-5806), 1);
    ASSERT_EQ(client->told.size(), 1u);
    EXPECT_TRUE(client->told[0].arguments[1].isNull()) << "the application is not given the movie";
    ASSERT_EQ(fakes_.photoLibrary.assets().size(), 1u);
    EXPECT_EQ(fakes_.photoLibrary.assets()[0].movie.path(), path);
    EXPECT_FALSE(fakes_.fileSystem.exists(path)) << "the library has it";
    EXPECT_TRUE(session(*player)->isRecording());
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
}

TEST_F(SystemRecording, WhatThePreemptionLogs) {
    const auto client = makeSystemRecording();
    advance(seconds(1));
    const auto player = makeConnected("Player", 500, 7);
    fakes_.logSink.clear();
    player->start();
    settle();
    EXPECT_EQ(logged("LCRecordingManager:stopCurrentRecordingSession: Video saved to camera roll successful"), 1u);
    EXPECT_EQ(logged("stop monitoring foreground apps"), 2u) << "by the stop, and when it has stopped";
    EXPECT_EQ(logged("LCRecordingSession: cleanupSessionFiles"), 1u);
}

TEST_F(SystemRecording, WhoStartsInThePlaceOfAClientThatHasGoneIsNotToldOfItsEnd) {
    const auto client = makeSystemRecording();
    advance(seconds(1));
    client->connection->invalidate();
    settle();
    client->connect();
    settle();
    ASSERT_EQ(started(*client)->code(), 0);
    EXPECT_TRUE(client->told.empty());
    EXPECT_EQ(fakes_.photoLibrary.assets().size(), 1u);
    // One that begins anew over its own connection is.
    advance(seconds(1));
    ASSERT_EQ(started(*client)->code(), 0);
    EXPECT_EQ(client->toldOfStop(-5806), 1);
}

TEST_F(SystemRecording, ADeadSessionWithoutAClientIsReplacedByItsNextOne) {
    const auto client = makeSystemRecording();
    const auto dead = session(*client);
    client->connection->invalidate();
    settle();
    fakes_.displayCapture.lastSource()->mediaServicesWereReset();
    settle();
    client->connect();
    settle();
    EXPECT_NE(session(*client), dead);
    EXPECT_EQ(started(*client)->code(), 0);
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
}

TEST_F(SystemRecording, OneThatTheLibraryDoesNotTakeStaysWhereItIsUntilItIsPurged) {
    const auto client = makeSystemRecording();
    const std::string path = session(*client)->movieWriter()->outputPath();
    advance(seconds(2));
    fakes_.faults.failNext("PhotoLibrary.addVideo");
    const auto player = makeConnected("Player", 500, 7);
    fakes_.logSink.clear();
    player->start();
    settle();
    EXPECT_EQ(logged("LCRecordingManager:stopCurrentRecordingSession: Video saved to camera roll failed"), 1u);
    EXPECT_TRUE(fakes_.fileSystem.exists(path));
    EXPECT_EQ(client->toldOfStop(-5806), 1);
}

TEST_F(SystemRecording, APreemptedOneLeavesTheNextOnesWatchAlone) {
    const auto client = makeSystemRecording();
    advance(seconds(1));
    const auto other = makeSystemRecording("Remote", 601, 61);
    EXPECT_TRUE(session(*other)->isRecording());
    EXPECT_EQ(client->toldOfStop(-5806), 1);
    EXPECT_TRUE(fakes_.appStateMonitor.hasHandler());
    update(8, true, ProcessID{700});
    EXPECT_EQ(heard(*other), 700);
    // So does the next one of the same application.
    advance(seconds(1));
    ASSERT_EQ(started(*other)->code(), 0);
    EXPECT_TRUE(fakes_.appStateMonitor.hasHandler());
    EXPECT_EQ(fakes_.photoLibrary.assets().size(), 2u);
}

TEST_F(SystemRecording, TheLibraryIsNotGivenTheNewerOfTwoThatBeganInTheSameSecond) {
    const auto client = makeSystemRecording();
    const auto other = makeSystemRecording("Remote", 601, 61);
    ASSERT_EQ(session(*client)->movieWriter()->outputPath(), session(*other)->movieWriter()->outputPath());
    EXPECT_TRUE(fakes_.photoLibrary.assets().empty());
    EXPECT_EQ(client->toldOfStop(-5806), 1);
    advance(seconds(2));
    const auto asked = stopped(*other);
    ASSERT_TRUE(asked->url(0));
    EXPECT_TRUE(fakes_.fileSystem.exists(asked->url(0)->path()));
}

TEST_F(SystemRecording, NorTheMiddleOneOfThreeWhoseWriterIsGoneAgain) {
    const auto client = makeSystemRecording();
    const auto other = makeEntitled("Remote", 601, 61);
    const auto player = makeConnected("Player", 500, 7);
    const auto first = fakes_.containerWriters.recordings().back();
    first->holdFinish(true);
    other->start({}, kSystem);
    player->start();
    settle();
    ASSERT_TRUE(session(*player)->isRecording());
    first->holdFinish(false);
    settle();
    for (const auto& asset : fakes_.photoLibrary.assets())
        EXPECT_TRUE(asset.content && asset.content->finished) << asset.movie.path();
    EXPECT_EQ(client->toldOfStop(-5806), 1);
    EXPECT_EQ(other->toldOfStop(-5806), 1);
}

TEST_F(SystemRecording, StoppingThemAllKeepsEachInTheLibraryAndTellsOncePerRecording) {
    int calls = 0;
    const auto handler = [&](const auto&, const std::optional<URL>& url, const std::optional<Error>& error) {
        ++calls;
        EXPECT_TRUE(url);
        EXPECT_FALSE(error);
        EXPECT_EQ(fakes_.photoLibrary.assets().size(), 1u) << "the library was waited for";
    };
    onRequestLane([&](LCRecordingManager& manager) { manager.stopSystemRecordingWithHandler(handler); });
    EXPECT_EQ(calls, 0) << "none records";
    const auto player = makeRecording("Player", 500, 7);
    onRequestLane([&](LCRecordingManager& manager) { manager.stopSystemRecordingWithHandler(handler); });
    EXPECT_EQ(calls, 0) << "no system recording";
    EXPECT_TRUE(session(*player)->isRecording());
    const auto client = makeSystemRecording();
    onRequestLane([&](LCRecordingManager& manager) { manager.stopSystemRecordingWithHandler(handler); });
    EXPECT_EQ(calls, 1);
    EXPECT_FALSE(session(*client)->isRecording());
    EXPECT_EQ(logged("error saving file with code: %i"), 0u);
}

TEST_F(SystemRecording, AMovieOfOneThatTheLibraryDoesNotTakeIsLoggedWithItsCode) {
    const auto client = makeSystemRecording();
    fakes_.faults.failNext("PhotoLibrary.addVideo");
    int calls = 0;
    onRequestLane([&](LCRecordingManager& manager) {
        manager.stopSystemRecordingWithHandler([&](const auto&, const auto& url, const auto&) {
            ++calls;
            EXPECT_TRUE(url);
        });
    });
    EXPECT_EQ(calls, 1);
    EXPECT_EQ(logged("error saving file with code: 28"), 1u);
}

TEST_F(SystemRecording, AnInterruptionTellsTheClient) {
    const auto client = makeSystemRecording();
    onRequestLane([&](LCRecordingManager& manager) { manager.stopSystemRecordingWithInterruption(); });
    EXPECT_EQ(client->toldOfStop(-5806), 1);
    EXPECT_EQ(fakes_.photoLibrary.assets().size(), 1u);
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
}

TEST_F(SystemRecording, PausingAndResumingAreNotForIt) {
    const auto client = makeSystemRecording();
    client->tell(DaemonMessage::PauseRecording);
    settle();
    EXPECT_FALSE(session(*client)->isPaused());
    client->tell(DaemonMessage::ResumeRecording, {number(client->window)});
    settle();
    EXPECT_TRUE(session(*client)->isRecording());
}

TEST_F(SystemRecording, AFailureOfTheSourceEndsTheWatchAndTellsTheClient) {
    const auto client = makeSystemRecording();
    fakes_.displayCapture.lastSource()->fail(-1);
    settle();
    EXPECT_EQ(client->toldOfStop(-5817), 1);
    EXPECT_FALSE(fakes_.appStateMonitor.hasHandler());
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
}

}  // namespace
}  // namespace lumacast
