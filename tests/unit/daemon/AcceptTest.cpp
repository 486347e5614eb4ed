// What is done with a new connection, call by call, and with one that is interrupted.

#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {
namespace {

using std::chrono::seconds;

/// A connection that notes what is done with it.
class NotedConnection final : public IpcConnection {
public:
    NotedConnection(std::string theName, ProcessID thePid, std::vector<std::string>& theCalls)
        : name(std::move(theName)), pid(thePid), calls(theCalls) {}

    void setExportedInterface(const Protocol& interface) override { note("exports " + std::string(interface.name)); }
    void setExportedObject(std::weak_ptr<IpcExportedObject> object) override {
        note(object.expired() ? "exports nobody" : "exports an object");
    }
    void setRemoteInterface(const Protocol& interface) override { note("remote " + std::string(interface.name)); }
    void setInterruptionHandler(Handler handler) override {
        note(handler ? "interruption handler" : "no interruption handler");
        interruption = std::move(handler);
    }
    void setInvalidationHandler(Handler handler) override {
        note(handler ? "invalidation handler" : "no invalidation handler");
        invalidation = std::move(handler);
    }
    void resume() override { note("resume"); }
    void invalidate() override { note("invalidate"); }
    ProcessID processIdentifier() const override { return pid; }
    UserID userIdentifier() const override { return UserID{1000}; }
    std::optional<Value> valueForEntitlement(std::string_view entitlement) override {
        note("entitlement " + std::string(entitlement));
        return std::nullopt;
    }
    std::unique_ptr<IpcRemoteProxy> remoteProxy(ErrorHandler) override {
        ++proxies;
        return std::make_unique<Nobody>();
    }

    const std::string name;
    const ProcessID pid;
    std::vector<std::string>& calls;
    Handler interruption, invalidation;
    int proxies = 0;

private:
    struct Nobody final : IpcRemoteProxy {
        void send(std::uint16_t, Array, std::function<void(Array)>) override {}
    };
    void note(const std::string& call) { calls.push_back(name + ": " + call); }
};

class Accept : public DaemonWorld {
protected:
    Accept() {
        fakes_.bundles.installApplication(BundleIdentifier("org.example.Player"), "Player");
        fakes_.bundles.run(ProcessID{500}, BundleIdentifier("org.example.Player"));
        fakes_.logSink.clear();
    }
    std::shared_ptr<NotedConnection> offer(const std::string& name, std::int32_t pid = 500) {
        auto connection = std::make_shared<NotedConnection>(name, ProcessID{pid}, calls_);
        onRequestLane(
            [&] { accepted_ = process_->manager().listenerShouldAcceptNewConnection(*listener_, connection); });
        return connection;
    }
    void onRequestLane(const Task& task) { world_.scheduler.mainQueue().sync(task); }
    std::shared_ptr<LCRecordingSession> player() {
        return process_->manager().registeredSession(BundleIdentifier("org.example.Player"));
    }

    std::vector<std::string> calls_;
    bool accepted_ = false;
    const std::shared_ptr<IpcListener> listener_ = fakes_.ipc.anonymousListener();
};

TEST_F(Accept, AConnectionIsConfiguredThenResumedAndItsEntitlementsAreNotLookedAt) {
    offer("first");
    EXPECT_TRUE(accepted_);
    EXPECT_EQ(calls_,
              (Lines{"first: exports an object", "first: exports LCDaemonProtocol", "first: remote LCClientProtocol",
                     "first: interruption handler", "first: invalidation handler", "first: resume"}));
}

TEST_F(Accept, NothingIsConfiguredOnAConnectionWithoutAProcess) {
    offer("nobody", 0);
    EXPECT_FALSE(accepted_);
    EXPECT_TRUE(calls_.empty());
}

TEST_F(Accept, TheOlderConnectionLosesItsHandlersBeforeItIsInvalidated) {
    const auto first = offer("first");
    const auto older = player()->clientProxy();
    calls_.clear();
    const auto second = offer("second");
    const Lines retired(calls_.begin() + 5, calls_.begin() + 8);
    EXPECT_EQ(retired,
              (Lines{"first: no invalidation handler", "first: no interruption handler", "first: invalidate"}));
    EXPECT_EQ(calls_.back(), "second: resume");
    EXPECT_FALSE(older->connection());
    EXPECT_NE(player()->clientProxy(), older);
    EXPECT_EQ(player()->clientProxy()->connection(), second);
}

TEST_F(Accept, AProxyIsMadeAnewAlsoWhereTheOlderOneHadLostItsConnection) {
    const auto first = offer("first");
    const auto older = player()->clientProxy();
    older->setConnection(nullptr);
    calls_.clear();
    offer("second");
    EXPECT_NE(player()->clientProxy(), older);
    EXPECT_EQ(std::count(calls_.begin(), calls_.end(), "first: invalidate"), 0);
}

TEST_F(Accept, EveryMessageAsksForAProxyOfItsOwn) {
    const auto connection = offer("first");
    const auto proxy = player()->clientProxy();
    for (int i = 1; i <= 3; ++i) {
        proxy->updateScreenRecordingState(true);
        EXPECT_EQ(connection->proxies, i);
    }
}

TEST_F(Accept, AnInterruptionEndsTheSessionAsALossDoes) {
    const auto first = offer("first");
    fakes_.logSink.clear();
    onRequestLane([&] { first->interruption(); });
    settle();
    EXPECT_FALSE(player());
    EXPECT_EQ(
        fakes_.logSink.logged(),
        (Lines{"connection INTERRUPTED", "LCRecordingManager: applicationDisconnected",
               "LCRecordingManager: stopRecordingSession:handler:", "LCRecordingManager:removeSessionForBundleID"}));
}

TEST_F(Accept, TheLossCountsForTheApplicationThatConnectedThoughItsProcessHasGone) {
    const auto first = offer("first");
    fakes_.bundles.uninstall(BundleIdentifier("org.example.Player"));
    onRequestLane([&] { first->invalidation(); });
    settle();
    EXPECT_FALSE(player());
}

TEST_F(Accept, AnIdleSessionWhoseLastRecordingWasASystemOneStays) {
    const auto first = offer("first");
    player()->setSystemRecording(true);
    fakes_.logSink.clear();
    onRequestLane([&] { first->invalidation(); });
    settle();
    ASSERT_TRUE(player());
    EXPECT_FALSE(player()->isRecording());
    EXPECT_FALSE(player()->clientProxy()->connection());
    EXPECT_EQ(logged("LCRecordingManager: stopRecordingSession:handler:"), 0u);
}

TEST_F(Accept, TheProxyOfNobodyIsOneAndHasNoConnection) {
    const auto proxy = process_->clientProxy();
    ASSERT_TRUE(proxy);
    EXPECT_EQ(proxy, process_->clientProxy());
    EXPECT_FALSE(proxy->bundleIdentifier());
    EXPECT_FALSE(proxy->connection());
}

TEST_F(Accept, NothingOutlivesTheProcess) {
    const auto client = makeRecording("Editor", 501, 8);
    client->tell(DaemonMessage::ClientDidResignActive);
    onRequestLane([&] { process_->manager().updateExemptionListWithSession(*session(*client)); });
    client->die();
    settle();
    process_.reset();
    Process next(fakes_.platform());
    world_.scheduler.mainQueue().sync([&] { next.start(); });
    EXPECT_TRUE(next.manager().exemptBundleIdentifiers().empty());
    EXPECT_EQ(next.manager().snapshot().find("sessions")->as<Array>()->size(), 0u);
    world_.scheduler.endWorld();
}

/// A purge service that looks what there is when the manager registers.
class LookingPurgeService final : public StoragePurgeService {
    FakePlatform& fakes_;

public:
    explicit LookingPurgeService(FakePlatform& fakes) : fakes_(fakes) {}
    void registerCallbacks(std::string, StoragePurgeCallbacks) override {
        directoryWasThere = fakes_.fileSystem.exists(fakes_.fileSystem.temporaryDirectory());
        lines = fakes_.logSink.logged();
        client.connect();
    }
    void requestPurge(std::int32_t, std::function<void(std::optional<PurgeRecord>)>) override {}
    void requestPurgeableSpace(std::function<void(std::optional<PurgeRecord>)>) override {}

    bool directoryWasThere = false;
    std::vector<std::string> lines;
    TestClient client{fakes_, "org.example.Player", "Player", ProcessID{500}, ContextID{7}};
};

TEST(StartUp, TheDirectoryAndTheListenerComeBeforeThePurgeServiceAndNobodyIsServedBeforeTheEnd) {
    SimWorld world(1);
    LookingPurgeService purge(world.fakes);
    const Platform& p = world.fakes.platform();
    const Platform platform{p.log,
                            p.scheduler,
                            p.clock,
                            p.ipc,
                            p.bundles,
                            p.renderServer,
                            p.appStateMonitor,
                            p.displayCapture,
                            p.displayCloneControl,
                            p.audioInputQueues,
                            p.deviceCapture,
                            p.containerWriters,
                            p.movieExporters,
                            p.photoLibrary,
                            p.fileSystem,
                            p.preferences,
                            p.deviceInfo,
                            p.telemetry,
                            p.keepAlive,
                            p.admin,
                            purge,
                            p.userAlerts,
                            p.systemSounds,
                            p.screenReader,
                            p.storeLookup,
                            p.networkReachability, p.appExtensions, p.keyedArchive};
    Process process(platform);
    EXPECT_TRUE(purge.directoryWasThere);
    EXPECT_EQ(purge.lines, std::vector<std::string>{"_srSetupTempDirectory"});
    world.scheduler.runUntilIdle();
    EXPECT_EQ(world.fakes.logSink.count("LCRecordingManager: shouldAcceptNewConnection:"), 0u);
    EXPECT_EQ(purge.client.losses, 0) << "the name was there already, so the connection waits";
    world.scheduler.mainQueue().sync([&] { process.start(); });
    world.scheduler.runUntilIdle();
    EXPECT_EQ(world.fakes.logSink.count("LCRecordingManager: shouldAcceptNewConnection:"), 1u);
    world.scheduler.endWorld();
}

}  // namespace
}  // namespace lumacast
