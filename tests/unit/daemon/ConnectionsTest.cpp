// Connections, and the registry of sessions that they make and end.

#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {
namespace {

class Connections : public DaemonWorld {};

TEST_F(Connections, NothingIsAcceptedBeforeTheStartUpIsFinished) {
    SimWorld world(1);
    Process process(world.fakes.platform());
    TestClient client(world.fakes, "org.example.Player", "Player", ProcessID{500}, ContextID{7});
    client.connect();
    world.scheduler.runUntilIdle();
    EXPECT_EQ(world.fakes.logSink.logged(), Lines{"_srSetupTempDirectory"});
    world.scheduler.mainQueue().sync([&] { process.start(); });
    world.scheduler.runUntilIdle();
    EXPECT_EQ(world.fakes.logSink.count("accepted client connection PID: 500"), 1u);
    world.scheduler.endWorld();
}

TEST_F(Connections, AProcessWithoutNumberIsRefusedAndLeavesTheRegistryAlone) {
    fakes_.logSink.clear();
    const auto client = makeConnected("Nobody", 0);
    EXPECT_EQ(client->losses, 1);
    EXPECT_FALSE(session(*client));
    EXPECT_EQ(fakes_.logSink.logged(), Lines{"LCRecordingManager: shouldAcceptNewConnection:"});
}

TEST_F(Connections, AnUnknownApplicationIsRefused) {
    auto client = makeClient("Ghost", 501);
    fakes_.bundles.uninstall(client->id);
    fakes_.logSink.clear();
    client->connect();
    settle();
    EXPECT_EQ(client->losses, 1);
    EXPECT_FALSE(session(*client));
    EXPECT_EQ(logged("LCRecordingManager:recordingSessionForBundleID"), 0u);
    EXPECT_EQ(logged("accepted client connection PID: 501"), 0u);
}

TEST_F(Connections, TheFirstConnectionMakesAnIdleSession) {
    fakes_.logSink.clear();
    const auto client = makeConnected();
    ASSERT_TRUE(session(*client));
    EXPECT_FALSE(session(*client)->isRecording());
    EXPECT_EQ(session(*client)->bundleID(), client->id);
    EXPECT_EQ(session(*client)->clientProxy()->bundleIdentifier(), client->id);
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"LCRecordingManager: shouldAcceptNewConnection:", "accepted client connection PID: 500",
                     "LCRecordingManager:recordingSessionForBundleID", "no session, creating a new one",
                     "LCRecordingManager:removeAcknowledgementExemptionIfOverThreshholdForBundleID:"}));
}

TEST_F(Connections, ASecondConnectionRetiresTheFirstWithoutStoppingTheRecording) {
    const auto client = makeRecording();
    const auto before = session(*client);
    const auto first = client->connection;
    client->connect();
    settle();
    EXPECT_EQ(client->losses, 1);
    EXPECT_EQ(session(*client), before);
    EXPECT_TRUE(before->isRecording());
    EXPECT_EQ(logged("no session, creating a new one"), 0u);
    EXPECT_EQ(logged("connection INVALID"), 0u);
    EXPECT_EQ(logged("LCRecordingManager: applicationDisconnected"), 0u);
    const auto stop = client->ask(DaemonMessage::StopRecording);
    settle();
    EXPECT_TRUE(stop->url(0)) << "the new connection goes on with the same recording";
}

TEST_F(Connections, CallbacksGoToTheNewestConnectionOnly) {
    const auto client = makeRecording();
    TestClient second(fakes_, "org.example.Player", "Player", ProcessID{501}, ContextID{8});
    second.connect();
    settle();
    fakes_.displayCapture.lastSource()->preempt();
    settle();
    EXPECT_EQ(client->told.size(), 0u);
    EXPECT_EQ(second.toldOfStop(-5806), 1);
}

TEST_F(Connections, ALostConnectionWhileRecordingStopsDeletesAndRemoves) {
    const auto client = makeRecording();
    ASSERT_TRUE(fakes_.fileSystem.exists(pathOf("Player")));
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
    client->die();
    settle();
    EXPECT_FALSE(session(*client));
    EXPECT_FALSE(fakes_.fileSystem.exists(pathOf("Player")));
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
    EXPECT_FALSE(fakes_.displayCapture.lastSource() && fakes_.displayCapture.lastSource()->isRunning());
    const Lines lines = fakes_.logSink.logged();
    const Lines expected =
        joined(joined({"connection INVALID", "LCRecordingManager: applicationDisconnected",
                       "LCRecordingManager: stopRecordingSession:handler:", "recording stopped without handler!",
                       "LCRecordingSession: cleanupSessionFiles", "LCRecordingSession: stop"},
                      captureStops()),
               {"recordedFileSize for URL 1000 bytes", "LCRecordingManager:removeSessionForBundleID",
                "LCRecordingManager:resetStatesForSession:"});
    EXPECT_EQ(lines, expected);
}

TEST_F(Connections, ALostConnectionOfAnIdleApplicationRemovesItsSession) {
    const auto client = makeConnected();
    fakes_.logSink.clear();
    client->die();
    settle();
    EXPECT_FALSE(session(*client));
    EXPECT_EQ(logged("LCRecordingManager:removeSessionForBundleID"), 1u);
    EXPECT_EQ(logged("recording stopped without handler!"), 0u);
}

TEST_F(Connections, ALostConnectionOfASystemRecordingOnlyLosesTheConnection) {
    const auto client = makeRecording();
    const auto kept = session(*client);
    kept->setSystemRecording(true);
    client->die();
    settle();
    EXPECT_EQ(session(*client), kept);
    EXPECT_TRUE(kept->isRecording());
    EXPECT_FALSE(kept->clientProxy()->connection());
    EXPECT_EQ(logged("LCRecordingManager: stopRecordingSession:handler:"), 0u);
}

TEST_F(Connections, TheOthersKeepTheirSessions) {
    const auto first = makeConnected("Player", 500, 7), second = makeConnected("Editor", 501, 8);
    first->die();
    settle();
    EXPECT_FALSE(session(*first));
    EXPECT_TRUE(session(*second));
}

TEST_F(Connections, AnApplicationThatComesBackGetsANewSession) {
    const auto client = makeRecording();
    const auto before = session(*client);
    client->die();
    settle();
    TestClient again(fakes_, "org.example.Player", "Player", ProcessID{502}, ContextID{7});
    again.connect();
    settle();
    EXPECT_NE(session(again), before);
    EXPECT_FALSE(session(again)->isRecording());
}

}  // namespace
}  // namespace lumacast
