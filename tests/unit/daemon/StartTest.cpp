// The start request: its checks in their order, making room, and what the client is answered.

#include <limits>

#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

constexpr char kStartLine[] =
    "LCRecordingManager:startRecordingWindowLayerContextID:windowSize:microphoneEnabled:streaming:withHandler:";
constexpr char kMakingRoom[] = "LCRecordingManager:stopCurrentRecordingSession:";

class Start : public DaemonWorld {
protected:
    /// What the client's start was answered with.
    TestClient::AskedRef started(TestClient& client, TestClient::Flags flags = {}) {
        fakes_.logSink.clear();
        auto asked = client.start({client.window}, flags);
        settle();
        return asked;
    }
    static void expectRefused(const TestClient::Asked& asked, std::int64_t code) {
        ASSERT_EQ(asked.answers, 1);
        EXPECT_EQ(asked.code(), code);
        ASSERT_TRUE(asked.error(0));
        EXPECT_EQ(asked.error(0)->domain(), "com.orvane.Lumacast.LCRecordingErrorDomain");
        EXPECT_EQ(asked.values[1], Value(false));
        EXPECT_EQ(asked.values[2], Value(false));
    }
    /// Nothing was begun for the client, and nothing stays open.
    void expectIdle(const TestClient& client) {
        EXPECT_FALSE(session(client)->isRecording());
        EXPECT_FALSE(session(client)->movieWriter());
        EXPECT_EQ(fakes_.keepAlive.open(), 0);
    }
};

TEST_F(Start, ARecordingIsAnsweredWithTheFlagsItWasAskedFor) {
    const auto client = makeConnected();
    for (const bool microphone : {true, false}) {
        const auto asked = started(*client, {.microphone = microphone, .camera = !microphone});
        ASSERT_EQ(asked->answers, 1);
        EXPECT_TRUE(asked->values[0].isNull());
        EXPECT_EQ(asked->values[1], Value(microphone));
        EXPECT_EQ(asked->values[2], Value(!microphone));
        EXPECT_EQ(session(*client)->microphoneEnabled(), microphone);
    }
}

TEST_F(Start, TheSessionIsGivenWhatTheRequestSays) {
    const auto client = makeConnected();
    fakes_.renderServer.addLayer(ContextID{9}, client->pid);
    const auto asked = client->start({client->window, ContextID{9}});
    settle();
    ASSERT_EQ(asked->code(), 0);
    EXPECT_TRUE(session(*client)->isRecording());
    EXPECT_FALSE(session(*client)->isBroadcasting());
    EXPECT_FALSE(session(*client)->isSystemRecording());
    EXPECT_EQ(session(*client)->contextIDs(), (std::vector<ContextID>{client->window, ContextID{9}}));
    EXPECT_EQ(session(*client)->originalWindowSize(), (Size{640, 360}));
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
    EXPECT_TRUE(fakes_.displayCapture.lastSource()->isRunning());
}

TEST_F(Start, TheRenderServersPortsAreReleased) {
    const auto client = makeConnected();
    started(*client);
    EXPECT_EQ(fakes_.renderServer.portsOpen(), 0);
}

TEST_F(Start, ASystemRecordingWithoutTheEntitlementIsRefusedBeforeAnythingElse) {
    const auto other = makeRecording("Editor", 501, 8);
    const auto client = makeConnected();
    fakes_.fileSystem.setFreeSize(0);
    fakes_.logSink.clear();
    const auto asked = client->start({ContextID{8}}, {.system = true});
    settle();
    expectRefused(*asked, -5810);
    EXPECT_TRUE(session(*other)->isRecording());
    EXPECT_EQ(logged(kStartLine), 0u);
    EXPECT_EQ(logged(kMakingRoom), 0u);
}

TEST_F(Start, AnEntitlementCountsOnlyWhenItIsTrue) {
    const auto client = makeConnected();
    for (const Value& value : {Value(false), Value("true"), Value(std::int64_t{1})}) {
        fakes_.ipc.grant(client->pid, "com.orvane.private.luma-cast", value);
        expectRefused(*started(*client, {.system = true}), -5810);
    }
    fakes_.ipc.grant(client->pid, "com.orvane.private.luma-cast", true);
    const auto asked = started(*client, {.system = true});
    ASSERT_EQ(asked->answers, 1);
    EXPECT_NE(asked->code(), -5810);
}

TEST_F(Start, WindowsThatAreNotTheCallersAreRefusedBeforeTheCurrentRecordingIsStopped) {
    const auto other = makeRecording("Editor", 501, 8);
    const auto client = makeConnected();
    const std::vector<std::vector<ContextID>> lists{{other->window},
                                                    {ContextID{0}},
                                                    {ContextID{4711}},
                                                    {client->window, other->window},
                                                    {client->window, ContextID{0}}};
    for (const auto& windows : lists) {
        fakes_.logSink.clear();
        const auto asked = client->start(windows);
        settle();
        expectRefused(*asked, -5803);
        EXPECT_TRUE(session(*other)->isRecording());
        EXPECT_EQ(logged(kStartLine), 0u);
        EXPECT_EQ(logged(kMakingRoom), 0u);
    }
    EXPECT_EQ(fakes_.renderServer.portsOpen(), 0);
}

TEST_F(Start, AWindowWhoseProcessHasNoApplicationIsNobodys) {
    const auto client = makeConnected();
    fakes_.renderServer.addLayer(ContextID{20}, ProcessID{900});
    const auto asked = client->start({ContextID{20}});
    settle();
    expectRefused(*asked, -5803);
}

TEST_F(Start, AnEmptyListOfWindowsPasses) {
    const auto client = makeConnected();
    const auto asked = client->start(std::vector<ContextID>{});
    settle();
    ASSERT_EQ(asked->answers, 1);
    EXPECT_TRUE(asked->values[0].isNull());
    EXPECT_TRUE(session(*client)->isRecording());
}

TEST_F(Start, OneHundredMillionFreeBytesAreNotEnough) {
    const auto client = makeConnected();
    fakes_.fileSystem.setFreeSize(100'000'000);
    expectRefused(*started(*client), -5805);
    EXPECT_EQ(logged("insufficient disk space for recording, calling handler with error"), 1u);
    EXPECT_EQ(logged("LCRecordingManager: suppressAlert=1"), 0u);
    expectIdle(*client);
    fakes_.fileSystem.setFreeSize(100'000'001);
    EXPECT_EQ(started(*client)->code(), 0);
}

TEST_F(Start, AStartThatFailsForLackOfSpaceHasStillStoppedThePreviousRecording) {
    const auto other = makeRecording("Editor", 501, 8);
    const auto client = makeConnected();
    fakes_.fileSystem.setFreeSize(1000);
    expectRefused(*started(*client), -5805);
    EXPECT_FALSE(session(*other)->isRecording());
    EXPECT_EQ(other->toldOfStop(-5806), 1);
}

TEST_F(Start, AnApplicationThatIsNotInTheForegroundIsRefused) {
    const auto client = makeConnected();
    fakes_.appStateMonitor.setState(client->id, 4);
    expectRefused(*started(*client), -5803);
    EXPECT_EQ(logged("app is not in the foreground, calling handler with error"), 1u);
    EXPECT_EQ(logged("LCRecordingManager: suppressAlert=1"), 0u);
    expectIdle(*client);
    fakes_.appStateMonitor.setState(client->id, 12);
    EXPECT_EQ(started(*client)->code(), 0) << "one bit of several";
}

TEST_F(Start, AStartThatIsRefusedForTheForegroundOrByTheUserHasStillStoppedThePreviousRecording) {
    fakes_.userAlerts.setUser([](const AlertContent&) { return UserAlert::Response::OtherButton; });
    for (const bool inForeground : {false, true}) {
        const auto other = makeRecording("Editor", 501, 8);
        const auto client = makeConnected();
        fakes_.appStateMonitor.setState(client->id, inForeground ? 8 : 4);
        fakes_.preferences.set(kPreferenceDomain, "LCSuppressAlert", !inForeground);
        EXPECT_EQ(started(*client)->code(), inForeground ? -5801 : -5803);
        EXPECT_FALSE(session(*other)->isRecording());
        EXPECT_EQ(other->toldOfStop(-5806), 1);
        fakes_.preferences.set(kPreferenceDomain, "LCSuppressAlert", true);
    }
}

TEST_F(Start, TheAnswerHasTheManagersFlagsOfThatMomentNotTheRequests) {
    const auto client = makeConnected();
    const auto first = client->start({client->window}, {.microphone = true, .camera = true});
    const auto second = client->start();
    settle();
    ASSERT_EQ(first->answers + second->answers, 2);
    EXPECT_EQ(first->values[1], Value(false));
    EXPECT_EQ(first->values[2], Value(false));
}

TEST_F(Start, LackOfSpaceIsFoundBeforeTheForeground) {
    const auto client = makeConnected();
    fakes_.appStateMonitor.setState(client->id, 4);
    fakes_.fileSystem.setFreeSize(0);
    expectRefused(*started(*client), -5805);
}

TEST_F(Start, WithoutThePreferenceTheUserIsAsked) {
    fakes_.userAlerts.setUser([](const AlertContent&) { return UserAlert::Response::OtherButton; });
    const auto client = makeConnected();
    fakes_.preferences.set(kPreferenceDomain, "LCSuppressAlert", false);
    expectRefused(*started(*client), -5801);
    EXPECT_EQ(logged("LCRecordingManager: suppressAlert=0"), 1u);
    EXPECT_EQ(logged("starting..."), 0u);
    fakes_.preferences.erase(kPreferenceDomain, "LCSuppressAlert");
    expectRefused(*started(*client), -5801);
    EXPECT_EQ(logged("LCRecordingManager: suppressAlert=0"), 1u);
    expectIdle(*client);
}

TEST_F(Start, ABroadcastWithoutSetUpIsRefusedWithoutDescriptionAndItsTransactionClosed) {
    fakes_.bundles.setPreferredLanguages({"en"});
    const auto client = makeConnected();
    const auto asked = started(*client, {.broadcast = true});
    expectRefused(*asked, -5808);
    EXPECT_TRUE(asked->error(0)->userInfo().empty());
    EXPECT_EQ(fakes_.keepAlive.begun(), 1);
    expectIdle(*client);
    const Lines lines = fakes_.logSink.logged();
    const auto at = std::find(lines.begin(), lines.end(), "starting...");
    ASSERT_NE(at, lines.end());
    EXPECT_EQ(
        Lines(at, std::min(at + 3, lines.end())),
        (Lines{"starting...", "broadcast requested", "attempted to start broadcast without a session, bailing out"}));
}

TEST_F(Start, ASecondStartOfTheSameApplicationInterruptsItsOwnRecording) {
    const auto client = makeRecording();
    advance(seconds(2));
    const auto first = fakes_.containerWriters.lastRecording();
    client->journal.clear();
    const auto again = started(*client);
    ASSERT_EQ(again->code(), 0);
    EXPECT_EQ(client->toldOfStop(-5806), 1);
    EXPECT_EQ(client->told.size(), 1u);
    EXPECT_TRUE(client->told[0].arguments[1].isNull()) << "the interrupted movie is not handed out";
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
    EXPECT_TRUE(session(*client)->isRecording());
    advance(seconds(3));
    const auto stop = client->ask(DaemonMessage::StopRecording);
    settle();
    ASSERT_TRUE(stop->url(0));
    EXPECT_NE(fakes_.containerWriters.lastRecording(), first);
    const auto movie = fakes_.fileSystem.movie(stop->url(0)->path());
    ASSERT_TRUE(movie) << "the older recording's end has not removed the newer one's file";
    EXPECT_NEAR(movie->duration().seconds(), 3, 0.1);
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
}

TEST_F(Start, AProcessThatTakesTheClientsPlaceBeforeItIsToldHasLostNothing) {
    for (const bool isSameProcess : {false, true}) {
        SCOPED_TRACE(isSameProcess);
        const auto client = makeRecording();
        advance(seconds(1));
        const auto first = fakes_.containerWriters.lastRecording();
        first->holdFinish(true);
        client->start();
        settle();
        ASSERT_TRUE(client->told.empty()) << "the older movie is not finished yet";
        std::unique_ptr<TestClient> next;
        if (isSameProcess) {
            client->connect();
            settle();
        } else {
            next = makeConnected("Player", 501);
        }
        first->holdFinish(false);
        settle();
        EXPECT_EQ(client->toldOfStop(-5806), isSameProcess ? 1 : 0);
        if (next) {
            EXPECT_TRUE(next->told.empty());
            next->die();
        }
        client->die();
        settle();
    }
}

TEST_F(Start, ASizeThatNoPictureCanHaveIsRefusedAndSpoilsNothing) {
    const auto client = makeConnected();
    constexpr double kNone = std::numeric_limits<double>::quiet_NaN();
    constexpr double kEndless = std::numeric_limits<double>::infinity();
    // The last two lose their short side to the cap.
    for (const auto& [width, height] : {std::pair{0.0, 0.0}, {kNone, 360.0}, {640.0, kEndless}, {-640.0, 360.0},
                                        {640.0, 0.5}, {5000.0, 1.0}, {640.0, 2e9}}) {
        const auto asked = client->ask(
            DaemonMessage::StartRecording,
            {Array{number(client->window)}, Array{width, height}, false, false, false, false, false, Value()});
        settle();
        expectRefused(*asked, -5803);
    }
    EXPECT_EQ(started(*client)->code(), 0);
    EXPECT_EQ(session(*client)->windowSize(), (Size{640, 360}));
}

TEST_F(Start, ANarrowSizeIsFineWhereNothingIsCapped) {
    fakes_.preferences.set(kPreferenceDomain, "LCFullResCapture", true);
    const auto client = makeConnected();
    const auto asked =
        client->ask(DaemonMessage::StartRecording,
                    {Array{number(client->window)}, Array{5000.0, 1.0}, false, false, false, false, false, Value()});
    settle();
    EXPECT_EQ(asked->answers, 1);
    EXPECT_EQ(asked->code(), 0);
    EXPECT_EQ(session(*client)->windowSize(), (Size{5000, 1}));
    EXPECT_EQ(logged("full res capture enabled"), 1u) << "asking whether the size is fine says nothing";
}

TEST_F(Start, ARestartEndsTheOlderRecordingOnlyWhenItsStopIsAnswered) {
    const auto client = makeRecording();
    advance(seconds(1));
    started(*client);
    const auto lines = fakes_.logSink.logged();
    const auto at = [&](std::string_view line) {
        return std::find(lines.begin(), lines.end(), line) - lines.begin();
    };
    EXPECT_EQ(logged("LCRecordingManager:resetStatesForSession:"), 1u);
    EXPECT_LT(at("LCRecordingSession: finishWritingWithHandler"), at("LCClientProxy:stopRecordingWithError:movieURL:"));
    EXPECT_LT(at("LCClientProxy:stopRecordingWithError:movieURL:"), at("LCRecordingManager:resetStatesForSession:"));
    EXPECT_TRUE(session(*client)->isRecording());
    EXPECT_EQ(fakes_.keepAlive.timesIdle(), 0) << "the daemon was idle between two recordings";
}

TEST_F(Start, ABroadcastThatNobodySetUpStillDiscardsTheRecordingItEnded) {
    const auto client = makeRecording();
    advance(seconds(1));
    ASSERT_TRUE(fakes_.fileSystem.exists(pathOf("Player")));
    EXPECT_EQ(started(*client, {.broadcast = true})->code(), -5808);
    EXPECT_EQ(client->toldOfStop(-5806), 1);
    EXPECT_FALSE(fakes_.fileSystem.exists(pathOf("Player")));
    EXPECT_FALSE(session(*client)->isRecording());
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
    EXPECT_EQ(logged("start request 2 refused with -5808: no broadcast has been set up"), 1u);
}

TEST_F(Start, AStopThatIsNeverAnsweredIsResetByTheNextStart) {
    const auto client = makeRecording();
    fakes_.faults.failNext("MovieExporter.export");
    client->ask(DaemonMessage::StopRecordingWithClipDurations, {1.0, 1.0});
    settle();
    EXPECT_EQ(fakes_.keepAlive.open(), 1) << "the trim failed";
    EXPECT_EQ(started(*client)->code(), 0);
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
    EXPECT_EQ(logged("LCRecordingManager:resetStatesForSession:"), 1u);
}

TEST(AlertQueueTest, IsMadeOnceHoweverOftenItIsAskedFor) {
    SimWorld world(1);
    Process process(world.fakes.platform());
    SerialQueue& queue = process.manager().lumaAlertQueue();
    EXPECT_EQ(&queue, &process.manager().lumaAlertQueue());
    EXPECT_EQ(queue.label(), "com.lumacast.alertQueue");
    world.scheduler.endWorld();
}

TEST_F(Start, ASecondStartLeavesTheLastMovieWholeInEveryInterleaving) {
    for (std::uint64_t seed = 1; seed <= 60; ++seed) {
        SCOPED_TRACE(seed);
        SimWorld world(seed);
        world.fakes.preferences.set(kPreferenceDomain, "LCSuppressAlert", true);
        world.fakes.displayCapture.setPlanes(1 << 20);
        Process process(world.fakes.platform());
        world.scheduler.mainQueue().sync([&] { process.start(); });
        TestClient client(world.fakes, "org.example.Player", "Player", ProcessID{500}, ContextID{7});
        client.connect();
        world.scheduler.runUntilIdle();
        const auto first = client.start();
        for (std::uint64_t i = seed % 40; i > 0; --i) world.scheduler.step();
        const auto second = client.start();
        world.scheduler.advance(seconds(2));
        const auto stop = client.ask(DaemonMessage::StopRecording);
        world.scheduler.advance(seconds(1));
        EXPECT_EQ(first->answers, 1);
        EXPECT_EQ(second->answers, 1);
        EXPECT_EQ(client.toldOfStop(-5806), 1);
        ASSERT_TRUE(stop->url(0));
        const auto movie = world.fakes.fileSystem.movie(stop->url(0)->path());
        ASSERT_TRUE(movie);
        EXPECT_NEAR(movie->duration().seconds(), 2, 0.1);
        EXPECT_EQ(world.fakes.keepAlive.open(), 0);
        world.scheduler.endWorld();
    }
}

TEST_F(Start, AnotherApplicationsRecordingIsDiscardedAndItsClientTold) {
    const auto other = makeRecording("Editor", 501, 8);
    const auto client = makeConnected();
    ASSERT_EQ(started(*client)->code(), 0);
    EXPECT_EQ(other->toldOfStop(-5806), 1);
    EXPECT_TRUE(other->told[0].arguments[1].isNull());
    EXPECT_FALSE(fakes_.fileSystem.exists(pathOf("Editor")));
    EXPECT_FALSE(session(*other)->isRecording());
    EXPECT_TRUE(session(*client)->isRecording());
    EXPECT_TRUE(client->told.empty());
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
    EXPECT_EQ(logged("LCRecordingManager:interruptRecordingSessions"), 1u);
}

TEST_F(Start, AStartWhoseMovieCannotBeMadeIsAnsweredAsStarted) {
    const auto client = makeConnected();
    fakes_.faults.failNext("ContainerWriters.make");
    EXPECT_EQ(started(*client)->code(), 0);
    advance(seconds(1));
    const auto stop = client->ask(DaemonMessage::StopRecording);
    settle();
    ASSERT_EQ(stop->answers, 1);
    EXPECT_FALSE(stop->url(0));
    ASSERT_TRUE(stop->error(1));
    EXPECT_EQ(stop->error(1)->code(), -5812);
}

TEST_F(Start, AnApplicationRecordingClearsTheMonitorsHandler) {
    int updates = 0;
    fakes_.appStateMonitor.setHandler([&](std::int64_t, bool, ProcessID) { ++updates; });
    const auto client = makeConnected();
    started(*client);
    fakes_.appStateMonitor.update(1, false, client->pid);
    settle();
    EXPECT_EQ(updates, 0);
}

TEST_F(Start, EveryRefusalIsLoggedWithItsRequestsNumberAndReason) {
    const auto client = makeConnected();
    started(*client, {.system = true});
    EXPECT_EQ(fakes_.logSink.logged(),
              Lines{"start request 1 refused with -5810: the application lacks the entitlement"});
    fakes_.fileSystem.setFreeSize(0);
    started(*client);
    EXPECT_EQ(fakes_.logSink.logged().back(), "start request 2 refused with -5805: 100 MB must be free");
}

}  // namespace
}  // namespace lumacast
