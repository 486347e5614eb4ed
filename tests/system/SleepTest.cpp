// The device stays awake while something is recorded, and sleeps only when that is on the disk: the shipped daemon on a
// system bus of the test's own.

#include <gtest/gtest.h>

#include "tests/system/MovingWindow.h"
#include "tests/system/World.h"
#include "tests/unit/linux_services/StandInLoginManager.h"

namespace lumacast::test {
namespace {

bool bothAreHeld(const StandInLoginManager& manager) {
    return manager.held("sleep", "delay") == 1 && manager.held("idle", "block") == 1;
}
bool noneIsHeld(const StandInLoginManager& manager) {
    return manager.held("sleep", "delay") == 0 && manager.held("idle", "block") == 0;
}

TEST(Sleep, IsHeldOffWhileARecordingRunsAndNoLonger) {
    const PrivateBus bus;
    const StandInLoginManager manager(bus.address());
    World world;
    world.startDaemon({"DBUS_SYSTEM_BUS_ADDRESS=" + bus.address()});
    const auto application = world.application(kMoving);
    ASSERT_TRUE(application->waitForFrame(1));
    EXPECT_TRUE(manager.locks().empty()) << "an idle daemon keeps nobody awake";
    (void)application->askForFrame("start");
    EXPECT_TRUE(waitUntil([&] { return bothAreHeld(manager); }));
    ASSERT_TRUE(world.waitForElapsed(0.5));
    (void)application->askForFrame("pause");
    EXPECT_TRUE(bothAreHeld(manager)) << "a pause is part of the recording";
    (void)application->ask("resume");
    ASSERT_FALSE(application->stop().empty());
    EXPECT_TRUE(waitUntil([&] { return noneIsHeld(manager); }));
    (void)application->askForFrame("start");
    EXPECT_TRUE(waitUntil([&] { return bothAreHeld(manager); }));
    EXPECT_EQ(world.endDaemon(SIGTERM), 0);
    EXPECT_TRUE(noneIsHeld(manager)) << "the process's end lets go";
}

TEST(Sleep, ComesWhenWhatWasRecordedIsOnTheDiskAndTheRecordingGoesOnAfterwards) {
    const PrivateBus bus;
    StandInLoginManager manager(bus.address());
    World world;
    auto variables = world.troubledDisk();
    variables.push_back("DBUS_SYSTEM_BUS_ADDRESS=" + bus.address());
    world.startDaemon(variables);
    const auto application = world.application(kMoving);
    ASSERT_TRUE(application->waitForFrame(1));
    (void)application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(1));
    ASSERT_TRUE(waitUntil([&] { return bothAreHeld(manager); }));
    world.setDiskStalled(true);
    const std::uint32_t shown = application->askForFrame("frame");
    ASSERT_TRUE(application->waitForFrame(shown + 10));
    manager.prepareForSleep(true);
    ASSERT_TRUE(application->waitForFrame(shown + 12));
    EXPECT_TRUE(bothAreHeld(manager)) << "the device waits for the disk";
    world.setDiskStalled(false);
    ASSERT_TRUE(waitUntil([&] { return manager.held("sleep", "delay") == 0; }));
    // As if the power went now: what the file has is what there is.
    std::uint32_t last = 0;
    for (const auto& picture : picturesOf(world.moviePath(), true)) last = std::max(last, picture.number.value_or(0));
    EXPECT_GE(last, shown + 3);
    manager.prepareForSleep(false);
    EXPECT_TRUE(waitUntil([&] { return bothAreHeld(manager); }));
    const std::uint32_t woken = application->askForFrame("frame");
    ASSERT_TRUE(application->waitForFrame(woken + 10));
    const auto pictures = picturesOf(application->stop());
    ASSERT_FALSE(pictures.empty());
    EXPECT_GE(pictures.back().number.value_or(0), woken);
}

TEST(Sleep, WithADeadDiskIsHeldOffForAWhileOnly) {
    const PrivateBus bus;
    StandInLoginManager manager(bus.address());
    World world;
    auto variables = world.troubledDisk();
    variables.push_back("DBUS_SYSTEM_BUS_ADDRESS=" + bus.address());
    world.startDaemon(variables);
    const auto application = world.application(kMoving);
    ASSERT_TRUE(application->waitForFrame(1));
    (void)application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(1));
    ASSERT_TRUE(waitUntil([&] { return bothAreHeld(manager); }));
    world.setDiskStalled(true);
    ASSERT_TRUE(application->waitForFrame(application->askForFrame("frame") + 5));
    const auto before = std::chrono::steady_clock::now();
    manager.prepareForSleep(true);
    EXPECT_TRUE(waitUntil([&] { return manager.held("sleep", "delay") == 0; }));
    EXPECT_LT(std::chrono::steady_clock::now() - before, std::chrono::seconds(12));
    EXPECT_FALSE(world.status().is_null()) << "and nobody else waits";
    world.setDiskStalled(false);
    EXPECT_FALSE(picturesOf(application->stop()).empty());
}

}  // namespace
}  // namespace lumacast::test
