// Broadcasts through upload extensions, each in its own confined process.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>

#include "tests/system/World.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;
using ::testing::StartsWith;

constexpr char kKeeper[] = "org.lumacast.ClipKeeper";

std::vector<std::string> moviesIn(const fs::path& folder) {
    std::vector<std::string> movies;
    for (const auto& entry : fs::directory_iterator(folder))
        if (entry.path().extension() == ".mp4") movies.push_back(entry.path().string());
    std::sort(movies.begin(), movies.end());
    return movies;
}

TEST(Broadcast, ClipsReachTheirExtensionWithEveryFrameInOrderAndLeaveNothingBehind) {
    World world;
    const std::string folder = world.installExtension(kKeeper, LC_MINIMAL_EXTENSION, false);
    world.startDaemon();
    const auto app = world.application({"--size", "640x360", "--fps", "30", "--beep-every", "15"});
    const std::string answer =
        app->ask("broadcast org.lumacast.SelfRecorder " + std::string(kKeeper) + " directory=" + folder);
    ASSERT_THAT(answer, StartsWith("started frame")) << world.daemonLog();
    ASSERT_TRUE(waitUntil([&] { return moviesIn(folder).size() >= 2; })) << world.daemonLog();
    ASSERT_TRUE(app->waitForFrame(app->askForFrame("frame") + 10));
    const std::string stopped = app->ask("stop");
    EXPECT_THAT(stopped, HasSubstr("without movie"));
    ASSERT_TRUE(waitUntil([&] { return moviesIn(folder).size() >= 3; })) << world.daemonLog();
    const fs::path temporary = fs::path(world.moviePath()).parent_path();
    EXPECT_TRUE(waitUntil([&] { return moviesIn(temporary).empty(); }));
    std::uint32_t last = 0;
    int missing = 0;
    for (const std::string& clip : moviesIn(folder)) {
        const auto pictures = picturesOf(clip);
        ASSERT_FALSE(pictures.empty()) << clip;
        for (const auto& picture : pictures) {
            ASSERT_TRUE(picture.number) << clip;
            if (last && *picture.number > last + 1) missing += static_cast<int>(*picture.number - last - 1);
            EXPECT_GE(*picture.number, last) << clip;
            last = *picture.number;
        }
    }
    EXPECT_LE(missing, static_cast<int>(moviesIn(folder).size()) - 1) << "one at each cut at most";
}

}  // namespace
}  // namespace lumacast::test
