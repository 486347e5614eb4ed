// A daemon that goes, comes back, has no time, or wants somebody else.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>

#include <ctime>

#include "tests/checkers/tests/Child.h"
#include "tests/client/StandInService.h"
#include "tests/client/WaitUntil.h"
#include "tests/contract/RawPeer.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::test {
namespace {

using client::Recorder;
using client::StateAnswer;
using ::testing::ElementsAre;

constexpr char kService[] = "com.orvane.lumacastd";

class ClientReconnect : public ::testing::Test {
protected:
    std::string runtime() const { return scratch_.path("run"); }
    std::unique_ptr<checkers::Child> process() {
        auto child = std::make_unique<checkers::Child>(
            std::vector<std::string>{LC_STAND_IN_DAEMON, runtime(), "serving"}, std::vector<std::string>{},
            scratch_.path("stand-in.log"));
        EXPECT_EQ(child->readLine(), "ready");
        return child;
    }
    static void kill(std::unique_ptr<checkers::Child>& child) {
        ::kill(child->pid(), SIGKILL);
        child.reset();
    }
    /// A listening socket with room for `backlog` that wait, for a service to take over.
    Fd listenWithBacklog(int backlog) {
        std::filesystem::create_directory(runtime());
        Fd listening(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
        const sockaddr_un address = socketAddress(runtime() + "/" + kService + ".sock");
        EXPECT_EQ(bind(listening.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
        EXPECT_EQ(listen(listening.get(), backlog), 0);
        return listening;
    }

    ScratchDirectory scratch_;
    Comings comings_;
};

TEST_F(ClientReconnect, AfterTheDaemonWasKilledTheNextOneServes) {
    auto daemon = process();
    Recorder recorder(comings_.events(), runtime());
    EXPECT_FALSE(recorder.stateAndWait().error);
    for (std::size_t round = 1; round <= 3; ++round) {
        kill(daemon);
        ASSERT_TRUE(waitUntil([&] { return comings_.all().size() == 2 * round; }));
        EXPECT_EQ(keyIn(recorder.stateAndWait().error), "CONNECTION_ERROR_NOT_REACHED");
        daemon = process();
        ASSERT_TRUE(waitUntil([&] { return comings_.all().size() == 2 * round + 1; }));
        EXPECT_FALSE(recorder.stateAndWait().error);
    }
    EXPECT_THAT(comings_.all(), ElementsAre("connected", "disconnected", "connected", "disconnected", "connected",
                                            "disconnected", "connected"));
}

TEST_F(ClientReconnect, ADaemonThatComesLateIsFound) {
    Recorder recorder(comings_.events(), runtime());
    EXPECT_EQ(keyIn(recorder.stateAndWait().error), "CONNECTION_ERROR_NOT_REACHED");
    const auto daemon = process();
    ASSERT_TRUE(waitUntil([&] { return comings_.all().size() == 2; }));
    EXPECT_THAT(comings_.all(), ElementsAre("disconnected", "connected"));
    EXPECT_FALSE(recorder.stateAndWait().error);
}

TEST_F(ClientReconnect, LookingForADaemonThatIsNotThereCostsNothing) {
    Recorder recorder(comings_.events(), runtime());
    ASSERT_TRUE(waitUntil([&] { return !comings_.all().empty(); }));
    const auto busyTime = [] {
        timespec time{};
        clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &time);
        return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
    };
    const auto before = busyTime();
    const auto until = std::chrono::steady_clock::now() + std::chrono::seconds(2);
    // The condition is the time itself; the wait is part of what is measured.
    EXPECT_TRUE(waitUntil([&] { return std::chrono::steady_clock::now() >= until; }));
    EXPECT_LT(busyTime() - before, std::chrono::milliseconds(600));
}

TEST_F(ClientReconnect, OneThatTheLivingDaemonDroppedComesBackOnlyWhenItIsAsked) {
    const auto daemon = StandInService::make({.runtimeDirectory = runtime()},
                                             [](DaemonMessage, const Array&, const IpcReply& reply) {
                                                 if (reply) reply({Dictionary()});
                                             });
    daemon->run();
    Recorder recorder(comings_.events(), runtime());
    EXPECT_FALSE(recorder.stateAndWait().error);
    // As the daemon does with the older of two connections of one application.
    daemon->connection()->invalidate();
    ASSERT_TRUE(waitUntil([&] { return comings_.all().size() == 2; }));
    const auto until = std::chrono::steady_clock::now() + std::chrono::seconds(2);
    EXPECT_TRUE(waitUntil([&] {
        return daemon->connections() > 1 || std::chrono::steady_clock::now() >= until;
    }));
    EXPECT_EQ(daemon->connections(), 1u) << "it took its place back by itself";
    EXPECT_FALSE(recorder.stateAndWait().error);
    EXPECT_EQ(daemon->connections(), 2u);
    ASSERT_TRUE(waitUntil([&] { return comings_.all().size() == 3; }));
    EXPECT_THAT(comings_.all(), ElementsAre("connected", "disconnected", "connected"));
}

TEST_F(ClientReconnect, ADaemonThatAcceptsAndDropsIsNotReached) {
    const Fd listening = listenWithBacklog(64);
    std::atomic<bool> over{false};
    std::atomic<int> accepted{0};
    std::thread dropping([&] {
        while (!over) {
            pollfd wait{listening.get(), POLLIN, 0};
            if (::poll(&wait, 1, 5) == 1) {
                const Fd one(::accept(listening.get(), nullptr, nullptr));
                ++accepted;
            }
        }
    });
    {
        Recorder recorder(comings_.events(), runtime());
        EXPECT_EQ(keyIn(recorder.stateAndWait().error), "CONNECTION_ERROR_NOT_REACHED");
        EXPECT_TRUE(waitUntil([&] { return accepted >= 3; }));
    }
    over = true;
    dropping.join();
    EXPECT_THAT(comings_.all(), ElementsAre("disconnected"));
}

TEST_F(ClientReconnect, AThousandConnectsAgainstABacklogOfOneAllGetThrough) {
    Fd listening = listenWithBacklog(1);
    LinuxIpcOptions options{.runtimeDirectory = runtime()};
    options.activated.add(kService, std::move(listening));
    const auto daemon =
        StandInService::make(std::move(options), [](DaemonMessage, const Array&, const IpcReply& reply) {
            if (reply) reply({Dictionary()});
        });
    constexpr std::size_t kRounds = 10, kAtOnce = 100;
    for (std::size_t round = 0; round < kRounds; ++round) {
        Answers<StateAnswer> answers;
        std::vector<std::unique_ptr<Recorder>> recorders;
        const auto begun = std::chrono::steady_clock::now();
        for (std::size_t i = 0; i < kAtOnce; ++i) {
            recorders.push_back(std::make_unique<Recorder>(client::Events(), runtime()));
            recorders.back()->state(answers.handler(i));
        }
        EXPECT_LT(std::chrono::steady_clock::now() - begun, std::chrono::seconds(20)) << "making one blocked";
        if (round == 0) {
            EXPECT_EQ(answers.total(), 0) << "nobody accepts yet";
            daemon->run();
        }
        ASSERT_TRUE(waitUntil([&] { return answers.total() >= static_cast<int>(kAtOnce); })) << round;
        EXPECT_TRUE(answers.eachOnce());
        EXPECT_EQ(keyIn(answers.last().error), "no error");
    }
    EXPECT_EQ(daemon->connections(), kRounds * kAtOnce);
}

TEST_F(ClientReconnect, RequestsWaitForABusyDaemonUpToALimit) {
    Fd listening = listenWithBacklog(0);
    LinuxIpcOptions options{.runtimeDirectory = runtime()};
    options.activated.add(kService, std::move(listening));
    const auto daemon = StandInService::make(std::move(options));
    // The place that there is, taken.
    std::vector<RawPeer> others(2);
    for (RawPeer& other : others) {
        ::fcntl(other.descriptor(), F_SETFL, O_NONBLOCK);
        other.connectTo(runtime() + "/" + kService + ".sock");
    }
    Answers<client::StopAnswer> stops;
    Recorder recorder({}, runtime());
    for (std::size_t i = 0; i < 70; ++i) recorder.stop(stops.handler(i));
    ASSERT_TRUE(waitUntil([&] { return stops.total() >= 7; }));
    EXPECT_EQ(stops.total(), 7) << "63 are held";
    EXPECT_EQ(keyIn(stops.last().error), "CONNECTION_ERROR_BUSY");
    daemon->run();
    EXPECT_TRUE(waitUntil([&] { return daemon->received().size() == 63; }));
    EXPECT_EQ(stops.total(), 7);
}

}  // namespace
}  // namespace lumacast::test
