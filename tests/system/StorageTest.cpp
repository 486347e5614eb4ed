// The administrator's tool and the temporary movies of a running daemon.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>

#include <filesystem>
#include <fstream>

#include "tests/contract/SmallDisk.h"
#include "tests/system/Tool.h"
#include "tests/system/World.h"

namespace lumacast::test {
namespace {

using ::testing::HasSubstr;

nlohmann::json answer(const World& world, std::vector<std::string> arguments) {
    arguments.push_back("--json");
    const Outcome outcome = tool(world, arguments);
    EXPECT_EQ(outcome.status, 0);
    return nlohmann::json::parse(outcome.out, nullptr, false);
}

/// The entry of a file in the daemon's list; null when it is not in it.
nlohmann::json entryOf(const World& world, const std::string& name) {
    const auto list = answer(world, {"storage", "list"});
    for (const auto& file : list["files"])
        if (file["name"] == name) return file;
    return {};
}

TEST(Storage, APurgeAtEachUrgencyDoesWhatItShould) {
    World world;
    world.startDaemon();
    const std::filesystem::path old = std::filesystem::path(world.moviePath()).parent_path() / "Old.mp4";
    std::ofstream(old) << std::string(5000, 'x');
    std::filesystem::last_write_time(old, std::filesystem::file_time_type::clock::now() - std::chrono::hours(48));

    for (const char* urgency : {"1", "2"}) {
        const auto idle = answer(world, {"storage", "purge", urgency});
        EXPECT_TRUE(idle["freedBytes"].is_null()) << idle;
    }
    EXPECT_TRUE(std::filesystem::exists(old));

    const auto application = world.application({"--size", "320x180", "--fps", "30"});
    ASSERT_TRUE(application->waitForFrame(1));
    (void)application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(0.5));
    const auto movie = entryOf(world, "Self Recorder.mp4");
    ASSERT_FALSE(movie.is_null());
    EXPECT_TRUE(movie["recording"].get<bool>());
    EXPECT_GT(movie["bytes"].get<std::uint64_t>(), 0u);
    EXPECT_FALSE(entryOf(world, "Old.mp4")["recording"].get<bool>());
    EXPECT_EQ(entryOf(world, "Old.mp4")["bytes"].get<std::uint64_t>(), 5000u);
    const Outcome text = tool(world, {"storage"});
    EXPECT_THAT(text.out, HasSubstr("  being recorded\n"));
    EXPECT_THAT(text.out, HasSubstr("\nFree space: "));

    for (const char* urgency : {"1", "2"}) {
        const auto during = answer(world, {"storage", "purge", urgency});
        EXPECT_TRUE(during["freedBytes"].is_null()) << during;
    }
    EXPECT_TRUE(std::filesystem::exists(old));
    EXPECT_TRUE(std::filesystem::exists(world.moviePath()));
    EXPECT_FALSE(world.recording().is_null());

    const auto urgent = answer(world, {"storage", "purge", "3"});
    EXPECT_TRUE(urgent["freedBytes"].is_number()) << urgent;
    EXPECT_THAT(application->nextEvent(), HasSubstr("-5805"));
    EXPECT_FALSE(std::filesystem::exists(old));
    EXPECT_FALSE(std::filesystem::exists(world.moviePath()));
    EXPECT_TRUE(world.recording().is_null());
    EXPECT_FALSE(world.status()["sessions"][0]["transactionOpen"].get<bool>());
    EXPECT_EQ(tool(world, {"storage", "list"}).out, "There are no temporary movies.\n");

    // The application is none the worse for it.
    (void)application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(0.5));
    const std::string kept = application->stop();
    EXPECT_TRUE(std::filesystem::exists(kept)) << kept;
    EXPECT_FALSE(entryOf(world, "Self Recorder.mp4")["recording"].get<bool>());

    EXPECT_EQ(world.endDaemon(SIGTERM), 0);
    EXPECT_EQ(tool(world, {"storage", "list"}).status, 1);
}

TEST(Storage, WhereLessThanARecordingNeedsIsFreeNoneBegins) {
    World world;
    const std::filesystem::path folder = std::filesystem::path(world.moviePath()).parent_path();
    std::filesystem::create_directories(folder);
    const auto refusedOn = [&](const std::string& room) {
        bool refused = false;
        const bool isMounted = withSmallDisk(folder, room, [&] {
            world.startDaemon();
            const auto application = world.application({"--size", "320x180", "--fps", "10"});
            EXPECT_TRUE(application->waitForFrame(1));
            const std::string answer = application->ask("start");
            refused = answer.starts_with("error -5805");
            EXPECT_TRUE(refused || answer.starts_with("started")) << answer;
            EXPECT_EQ(world.endDaemon(SIGTERM), 0);
        });
        EXPECT_TRUE(isMounted) << "this process may not mount anything";
        return refused;
    };
    EXPECT_TRUE(refusedOn("90m"));
    EXPECT_FALSE(refusedOn("200m"));
}

}  // namespace
}  // namespace lumacast::test
