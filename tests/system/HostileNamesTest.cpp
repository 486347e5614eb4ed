// Applications whose names are no file names, and a temporary directory that goes or is somebody else's.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "tests/system/MovingWindow.h"
#include "tests/system/World.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;
using ::testing::StartsWith;

fs::path temporaryDirectory(const World& world) { return fs::path(world.moviePath()).parent_path(); }

/// Records for half a second; the movie's path.
std::string record(World& world, Application& application) {
    EXPECT_TRUE(application.waitForFrame(1));
    (void)application.askForFrame("start");
    EXPECT_TRUE(world.waitForElapsed(0.5)) << world.daemonLog();
    return application.stop();
}

TEST(HostileNames, ANameThatIsNoFileNameIsRefusedAndNothingIsWrittenElsewhere) {
    for (const std::string& name : {std::string("App/Two"), std::string(300, 'n')}) {
        SCOPED_TRACE(name.substr(0, 10));
        World world;
        const std::string program = world.path("Hostile");
        fs::copy_file(LC_SELF_RECORDER, program);
        world.install("org.lumacast.Hostile", name, program);
        world.startDaemon();
        fs::create_directory(world.path("outside"));
        fs::create_directory_symlink(world.path("outside"), temporaryDirectory(world) / "App");
        Application hostile(world, program, "Hostile", kMoving);
        ASSERT_TRUE(hostile.waitForFrame(1));
        (void)hostile.askForFrame("start");  // the outcome of a writer's start is deliberately not looked at
        EXPECT_THAT(hostile.ask("stop"), StartsWith("error -5812 "));
        EXPECT_THAT(world.daemonLog(), HasSubstr("error LCMovieWriter: setupAssetWriter error: "));
        EXPECT_TRUE(fs::is_empty(world.path("outside")));
        hostile.kill();
        const auto honest = world.application(kMoving);
        EXPECT_FALSE(picturesOf(record(world, *honest)).empty());
    }
}

TEST(HostileNames, ATemporaryDirectoryThatWasRemovedIsThereForTheNextRecording) {
    World world;
    world.startDaemon();
    const auto application = world.application(kMoving);
    EXPECT_FALSE(picturesOf(record(world, *application)).empty());
    fs::remove_all(world.path("state/lumacast/root"));
    EXPECT_FALSE(picturesOf(record(world, *application)).empty());
    // Even under a recording: that one is lost, the next one is not.
    (void)application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(0.3));
    fs::remove_all(world.path("state/lumacast/root"));
    (void)application->ask("stop");
    EXPECT_FALSE(picturesOf(record(world, *application)).empty());
}

}  // namespace
}  // namespace lumacast::test
