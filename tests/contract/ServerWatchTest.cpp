// When a sound server may have come.

#include <gtest/gtest.h>
#include <poll.h>

#include <filesystem>
#include <fstream>

#include "linux/audio/ServerWatch.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::sound {
namespace {

bool tells(const ServerWatch& watch, int milliseconds = 10'000) {
    pollfd polled{watch.descriptor(), POLLIN, 0};
    return ::poll(&polled, 1, milliseconds) == 1;
}

void make(const std::filesystem::path& path) { std::ofstream(path) << "a socket"; }

TEST(ServerWatch, TellsWhenTheSocketComesAndGoesAndComesAgain) {
    const ScratchDirectory folder;
    const std::filesystem::path socket = folder.path("native");
    ServerWatch watch("unix:" + socket.string());
    for (int time = 0; time < 2; ++time) {
        EXPECT_TRUE(watch.waitsForServer());
        EXPECT_FALSE(tells(watch, 0));
        make(socket);
        ASSERT_TRUE(tells(watch));
        EXPECT_TRUE(watch.take());
        EXPECT_FALSE(watch.waitsForServer());
        std::filesystem::remove(socket);
    }
}

TEST(ServerWatch, FollowsAFolderThatComesWithItsServerAlsoAgain) {
    const ScratchDirectory folder;
    const std::filesystem::path own = folder.path("pulse");
    ServerWatch watch((own / "native").string());
    for (int time = 0; time < 2; ++time) {
        EXPECT_TRUE(watch.waitsForServer());
        std::filesystem::create_directory(own);
        ASSERT_TRUE(tells(watch));
        EXPECT_TRUE(watch.take());
        EXPECT_TRUE(watch.waitsForServer());
        make(own / "native");
        ASSERT_TRUE(tells(watch));
        EXPECT_TRUE(watch.take());
        EXPECT_FALSE(watch.waitsForServer());
        std::filesystem::remove_all(own);
        ASSERT_TRUE(tells(watch));
        EXPECT_TRUE(watch.take());
    }
}

TEST(ServerWatch, OtherNamesAreOfNoInterest) {
    const ScratchDirectory folder;
    ServerWatch watch(folder.path("native"));
    make(folder.path("bus"));
    ASSERT_TRUE(tells(watch));
    EXPECT_FALSE(watch.take());
    EXPECT_FALSE(tells(watch, 0));
}

TEST(ServerWatch, ThatRestsTellsNothingUntilItResumes) {
    const ScratchDirectory folder;
    const std::filesystem::path socket = folder.path("native");
    ServerWatch watch(socket.string());
    make(socket);
    watch.rest();
    std::filesystem::remove(socket);
    watch.resume();
    EXPECT_TRUE(watch.waitsForServer());
    EXPECT_FALSE(tells(watch, 0)) << "of before, or of the rest itself";
    make(socket);
    ASSERT_TRUE(tells(watch));
    EXPECT_TRUE(watch.take());
    watch.rest();
    EXPECT_FALSE(watch.waitsForServer());
    while (tells(watch, 0)) watch.take();
    std::filesystem::remove(socket);
    make(socket);
    EXPECT_FALSE(tells(watch, 0));
}

TEST(ServerWatch, OfAServerElsewhereThereIsNothingToWaitFor) {
    for (const char* const server : {"tcp:example.org", "{0123}unix:/tmp/native", "example.org"}) {
        const ServerWatch watch(server);
        EXPECT_LT(watch.descriptor(), 0);
        EXPECT_FALSE(watch.waitsForServer());
    }
}

}  // namespace
}  // namespace lumacast::sound
