// A daemon that has recorded often is no larger than one that has recorded a few times.

#include <gtest/gtest.h>

#include "tests/system/World.h"

namespace lumacast::test {
namespace {

#ifndef LC_SANITIZED  // a sanitizer keeps what was freed on purpose

TEST(Memory, StaysFlatOverManyRecordings) {
    constexpr int kWarmUp = 5;
    constexpr std::size_t kMayGrowKilobytes = 6'000;
    const int recordings = longTests() ? 120 : 20;
    World world;
    world.startDaemon();
    const auto application = world.application({"--size", "640x360", "--fps", "30"});
    ASSERT_TRUE(application->waitForFrame(1));
    std::size_t warm = 0, warmThreads = 0, warmDescriptors = 0;
    for (int i = 1; i <= recordings; ++i) {
        const std::uint32_t from = application->askForFrame("start");
        ASSERT_TRUE(application->waitForFrame(from + 12));
        ASSERT_FALSE(application->stop().empty());
        if (i == kWarmUp) {
            warm = world.daemonNumber("RssAnon");
            warmThreads = world.daemonNumber("Threads");
            warmDescriptors = world.daemonDescriptors();
        }
    }
    const std::size_t end = world.daemonNumber("RssAnon");
    std::printf("memory: %zu kB after %d recordings, %zu kB after %d\n", warm, kWarmUp, end, recordings);
    EXPECT_LE(end, warm + kMayGrowKilobytes);
    EXPECT_LE(world.daemonNumber("Threads"), warmThreads + 2);  // a pool's threads come and go
    EXPECT_LE(world.daemonDescriptors(), warmDescriptors + 2);
}

#endif

}  // namespace
}  // namespace lumacast::test
