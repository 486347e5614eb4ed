// The ends of recordings of the whole display, and what is left of them.

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "tests/unit/daemon/SystemRecordingWorld.h"

namespace lumacast {
namespace {

using std::chrono::seconds;

class SystemRecordingEnds : public SystemRecordingWorld {
protected:
    /// The region asks for the sounds.
    void makeAudible() { fakes_.deviceInfo.setRegionalRule("RegionalBehaviorShutterClick", true); }
    void purge() {
        bool answered = false;
        fakes_.storagePurge.requestPurge(3, [&](std::optional<PurgeRecord>) { answered = true; });
        settle();
        EXPECT_TRUE(answered);
    }
};

TEST_F(SystemRecordingEnds, ThePreemptedOnesEndIsHeardBeforeTheNextOnesBeginning) {
    makeAudible();
    const auto client = makeSystemRecording();
    advance(seconds(1));
    const auto other = makeSystemRecording("Remote", 601, 61);
    ASSERT_TRUE(session(*other)->isRecording());
    EXPECT_EQ(fakes_.systemSounds.played(), (Sounds{1117, 1118, 1117}));
}

TEST_F(SystemRecordingEnds, AFurtherStopIsHeardToo) {
    makeAudible();
    const auto client = makeSystemRecording();
    ASSERT_EQ(stopped(*client)->answers, 1);
    EXPECT_EQ(stopped(*client)->answers, 0);
    EXPECT_EQ(fakes_.systemSounds.played(), (Sounds{1117, 1118, 1118})) << "deliberately also of an idle session";
}

TEST_F(SystemRecordingEnds, AnIdleOneIsNotAmongThoseThatAreStopped) {
    makeAudible();
    const auto client = makeSystemRecording();
    stopped(*client);
    fakes_.systemSounds.forget();
    fakes_.logSink.clear();
    onRequestLane([](LCRecordingManager& manager) {
        manager.stopSystemRecordingWithHandler([](const auto&, const auto&, const auto&) { FAIL() << "none records"; });
    });
    EXPECT_EQ(fakes_.systemSounds.played(), Sounds{});
    EXPECT_EQ(fakes_.logSink.logged(), Lines{});
}

TEST_F(SystemRecordingEnds, OneWithoutAMovieIsToldOfAndTheLibraryIsNotAsked) {
    const auto client = makeEntitled();
    fakes_.faults.failNext("ContainerWriters.make");
    ASSERT_EQ(started(*client)->code(), 0);
    fakes_.logSink.clear();
    int calls = 0;
    onRequestLane([&](LCRecordingManager& manager) {
        manager.stopSystemRecordingWithHandler([&](const auto& which, const auto& url, const auto& error) {
            ++calls;
            EXPECT_EQ(which, process_->manager().registeredSession(client->id));
            EXPECT_FALSE(url);
            ASSERT_TRUE(error);
            EXPECT_EQ(error->code(), -5812);
        });
    });
    EXPECT_EQ(calls, 1);
    EXPECT_TRUE(fakes_.photoLibrary.assets().empty());
    EXPECT_EQ(logged("error saving file with code: -5812"), 0u);
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
}

TEST_F(SystemRecordingEnds, AnActivationThatReportsAnInterruptedMovieEndsTheWatch) {
    const auto client = makeSystemRecording();
    client->tell(DaemonMessage::ClientDidBecomeActive);
    settle();
    EXPECT_TRUE(fakes_.appStateMonitor.hasHandler()) << "there is none to report";
    session(*client)->setInterruptedMovieURL(URL("file:///left.mp4"));
    client->tell(DaemonMessage::ClientDidBecomeActive);
    settle();
    EXPECT_EQ(client->toldOfStop(-5806), 1);
    EXPECT_EQ(logged("stop monitoring foreground apps"), 1u);
    EXPECT_FALSE(fakes_.appStateMonitor.hasHandler()) << "deliberately: a report is a report";
    EXPECT_TRUE(session(*client)->isRecording());
}

TEST_F(SystemRecordingEnds, AnUrgentPurgeEndsItWithItsClientAndWithout) {
    makeAudible();
    for (const bool clientStays : {true, false}) {
        const auto client = makeEntitled();
        ASSERT_EQ(started(*client)->code(), 0);
        const auto recorded = session(*client);
        const std::string path = recorded->movieWriter()->outputPath();
        fakes_.systemSounds.forget();
        if (!clientStays) client->connection->invalidate();
        settle();
        ASSERT_TRUE(recorded->isRecording());
        purge();
        EXPECT_FALSE(recorded->isRecording());
        EXPECT_FALSE(fakes_.appStateMonitor.hasHandler());
        EXPECT_EQ(fakes_.systemSounds.played(), Sounds{1118});
        EXPECT_EQ(client->toldOfStop(-5805), clientStays ? 1 : 0);
        EXPECT_EQ(client->told.size(), clientStays ? 1u : 0u);
        EXPECT_FALSE(fakes_.fileSystem.exists(path));
        EXPECT_TRUE(fakes_.photoLibrary.assets().empty());
        EXPECT_EQ(fakes_.keepAlive.open(), 0);
        if (!clientStays) client->connect();
        settle();
        ASSERT_EQ(started(*client)->code(), 0) << "the next one works";
        EXPECT_TRUE(fakes_.appStateMonitor.hasHandler());
        advance(seconds(1));
        EXPECT_TRUE(stopped(*client)->url(0));
        fakes_.fileSystem.remove(path);
        client->told.clear();
        advance(seconds(1));
    }
}

TEST_F(SystemRecordingEnds, ItsIdleSessionIsThereForItsClientsNextConnection) {
    const auto client = makeSystemRecording();
    const auto recorded = session(*client);
    stopped(*client);
    client->connection->invalidate();
    settle();
    EXPECT_EQ(session(*client), recorded) << "deliberately, though nothing records";
    EXPECT_EQ(recorded->clientProxy()->connection(), nullptr);
    client->connect();
    settle();
    EXPECT_EQ(session(*client), recorded);
    EXPECT_EQ(started(*client)->code(), 0);
}

TEST_F(SystemRecordingEnds, ADeadSessionGoesWithItsClient) {
    const auto client = makeSystemRecording();
    fakes_.displayCapture.lastSource()->mediaServicesWereReset();
    settle();
    ASSERT_TRUE(session(*client));
    client->connection->invalidate();
    settle();
    EXPECT_FALSE(session(*client)) << "it can't deliver anything any more";
}

TEST_F(SystemRecordingEnds, WhatTookItsNameIsNotItsMovieEvenWhenBothHaveBegunAnewMeanwhile) {
    const auto client = makeSystemRecording();
    const auto first = fakes_.containerWriters.recordings().back();
    const std::string path = session(*client)->movieWriter()->outputPath();
    first->holdFinish(true);
    const auto other = makeSystemRecording("Remote", 601, 61);
    ASSERT_EQ(session(*other)->movieWriter()->outputPath(), path) << "they began in the same second";
    advance(seconds(2));
    ASSERT_TRUE(stopped(*other)->url(0));
    ASSERT_EQ(started(*other)->code(), 0);
    advance(seconds(2));
    ASSERT_EQ(started(*client)->code(), 0);
    first->holdFinish(false);
    settle();
    EXPECT_EQ(client->toldOfStop(-5806), 1);
    for (const auto& asset : fakes_.photoLibrary.assets()) EXPECT_NE(asset.movie.path(), path);
    EXPECT_TRUE(fakes_.fileSystem.exists(path)) << "it is the other one's";
}

TEST_F(SystemRecordingEnds, ThatTheDisplaysMayBeStoppedCutsNoApplicationsRecording) {
    fakes_.displayCapture.setAutomatic(true);
    const auto player = makeRecording("Player", 500, 7);
    advance(seconds(1));
    onRequestLane([](LCRecordingManager& manager) { manager.notifySystemRecordingMayBeStopped(); });
    advance(seconds(1));
    const auto whole = stopped(*player);
    ASSERT_TRUE(whole->url(0));
    EXPECT_NEAR(fakes_.fileSystem.movie(whole->url(0)->path())->duration().seconds(), 2, 0.1);
}

/// A session that always counts as a system recording under way, with a movie of its own name.
class AlwaysRecording final : public LCRecordingSession {
public:
    using LCRecordingSession::LCRecordingSession;
    void finishSessionWithStartClipDuration(double, double, FinishHandler handler) override {
        handler(URL::file("/movies/" + bundleID().text()), std::nullopt);
    }
};

TEST(SystemRecordingsAtOnce, AreStoppedAllAndToldOfOnceEachWithTheirOwnMovie) {
    SimWorld world(1);
    Process process(world.fakes.platform(), [](const SessionServices& services, const BundleIdentifier& id) {
        return std::make_shared<AlwaysRecording>(services, id);
    });
    const std::vector<std::string> names{"org.example.A", "org.example.B", "org.example.C"};
    std::map<std::string, std::vector<std::string>> told;
    world.scheduler.mainQueue().sync([&] {
        for (const std::string& name : names) {
            world.fakes.fileSystem.addUsersFile(FakeIpc::kUser, "/movies/" + name, 10);
            const auto session = process.manager().recordingSessionForBundleID(BundleIdentifier(name));
            session->setSystemRecording(name != "org.example.C");
            session->setRecording(true);
            session->managerRecord.user = FakeIpc::kUser;
        }
        process.manager().stopSystemRecordingWithHandler(
            [&](const std::shared_ptr<LCRecordingSession>& session, const std::optional<URL>& url, const auto& error) {
                EXPECT_TRUE(world.scheduler.mainQueue().isCurrent());
                EXPECT_FALSE(error);
                told[session->bundleID().text()].push_back(url ? url->path() : "");
            });
    });
    world.scheduler.runUntilIdle();
    EXPECT_EQ(told, (std::map<std::string, std::vector<std::string>>{{names[0], {"/movies/" + names[0]}},
                                                                     {names[1], {"/movies/" + names[1]}}}));
    EXPECT_EQ(world.fakes.photoLibrary.assets().size(), 2u);
    EXPECT_EQ(world.fakes.logSink.count("LCRecordingManager: stopRecordingSession:handler:"), 2u);
    world.scheduler.endWorld();
}

}  // namespace
}  // namespace lumacast
