// A daemon that can't be reached says so and ends; it never runs on for nobody.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>

#include <algorithm>
#include <array>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "linux/ipc/Fd.h"
#include "tests/system/World.h"

namespace lumacast::test {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

constexpr int kUnavailable = 69;  // EX_UNAVAILABLE

struct End {
    int status = -1;
    std::vector<std::string> errors;
};

/// Runs a daemon of its own in this world to its end.
End runDaemon(const World& world) {
    End end;
    {
        checkers::Child daemon({LC_DAEMON}, world.environment(), world.path("second.log"));
        const auto hasEnded = [&] {
            siginfo_t info{};
            return ::waitid(P_PID, static_cast<id_t>(daemon.pid()), &info, WEXITED | WNOHANG | WNOWAIT) == 0 &&
                   info.si_pid == daemon.pid();
        };
        EXPECT_TRUE(waitUntil(hasEnded, std::chrono::seconds(15))) << "it runs on";
        if (daemon.pid() > 1) ::kill(daemon.pid(), SIGKILL);  // -1 would be everybody
        end.status = daemon.wait();
    }
    std::ifstream log(world.path("second.log"));
    for (std::string line; std::getline(log, line);)
        if (line.starts_with("error ")) end.errors.push_back(line);
    return end;
}

TEST(Start, ASecondDaemonEndsAndTheFirstGoesOn) {
    World world;
    world.startDaemon();
    const auto application = world.application({"--size", "320x180", "--fps", "30"});
    ASSERT_TRUE(application->waitForFrame(1));
    (void)application->askForFrame("start");
    const End second = runDaemon(world);
    EXPECT_EQ(second.status, kUnavailable);
    EXPECT_THAT(second.errors, ElementsAre(HasSubstr("com.orvane.lumacastd is not available: another process serves")));
    ASSERT_TRUE(world.waitForElapsed(0.5));
    EXPECT_FALSE(picturesOf(application->stop()).empty());
}

TEST(Start, WithSomethingElseInTheServicesPlaceItEnds) {
    World world;
    std::filesystem::create_directories(world.path("run/lumacast"));
    std::filesystem::permissions(world.path("run/lumacast"), std::filesystem::perms::owner_all);
    std::ofstream(world.path("run/lumacast/com.orvane.lumacastd.sock")) << "precious";
    const End end = runDaemon(world);
    EXPECT_EQ(end.status, kUnavailable);
    EXPECT_THAT(end.errors, ElementsAre(HasSubstr("something else lies at its path")));
    EXPECT_EQ(std::filesystem::file_size(world.path("run/lumacast/com.orvane.lumacastd.sock")), 8u);
}

TEST(Start, WithADirectoryInTheAdministratorsPlaceItEnds) {
    World world;
    std::filesystem::create_directories(world.path("run/lumacast/admin.sock"));
    std::filesystem::permissions(world.path("run/lumacast"), std::filesystem::perms::owner_all);
    const End end = runDaemon(world);
    EXPECT_EQ(end.status, kUnavailable);
    EXPECT_THAT(end.errors, ElementsAre(HasSubstr("admin.sock is not available: something else lies at its path")));
    // What it leaves keeps the next one from nothing.
    std::filesystem::remove(world.path("run/lumacast/admin.sock"));
    world.startDaemon();
    EXPECT_EQ(world.endDaemon(SIGTERM), 0);
}

TEST(Start, WithoutADirectoryOfItsOwnItSaysWhichAndEnds) {
    World world;
    std::filesystem::create_directories(world.path("run/lumacast"));
    std::filesystem::permissions(world.path("run/lumacast"), std::filesystem::perms::all);
    EXPECT_EQ(runDaemon(world).status, EXIT_FAILURE);
    std::stringstream said;
    said << std::ifstream(world.path("second.log")).rdbuf();
    EXPECT_EQ(said.str(), "lumacastd: the directory " + world.path("run/lumacast") +
                              " can't be used: it is not this user's own, or others may write to it\n");
}

TEST(Start, WithoutADisplayItSaysSoAndServes) {
    World world;
    std::vector<std::string> variables = world.environment();
    variables.insert(variables.begin(), "DISPLAY=");  // the first one counts
    checkers::Child daemon({LC_DAEMON}, variables, world.path("second.log"));
    const auto log = [&] {
        std::stringstream text;
        text << std::ifstream(world.path("second.log")).rdbuf();
        return text.str();
    };
    ASSERT_TRUE(waitUntil([&] { return std::filesystem::exists(world.path("run/lumacast/com.orvane.lumacastd.sock")); }));
    EXPECT_TRUE(waitUntil([&] { return log().find("error DISPLAY is not set: ") != std::string::npos; })) << log();
    ASSERT_GT(daemon.pid(), 1);
    ::kill(daemon.pid(), SIGTERM);
    EXPECT_EQ(daemon.wait(), 0);
}

TEST(Start, TheServiceManagerIsToldWhenClientsAreServedAndWhenItEnds) {
    World world;
    const std::string name = world.path("notify");
    const Fd manager(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    ASSERT_LT(name.size(), sizeof address.sun_path);
    name.copy(address.sun_path, name.size());
    ASSERT_EQ(::bind(manager.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    const auto told = [&] {
        pollfd ready{manager.get(), POLLIN, 0};
        std::array<char, 256> text{};
        if (::poll(&ready, 1, 20'000) != 1) return std::string("(nothing)");
        const ssize_t length = ::recv(manager.get(), text.data(), text.size(), 0);
        return std::string(text.data(), static_cast<std::size_t>(std::max<ssize_t>(length, 0)));
    };
    world.startDaemon({"NOTIFY_SOCKET=" + name});
    EXPECT_EQ(told(), "READY=1\n");
    EXPECT_EQ(told(), "STATUS=Idle.\n");
    const std::string log = world.daemonLog();
    EXPECT_TRUE(log.starts_with("info lumacastd Starting!\ninfo _srSetupTempDirectory\n")) << log;
    EXPECT_EQ(world.endDaemon(SIGTERM), 0);
    EXPECT_THAT(told(), HasSubstr("STOPPING=1"));
}

}  // namespace
}  // namespace lumacast::test
