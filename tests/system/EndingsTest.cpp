// What happens when somebody dies, is refused, or is told to end.

#include <gtest/gtest.h>
#include <signal.h>

#include <filesystem>
#include <fstream>
#include <random>
#include <sstream>
#include <string_view>

#include "tests/system/World.h"

namespace lumacast::test {
namespace {

double durationOf(const std::string& movie) {
    return std::chrono::duration<double>(checkers::MovieReader(movie).duration()).count();
}

std::size_t linesWith(std::string_view text, const std::string& log) {
    std::istringstream lines(log);
    std::size_t count = 0;
    for (std::string line; std::getline(lines, line);) count += line.find(text) != std::string::npos ? 1 : 0;
    return count;
}

TEST(Endings, AKilledDaemonLeavesAMovieThatPlaysUpToItsLastSecond) {
    const int kills = longTests() ? 50 : 6;
    const std::uint32_t seed = 20260101;
    std::mt19937 random(seed);
    for (int i = 0; i < kills; ++i) {
        const bool still = i % 2 == 1;
        SCOPED_TRACE("kill " + std::to_string(i) + (still ? ", still" : ", moving"));
        World world;
        world.startDaemon();
#ifdef LC_SANITIZED
        std::vector<std::string> options{"--size", "320x180", "--fps", "6"};
#else
        std::vector<std::string> options{"--size", "640x360", "--fps", "60"};
#endif
        if (still) options.push_back("--still");
        const auto application = world.application(options);
        ASSERT_TRUE(application->waitForFrame(1));
        (void)application->askForFrame("start");
        const double moment = 1.5 + static_cast<double>(random() % 2500) / 1000;
        ASSERT_TRUE(world.waitForElapsed(moment));
        const double elapsed = world.recording()["elapsedSeconds"].get<double>();
        EXPECT_EQ(world.endDaemon(SIGKILL), -1);
        const auto pictures = picturesOf(world.moviePath(), true);
        ASSERT_FALSE(pictures.empty());
        for (const auto& picture : pictures) EXPECT_TRUE(picture.number);
#ifdef LC_SANITIZED
        constexpr double kSlack = 2;
#else
        constexpr double kSlack = 0;
#endif
        EXPECT_GE(durationOf(world.moviePath()), elapsed - 1.0 - kSlack);
        EXPECT_EQ(application->nextEvent(), "event disconnected");
    }
}

TEST(Endings, AKilledClientLeavesNothing) {
    World world;
    world.startDaemon();
    {
        // The first recording makes what stays: the encoder's and the display's own descriptors.
        const auto warm = world.application({"--size", "320x180", "--fps", "30"});
        ASSERT_TRUE(warm->waitForFrame(1));
        (void)warm->askForFrame("start");
        ASSERT_TRUE(world.waitForElapsed(0.5));
        warm->kill();
    }
    // A window that is gone before the connection is stops the recording as failed; its file is left to the purge.
    const auto failures = [&] { return linesWith("screenCaptureController: didFailWithStatus:", world.daemonLog()); };
    const auto atRest = [&](std::size_t failuresBefore) {
        return world.status()["sessions"].empty() &&
               (!std::filesystem::exists(world.moviePath()) || failures() > failuresBefore);
    };
    ASSERT_TRUE(waitUntil([&] { return atRest(0); })) << world.status();
    const std::size_t before = world.daemonDescriptors(), threads = world.daemonNumber("Threads");
    for (int i = 0; i < 3; ++i) {
        const auto application = world.application({"--size", "320x180", "--fps", "30"});
        ASSERT_TRUE(application->waitForFrame(1));
        (void)application->askForFrame("start");
        ASSERT_TRUE(world.waitForElapsed(0.5));
        EXPECT_TRUE(world.status()["sessions"][0]["transactionOpen"].get<bool>());
        const std::size_t failuresBefore = failures();
        application->kill();
        EXPECT_TRUE(waitUntil([&] { return atRest(failuresBefore); })) << world.status();
    }
    EXPECT_TRUE(waitUntil([&] { return world.daemonDescriptors() <= before; }))
        << before << " " << world.daemonDescriptors();
    EXPECT_TRUE(waitUntil([&] { return world.daemonNumber("Threads") <= threads; }))
        << threads << " " << world.daemonNumber("Threads");
}

TEST(Endings, ATerminatedDaemonFinishesItsMovieAndLeavesWithStatusZero) {
    World world;
    world.startDaemon();
    const auto application = world.application({"--size", "320x180", "--fps", "30"});
    ASSERT_TRUE(application->waitForFrame(1));
    (void)application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(1.5));
    EXPECT_EQ(world.endDaemon(SIGTERM), 0);
    EXPECT_FALSE(picturesOf(world.moviePath()).empty());
    EXPECT_GT(durationOf(world.moviePath()), 1.0);
}

TEST(Endings, WhereNobodyCanBeAskedAStartIsRefusedWithItsReason) {
    World world(World::Consent::Asked);
    world.startDaemon({"PATH=" + world.path("no programs")});
    const auto application = world.application({"--size", "320x180", "--fps", "30"});
    ASSERT_TRUE(application->waitForFrame(1));
    EXPECT_TRUE(application->ask("start").starts_with("error -5801")) << world.daemonLog();
    EXPECT_NE(world.daemonLog().find("error showing acknowledgement alert"), std::string::npos) << world.daemonLog();
    EXPECT_NE(world.daemonLog().find(" refused with -5801: "), std::string::npos) << world.daemonLog();
}

TEST(Endings, AProgramThatIsNoApplicationIsNotServed) {
    World world;
    std::filesystem::remove(world.path("data/applications/org.lumacast.SelfRecorder.desktop"));
    world.startDaemon();
    const auto application = world.application({"--size", "320x180", "--fps", "30"});
    EXPECT_TRUE(application->ask("start").starts_with("error 1")) << world.daemonLog();
    EXPECT_TRUE(world.status()["sessions"].empty());
}

TEST(Endings, ADiscardedMovieIsGone) {
    World world;
    world.startDaemon();
    const auto application = world.application({"--size", "320x180", "--fps", "30"});
    ASSERT_TRUE(application->waitForFrame(1));
    (void)application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(0.5));
    ASSERT_FALSE(application->stop().empty());
    EXPECT_TRUE(std::filesystem::exists(world.moviePath()));
    EXPECT_EQ(application->ask("discard"), "discarded");
    EXPECT_FALSE(std::filesystem::exists(world.moviePath()));
}

}  // namespace
}  // namespace lumacast::test
