// An extension's sandbox that is ended before it is set up.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/file.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <filesystem>
#include <future>

#include "linux/ipc/Fd.h"
#include "tests/contract/ExtensionTools.h"
#include "tests/contract/LinuxExtensionsWorld.h"

namespace lumacast {
namespace {

namespace fs = std::filesystem;

void beginOne(AppExtension& extension) {
    extension.beginExtensionRequestWithInputItems({textItem("command", "hold")}, [](auto, auto) {});
}

TEST(ExtensionSetUp, NothingStaysOfABubblewrapThatIsKilledBeforeItsChildKnowsItsParent) {
    ScratchDirectory scratch;
    const std::string lock = scratch.path("lock"), program = scratch.path("bwrap");
    // Where the real one's child would wait for its parent, this one's waits for good, with a lock that tells of it.
    scratch.write("bwrap", "#!/bin/sh\ncase \"$*\" in */usr/bin/env*) exec /usr/bin/bwrap \"$@\";; esac\nflock '" +
                               lock + "' '" + std::string(LC_EXTENSION_PROBE) + "' --silent &\nwait\n");
    fs::permissions(program, fs::perms(0755));
    LinuxExtensionsWorld world([&](LinuxAppExtensions::Options& options) { options.sandbox.bubblewrap = program; });
    world.install({"org.example.Upload"});
    const Fd file(::open(lock.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
    const auto isHeld = [&] {
        if (::flock(file.get(), LOCK_EX | LOCK_NB) != 0) return true;
        ::flock(file.get(), LOCK_UN);
        return false;
    };
    for (const bool byOthers : {false, true}) {
        const auto found = findExtensions(world).found;
        ASSERT_EQ(found.size(), 1u);
        beginOne(*found.front());
        ASSERT_TRUE(eventually(isHeld));
        const pid_t watcher = world.onlyProcess();
        ASSERT_GT(watcher, 1);
        if (byOthers)
            ::kill(watcher, SIGKILL);
        else
            found.front()->kill(SIGKILL);
        EXPECT_TRUE(eventually([&] { return !isHeld(); })) << (byOthers ? "killed by others" : "killed by the daemon");
        EXPECT_TRUE(eventually([&] { return world.processCount() == 0; }));
    }
}

TEST(ExtensionSetUp, NothingStaysOfTheRealOneWheneverItIsKilled) {
    LinuxExtensionsWorld world;
    world.install({"org.example.Upload"});
    {
        const auto found = findExtensions(world).found;  // the trial run is over with it
        ASSERT_EQ(found.size(), 1u);
        ASSERT_TRUE(begin(*found.front(), "echo").request);
    }
    ASSERT_TRUE(eventually([&] { return world.processCount() == 0; }));
    for (int i = 0; i < 400; ++i) {
        const auto found = findExtensions(world).found;
        ASSERT_EQ(found.size(), 1u);
        beginOne(*found.front());
        ASSERT_TRUE(eventually([&] { return world.processCount() == 1; }));
        const auto moment = std::chrono::steady_clock::now() + i * std::chrono::microseconds(15);
        ASSERT_TRUE(eventually([&] { return std::chrono::steady_clock::now() >= moment; }));
        found.front()->kill(SIGKILL);
        ASSERT_TRUE(eventually([&] { return world.processCount() == 0; }));
    }
    EXPECT_TRUE(eventually([&] { return processesWith(world.dataHome()) == 0; })) << processesWith(world.dataHome());
}

TEST(ExtensionSetUp, AnExtensionWhoseObjectGoesBeforeItIsLaunchedEndsInItsTimeToo) {
    LinuxExtensionsWorld world(
        [](LinuxAppExtensions::Options& options) { options.lastRequests = std::chrono::milliseconds(500); });
    world.install({"org.example.Upload"});
    auto found = findExtensions(world).found;
    ASSERT_EQ(found.size(), 1u);
    std::promise<void> goesOn;
    world.reactor().async([wait = goesOn.get_future().share()] { wait.get(); });
    std::atomic<bool> isBegun{false};
    found.front()->beginExtensionRequestWithInputItems({textItem("command", "hold")},
                                                       [&](auto request, auto) { isBegun = request.has_value(); });
    found.clear();
    goesOn.set_value();
    EXPECT_TRUE(eventually([&] { return isBegun.load(); })) << "it is launched for its request";
    EXPECT_TRUE(eventually([&] { return world.processCount() == 0; })) << "which it never completes";
}

}  // namespace
}  // namespace lumacast
