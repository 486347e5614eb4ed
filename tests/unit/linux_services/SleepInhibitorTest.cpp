// The device stays awake while the daemon is busy, and sleeps only when what was recorded is safe: on a bus of the
// test's own, with a login manager of the test's own.

#include "linux/system/SleepInhibitor.h"

#include <gtest/gtest.h>
#include <stdlib.h>

#include <atomic>
#include <filesystem>
#include <fstream>

#include "linux/system/LinuxKeepAlive.h"
#include "tests/unit/linux_services/StandInLoginManager.h"
#include "tests/unit/linux_services/Until.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;

bool bothAreHeld(const StandInLoginManager& manager) {
    return manager.held("sleep", "delay") == 1 && manager.held("idle", "block") == 1;
}
bool noneIsHeld(const StandInLoginManager& manager) {
    return manager.held("sleep", "delay") == 0 && manager.held("idle", "block") == 0;
}

/// Threads of this process that bear the inhibitor's name.
std::size_t itsThreads() {
    std::size_t count = 0;
    std::error_code gone;
    for (const auto& task : std::filesystem::directory_iterator("/proc/self/task", gone)) {
        std::ifstream file(task.path() / "comm");
        std::string line;
        std::getline(file, line);
        count += line == "lc-inhibit" ? 1 : 0;
    }
    return count;
}

SleepInhibitor::Options optionsFor(const PrivateBus& bus, std::function<void()> beforeSleep = {}) {
    return {.busAddress = bus.address(), .beforeSleep = std::move(beforeSleep), .retry = 20ms};
}

TEST(SleepInhibitor, HoldsBothLocksWhileTheDaemonIsBusyAndNoneWhenItIsNot) {
    const PrivateBus bus;
    const StandInLoginManager manager(bus.address());
    SleepInhibitor inhibitor(optionsFor(bus));
    EXPECT_EQ(itsThreads(), 0u) << "a daemon that was never busy has no thread for it";
    for (int round = 0; round < 3; ++round) {
        inhibitor.setBusy(true);
        ASSERT_TRUE(until([&] { return bothAreHeld(manager); })) << round;
        inhibitor.setBusy(false);
        EXPECT_TRUE(until([&] { return noneIsHeld(manager); })) << round;
    }
    EXPECT_EQ(manager.locks().size(), 6u) << "each was asked for once";
    EXPECT_EQ(manager.locks()[0].who, "lumacastd");
    EXPECT_NE(manager.locks()[0].why, "");
}

TEST(SleepInhibitor, LetsGoWhenItEnds) {
    const PrivateBus bus;
    const StandInLoginManager manager(bus.address());
    {
        SleepInhibitor inhibitor(optionsFor(bus));
        inhibitor.setBusy(true);
        ASSERT_TRUE(until([&] { return bothAreHeld(manager); }));
    }
    EXPECT_TRUE(until([&] { return noneIsHeld(manager); })) << "an answer may have been under way";
    EXPECT_TRUE(until([] { return itsThreads() == 0; }));
}

TEST(SleepInhibitor, MakesTheMoviesSafeBeforeTheDeviceSleepsAndHoldsItAgainWhenItWakes) {
    const PrivateBus bus;
    StandInLoginManager manager(bus.address());
    Gate gate;
    gate.shut();
    std::atomic<int> safe{0};
    SleepInhibitor inhibitor(optionsFor(bus, [&] {
        gate.pass();
        ++safe;
    }));
    inhibitor.setBusy(true);
    ASSERT_TRUE(until([&] { return bothAreHeld(manager); }));
    manager.prepareForSleep(true);
    ASSERT_TRUE(until([&] { return gate.arrived() == 1; }));
    EXPECT_TRUE(bothAreHeld(manager)) << "the device waits until they are safe";
    gate.open();
    EXPECT_TRUE(until([&] { return manager.held("sleep", "delay") == 0; }));
    EXPECT_EQ(safe, 1);
    EXPECT_EQ(manager.held("idle", "block"), 1u);
    manager.prepareForSleep(false);
    EXPECT_TRUE(until([&] { return bothAreHeld(manager); }));
    manager.prepareForSleep(true);
    EXPECT_TRUE(until([&] { return manager.held("sleep", "delay") == 0; }));
    EXPECT_EQ(safe, 2) << "again";
    // The recording ends while the device is asleep.
    inhibitor.setBusy(false);
    EXPECT_TRUE(until([&] { return noneIsHeld(manager); }));
    manager.prepareForSleep(false);
    inhibitor.setBusy(true);
    EXPECT_TRUE(until([&] { return bothAreHeld(manager); }));
    EXPECT_EQ(manager.locks().size(), 5u);
}

TEST(SleepInhibitor, AnIdleDaemonHearsNothingOfSleep) {
    const PrivateBus bus;
    StandInLoginManager manager(bus.address());
    std::atomic<int> safe{0};
    SleepInhibitor inhibitor(optionsFor(bus, [&] { ++safe; }));
    inhibitor.setBusy(true);
    ASSERT_TRUE(until([&] { return bothAreHeld(manager); }));
    inhibitor.setBusy(false);
    ASSERT_TRUE(until([&] { return noneIsHeld(manager); }));
    manager.prepareForSleep(true);
    manager.prepareForSleep(false);
    // The answers come behind both signals.
    inhibitor.setBusy(true);
    ASSERT_TRUE(until([&] { return bothAreHeld(manager); }));
    EXPECT_EQ(safe, 0);
}

TEST(SleepInhibitor, ManyShortRecordingsLeaveNoLockBehind) {
    const PrivateBus bus;
    const StandInLoginManager manager(bus.address());
    SleepInhibitor inhibitor(optionsFor(bus));
    for (int i = 0; i < 50; ++i) {
        inhibitor.setBusy(true);
        // A lock has been given; the answer may still be on its way. (One of before counts too: between two recordings
        // that follow each other at once there need not be a moment without.)
        ASSERT_TRUE(until([&] { return manager.held("sleep", "delay") > 0; }));
        inhibitor.setBusy(false);
    }
    EXPECT_TRUE(until([&] { return noneIsHeld(manager); }));
    inhibitor.setBusy(true);
    EXPECT_TRUE(until([&] { return bothAreHeld(manager); }));
}

TEST(SleepInhibitor, ABusThatDiesAndReturnsIsAskedAgain) {
    PrivateBus bus;
    const StandInLoginManager before(bus.address());
    SleepInhibitor inhibitor(optionsFor(bus));
    inhibitor.setBusy(true);
    ASSERT_TRUE(until([&] { return bothAreHeld(before); }));
    bus.die();
    EXPECT_TRUE(bothAreHeld(before)) << "the login manager may still count them";
    bus.start();
    const StandInLoginManager after(bus.address());
    EXPECT_TRUE(until([&] { return bothAreHeld(after); }));
    EXPECT_TRUE(until([&] { return noneIsHeld(before); })) << "those of before are let go";
    inhibitor.setBusy(false);
    EXPECT_TRUE(until([&] { return noneIsHeld(after); }));
}

TEST(SleepInhibitor, ALoginManagerThatComesLateOrAnewIsAsked) {
    const PrivateBus bus;
    SleepInhibitor inhibitor(optionsFor(bus));
    inhibitor.setBusy(true);
    ASSERT_TRUE(until([] { return itsThreads() == 1; }));
    {
        const StandInLoginManager manager(bus.address());
        EXPECT_TRUE(until([&] { return bothAreHeld(manager); }));
    }
    const StandInLoginManager next(bus.address());
    EXPECT_TRUE(until([&] { return bothAreHeld(next); }));
}

TEST(SleepInhibitor, WithoutABusThereIsNothingUntilOneComes) {
    PrivateBus bus(PrivateBus::State::NotYet);
    SleepInhibitor inhibitor(optionsFor(bus));
    inhibitor.setBusy(true);
    inhibitor.setBusy(false);
    inhibitor.setBusy(true);
    ASSERT_TRUE(until([] { return itsThreads() == 1; }));
    bus.start();
    const StandInLoginManager manager(bus.address());
    EXPECT_TRUE(until([&] { return bothAreHeld(manager); }));
}

TEST(SleepInhibitor, ABusThatHangsHoldsNobodyUpNorItsEnd) {
    const PrivateBus bus;
    bus.hang();
    const auto before = std::chrono::steady_clock::now();
    {
        SleepInhibitor inhibitor(optionsFor(bus));
        for (int i = 0; i < 100; ++i) inhibitor.setBusy(i % 2 == 0);
        inhibitor.setBusy(true);
        ASSERT_TRUE(until([] { return itsThreads() == 1; }));
    }
    EXPECT_LT(std::chrono::steady_clock::now() - before, 10s);
    bus.goOn();
}

TEST(LinuxKeepAlive, KeepsTheDeviceAwakeWhileATransactionIsOpen) {
    const PrivateBus bus;
    const StandInLoginManager manager(bus.address());
    ::setenv("DBUS_SYSTEM_BUS_ADDRESS", bus.address().c_str(), 1);
    {
        LinuxKeepAlive keepAlive("", SleepInhibitor::Options{});
        keepAlive.beginTransaction();
        ASSERT_TRUE(until([&] { return bothAreHeld(manager); }));
        keepAlive.beginTransaction();
        keepAlive.endTransaction();
        EXPECT_TRUE(bothAreHeld(manager));
        keepAlive.endTransaction();
        EXPECT_TRUE(until([&] { return noneIsHeld(manager); }));
        EXPECT_EQ(manager.locks().size(), 2u) << "two for all transactions";
    }
    ::unsetenv("DBUS_SYSTEM_BUS_ADDRESS");
}

}  // namespace
}  // namespace lumacast
