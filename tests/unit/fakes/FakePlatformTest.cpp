// A world of fakes: a daemon's process and a client's, under many seeds and on real threads.

#include "tests/fakes/FakePlatform.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>

#include "base/Guarded.h"
#include "support/ThreadScheduler.h"
#include "tests/fakes/FakeIpcConnection.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast {
namespace {

constexpr ProcessID kClient{200};

/// Answers every request with nothing.
class Server final : public IpcExportedObject, public IpcListenerDelegate {
public:
    explicit Server(FakePlatform& fakes) : fakes_(fakes) {}
    bool listenerShouldAcceptNewConnection(IpcListener&, const std::shared_ptr<IpcConnection>& connection) override {
        connection->setExportedInterface(daemonProtocol());
        connection->setExportedObject(self_);
        connection->setInvalidationHandler([this] { ++losses; });
        connection->resume();
        return true;
    }
    void receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t, Array, IpcReply reply) override {
        EXPECT_TRUE(fakes_.scheduler.mainQueue().isCurrent());
        ++messages;
        if (reply) reply({Value()});
    }
    static std::shared_ptr<Server> make(FakePlatform& fakes) {
        auto server = std::make_shared<Server>(fakes);
        server->self_ = server;
        return server;
    }
    std::atomic<int> messages = 0, losses = 0;

private:
    FakePlatform& fakes_;
    std::weak_ptr<Server> self_;
};

constexpr std::uint16_t kGetState = static_cast<std::uint16_t>(DaemonMessage::SynchronousGetCurrentState);

std::uint64_t playSeed(std::uint64_t seed, int& messages) {
    SimWorld world(seed);
    const auto server = Server::make(world.fakes);
    const auto listener = world.fakes.platform().ipc.listenerForService("service");
    listener->setDelegate(server);
    listener->resume();
    const auto process = world.fakes.makeProcess(kClient);
    const auto connection = process->connectToService("service");
    connection->setRemoteInterface(daemonProtocol());
    connection->resume();
    int replies = 0, errors = 0;
    for (int i = 0; i < 20; ++i)
        world.scheduler.globalQueue(QueuePriority::Default).async([&] {
            connection->remoteProxy([&](const Error&) { ++errors; })->send(kGetState, {}, [&](const Array&) {
                ++replies;
            });
        });
    for (int steps = static_cast<int>(world.scheduler.fork().below(60)); steps > 0; --steps) world.scheduler.step();
    world.fakes.endProcess(*process);
    world.scheduler.runUntilIdle();
    EXPECT_EQ(server->losses, server->messages > 0 || server->losses > 0 ? 1 : 0);
    EXPECT_LE(replies + errors, 20) << "a dead process is told nothing twice";
    messages = server->messages;
    EXPECT_TRUE(world.scheduler.blockedTasks().empty());
    world.scheduler.endWorld();
    return world.scheduler.traceHash();
}

TEST(FakePlatform, AWorldWithAClientThatDiesReplaysExactly) {
    int least = 20, most = 0;
    for (std::uint64_t seed = 1; seed <= 200; ++seed) {
        int first = 0, second = 0;
        const std::uint64_t hash = playSeed(seed, first);
        EXPECT_EQ(playSeed(seed, second), hash);
        EXPECT_EQ(first, second);
        least = std::min(least, first);
        most = std::max(most, first);
    }
    EXPECT_LT(least, 3) << "some die early";
    EXPECT_GT(most, 15) << "some die late";
}

TEST(FakePlatform, AMessageThatIsNotWhatTheTableDeclaresIsDroppedWithItsSender) {
    SimWorld world(1);
    const auto server = Server::make(world.fakes);
    const auto listener = world.fakes.ipc.listenerForService("service");
    listener->setDelegate(server);
    listener->resume();
    const auto process = world.fakes.makeProcess(kClient);
    for (const Data& bytes : {Data{}, Data{9, 1, 0, 0, 0, 0}, Data{0}, Data{9, 0, 0, 0, 0, 0}}) {
        const auto connection = std::static_pointer_cast<FakeIpcConnection>(process->connectToService("service"));
        int losses = 0;
        connection->setInvalidationHandler([&] { ++losses; });
        connection->resume();
        connection->sendRaw(kGetState, bytes, true);
        world.scheduler.runUntilIdle();
        EXPECT_EQ(losses, 1);
    }
    EXPECT_EQ(server->messages, 0);
    EXPECT_EQ(server->losses, 4);
    world.scheduler.endWorld();
}

TEST(FakePlatform, ItWorksOnRealThreadsToo) {
    const auto loop = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler(loop);
    RunningThreadLoop running(*loop);
    FakePlatform fakes(scheduler, [] { return HostTime{std::chrono::steady_clock::now().time_since_epoch().count()}; });
    const auto server = Server::make(fakes);
    const auto listener = fakes.ipc.listenerForService("service");
    listener->setDelegate(server);
    listener->resume();
    std::vector<std::unique_ptr<FakeIpc>> processes;
    std::vector<std::shared_ptr<IpcConnection>> connections;
    std::atomic<int> replies = 0, errors = 0;
    for (int i = 0; i < 4; ++i) {
        processes.push_back(fakes.makeProcess(ProcessID{200 + i}));
        connections.push_back(processes.back()->connectToService("service"));
        connections.back()->setRemoteInterface(daemonProtocol());
        connections.back()->resume();
        for (int message = 0; message < 50; ++message)
            connections.back()->remoteProxy([&](const Error&) { ++errors; })->send(kGetState, {}, [&](const Array&) {
                ++replies;
            });
    }
    const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(30);
    while (replies < 200 && std::chrono::steady_clock::now() < end) std::this_thread::yield();
    EXPECT_EQ(replies, 200);
    EXPECT_EQ(errors, 0);
    processes.front()->kill();
    while (server->losses < 1 && std::chrono::steady_clock::now() < end) std::this_thread::yield();
    EXPECT_EQ(server->losses, 1);
    connections.clear();
    processes.clear();
    while (server->losses < 4 && std::chrono::steady_clock::now() < end) std::this_thread::yield();
    EXPECT_EQ(server->losses, 4);
    // Whatever is still on its way ends before the fakes do.
    scheduler.mainQueue().sync([] {});
}

TEST(FaultPlan, NothingFailsUntilItIsToldTo) {
    FaultPlan plan;
    for (int i = 0; i < 100; ++i) EXPECT_FALSE(plan.fails("Role.call"));
    EXPECT_EQ(plan.callCount(), 100u);
    EXPECT_TRUE(plan.failures().empty());
}

TEST(FaultPlan, TheNextCallsOfOneOperationFail) {
    FaultPlan plan;
    plan.failNext("A", 2);
    EXPECT_FALSE(plan.fails("B"));
    EXPECT_TRUE(plan.fails("A"));
    EXPECT_TRUE(plan.fails("A"));
    EXPECT_FALSE(plan.fails("A"));
    EXPECT_EQ(plan.failures(), (std::vector<std::string>{"A", "A"}));
}

TEST(FaultPlan, EachCallCanFailInTurn) {
    for (std::uint64_t number = 1; number <= 3; ++number) {
        FaultPlan plan;
        plan.failCallNumber(number);
        for (std::uint64_t call = 1; call <= 3; ++call) EXPECT_EQ(plan.fails("X"), call == number);
    }
}

TEST(FaultPlan, ASeedDecidesTheSameWayEachTimeAndInTheAskedProportion) {
    const auto play = [](std::uint64_t seed) {
        FaultPlan plan;
        plan.failAtRandom(seed, 1, 10);
        std::string story;
        for (int i = 0; i < 1000; ++i) story += plan.fails("X") ? '1' : '0';
        return story;
    };
    EXPECT_EQ(play(5), play(5));
    EXPECT_NE(play(5), play(6));
    const std::string story = play(5);
    const auto failures = std::count(story.begin(), story.end(), '1');
    EXPECT_GT(failures, 60);
    EXPECT_LT(failures, 140);
}

}  // namespace
}  // namespace lumacast
