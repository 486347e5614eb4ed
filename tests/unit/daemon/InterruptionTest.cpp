// What a start does to the sessions of other applications.

#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {
namespace {

/// A session that answers a finish although it does not record.
class AnsweringSession final : public LCRecordingSession {
public:
    using LCRecordingSession::LCRecordingSession;
    void finishSessionWithStartClipDuration(double, double, FinishHandler handler) override {
        handler(URL("file:///left.mp4"), std::nullopt);
    }
};

/// The editor's session is one of those.
std::shared_ptr<LCRecordingSession> makeAnsweringEditor(const SessionServices& services, const BundleIdentifier& id) {
    if (id.text() == "org.example.Editor") return std::make_shared<AnsweringSession>(services, id);
    return std::make_shared<LCRecordingSession>(services, id);
}

/// Two applications, of which the player starts to record.
struct Interruption {
    explicit Interruption(LCRecordingManager::SessionMaker makeSession = {})
        : process(world.fakes.platform(), std::move(makeSession)) {
        world.fakes.preferences.set(kPreferenceDomain, "LCSuppressAlert", true);
        world.scheduler.mainQueue().sync([&] { process.start(); });
        player.connect();
        editor.connect();
        world.scheduler.runUntilIdle();
    }
    ~Interruption() { world.scheduler.endWorld(); }

    void start() {
        const auto asked = player.start();
        world.scheduler.runUntilIdle();
        EXPECT_EQ(asked->answers, 1);
        EXPECT_EQ(asked->code(), 0);
    }

    SimWorld world{1};
    Process process;
    TestClient player{world.fakes, "org.example.Player", "Player", ProcessID{500}, ContextID{7}};
    TestClient editor{world.fakes, "org.example.Editor", "Editor", ProcessID{501}, ContextID{8}};
};

TEST(InterruptionTest, WhatAnswersAFinishIsToldOfItAndReset) {
    Interruption of(&makeAnsweringEditor);
    const auto other = of.process.manager().registeredSession(of.editor.id);
    other->setPaused(true);
    of.start();
    EXPECT_EQ(of.world.fakes.logSink.count("interrupted session"), 1u);
    ASSERT_EQ(of.editor.told.size(), 1u);
    EXPECT_TRUE(of.editor.told[0].arguments[0].isNull()) << "the finish had no error";
    EXPECT_EQ(of.editor.told[0].arguments[1], Value(URL("file:///left.mp4")));
    EXPECT_EQ(other->interruptedMovieURL(), URL("file:///left.mp4"));
    EXPECT_FALSE(other->isPaused());
    EXPECT_EQ(of.world.fakes.keepAlive.ended(), 0) << "a reset without a beginning ends nothing";
}

TEST(InterruptionTest, OneThatIsToldOfItIsOnlyTold) {
    Interruption of(&makeAnsweringEditor);
    // Of one that has recorded the display, a report would log more and clear the watch.
    of.process.manager().registeredSession(of.editor.id)->setSystemRecording(true);
    of.start();
    ASSERT_EQ(of.editor.told.size(), 1u);
    EXPECT_EQ(of.editor.told[0].message, ClientMessage::StopRecordingWithError);
    const FakeLogSink& log = of.world.fakes.logSink;
    EXPECT_EQ(log.count("LCClientProxy:stopRecordingWithError:movieURL:"), 1u);
    EXPECT_EQ(log.count("LCRecordingManager:recordingSessionStoppedWithError:movieURL:"), 0u);
    EXPECT_EQ(log.count("stop monitoring foreground apps"), 0u);
    EXPECT_TRUE(of.world.fakes.userAlerts.shown().empty());
}

TEST(InterruptionTest, AnIdleSessionStaysSilent) {
    Interruption of;
    of.start();
    EXPECT_EQ(of.world.fakes.logSink.count("interrupted session"), 0u);
    EXPECT_TRUE(of.editor.told.empty());
}

/// A session that notes how another one looked when it was asked to finish.
class WatchingSession final : public LCRecordingSession {
public:
    using LCRecordingSession::LCRecordingSession;
    void finishSessionWithStartClipDuration(double, double, FinishHandler) override {
        wasRecording = watched->isRecording();
        wasBroadcasting = watched->isBroadcasting();
        hadWriter = watched->movieWriter() != nullptr;
    }
    const LCRecordingSession* watched = nullptr;
    std::optional<bool> wasRecording, wasBroadcasting, hadWriter;
};

TEST(InterruptionTest, TheOthersAreInterruptedWhenTheSessionCountsAsRecordingButHasNotBegun) {
    Interruption of([](const SessionServices& services, const BundleIdentifier& id) {
        std::shared_ptr<LCRecordingSession> session;
        if (id.text() == "org.example.Editor")
            session = std::make_shared<WatchingSession>(services, id);
        else
            session = std::make_shared<LCRecordingSession>(services, id);
        return session;
    });
    const auto other =
        std::static_pointer_cast<WatchingSession>(of.process.manager().registeredSession(of.editor.id));
    const auto starting = of.process.manager().registeredSession(of.player.id);
    other->watched = starting.get();
    starting->setIsBroadcasting(true);  // of an earlier recording
    of.start();
    EXPECT_EQ(other->wasRecording, true);
    EXPECT_EQ(other->wasBroadcasting, false) << "it has the request's flag by then";
    EXPECT_EQ(other->hadWriter, false);
}

}  // namespace
}  // namespace lumacast
