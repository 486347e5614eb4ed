#include "support/FileRemovals.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <vector>

#include "support/TempStore.h"
#include "tests/fakes/FakePlatform.h"

namespace lumacast {
namespace {

/// A store on a disk on which the removals of one path stand still until they are let go on.
class SlowDisk {
public:
    explicit SlowDisk(std::uint64_t seed, std::string slowPath = "slow") : world(seed), slow_(std::move(slowPath)) {
        store._srSetupTempDirectory();
        world.fakes.fileSystem.setDisk([this](const std::string& path) {
            if (path.find(slow_) == std::string::npos) return;
            ++waiting;
            mostWaiting = std::max(mostWaiting, waiting);
            goOn->wait();
            --waiting;
        });
    }
    ~SlowDisk() { world.scheduler.endWorld(); }

    std::string addFile(const std::string& name) {
        world.fakes.fileSystem.addFile(store.pathFor(name), 10);
        return store.pathFor(name);
    }
    void remove(const std::string& path, std::string told) {
        store._srRemoveFile(URL::file(path), [this, told](std::optional<Error>) { order.push_back(told); });
    }
    void settle() { world.scheduler.runUntilIdle(); }
    bool exists(const std::string& path) { return world.fakes.fileSystem.exists(path); }

    SimWorld world;
    TempStore store{world.fakes.platform()};
    std::unique_ptr<Semaphore> goOn = world.scheduler.semaphore(0);
    std::vector<std::string> order;
    int waiting = 0, mostWaiting = 0;

private:
    const std::string slow_;
};

using Order = std::vector<std::string>;

TEST(FileRemovals, OnePathsSlowRemovalHoldsNoOtherPathUp) {
    for (std::uint64_t seed = 1; seed <= 20; ++seed) {
        SlowDisk disk(seed);
        const std::string slow = disk.addFile("slow.mp4"), other = disk.addFile("other.mp4");
        disk.remove(slow, "slow");
        disk.remove(other, "other");
        disk.settle();
        EXPECT_EQ(disk.order, Order{"other"}) << seed;
        EXPECT_FALSE(disk.exists(other)) << seed;
        disk.goOn->signal();
        disk.settle();
        EXPECT_EQ(disk.order, (Order{"other", "slow"})) << seed;
        EXPECT_FALSE(disk.exists(slow)) << seed;
    }
}

TEST(FileRemovals, WorkInACompletionHoldsNoOtherPathUp) {
    SlowDisk disk(1);
    const auto working = disk.world.scheduler.semaphore(0);
    disk.store._srRemoveFile(URL::file(disk.addFile("a.mp4")), [&](std::optional<Error>) { working->wait(); });
    disk.remove(disk.addFile("b.mp4"), "b");
    disk.settle();
    EXPECT_EQ(disk.order, Order{"b"});
    working->signal();
    disk.settle();
}

TEST(FileRemovals, ACompletionEndsBeforeTheNextRemovalOfItsPath) {
    // What a writer sets up in its completion is its own file: only what was asked for later may remove it.
    for (std::uint64_t seed = 1; seed <= 20; ++seed) {
        SlowDisk disk(seed);
        const std::string path = disk.addFile("a.mp4");
        const auto settingUp = disk.world.scheduler.semaphore(0);
        bool sawItsFile = false;
        disk.store._srRemoveFile(URL::file(path), [&](std::optional<Error>) {
            EXPECT_FALSE(disk.exists(path));
            disk.addFile("a.mp4");
            settingUp->wait();
            sawItsFile = disk.exists(path);
        });
        // The same place, written otherwise.
        disk.remove(disk.store._srTempPath() + "a.mp4", "later");
        disk.settle();
        EXPECT_EQ(disk.order, Order{}) << seed;
        settingUp->signal();
        disk.settle();
        EXPECT_TRUE(sawItsFile) << seed;
        EXPECT_EQ(disk.order, Order{"later"}) << seed;
        EXPECT_FALSE(disk.exists(path)) << seed;
    }
}

TEST(FileRemovals, ADiskThatStandsStillTakesEightThreadsAtMost) {
    SlowDisk disk(1);
    for (int i = 0; i < 30; ++i) disk.remove(disk.addFile("slow" + std::to_string(i) + ".mp4"), std::to_string(i));
    disk.settle();
    EXPECT_EQ(disk.waiting, static_cast<int>(FileRemovals::kMaximumAtATime));
    for (int i = 0; i < 30; ++i) disk.goOn->signal();
    disk.settle();
    EXPECT_EQ(disk.order.size(), 30u);
    EXPECT_EQ(disk.mostWaiting, static_cast<int>(FileRemovals::kMaximumAtATime));
    EXPECT_TRUE(disk.world.fakes.fileSystem.files().empty());
}

TEST(FileRemovals, WhatIsAskedForDuringAPurgeOfTheFileWaitsForIt) {
    // The purge has the old file in its hands; the start of a new recording must not have its own file removed by it.
    for (std::uint64_t seed = 1; seed <= 20; ++seed) {
        SlowDisk disk(seed, "a.mp4");
        const std::string path = disk.addFile("a.mp4");
        std::uint64_t freed = 0;
        disk.world.scheduler.globalQueue(QueuePriority::Default).async([&] {
            freed = disk.store._srDeleteAllTempFiles();
        });
        disk.settle();
        ASSERT_EQ(disk.waiting, 1) << seed;
        const std::uint64_t claim = disk.store.claimPath(path);
        disk.store.removeFileOfClaim(URL::file(path), claim, [&](std::optional<Error>) {
            EXPECT_FALSE(disk.exists(path));
            disk.addFile("a.mp4");
            disk.order.push_back("set up");
        });
        disk.settle();
        EXPECT_EQ(disk.waiting, 1) << seed << ": the start waits for its turn";
        disk.goOn->signal();
        disk.settle();
        disk.goOn->signal();
        disk.settle();
        EXPECT_EQ(disk.order, Order{"set up"}) << seed;
        EXPECT_TRUE(disk.exists(path)) << seed;
        EXPECT_EQ(freed, 10u) << seed;
    }
}

TEST(FileRemovals, APurgeLeavesNoTraceOfThePathsItHad) {
    SlowDisk disk(1);
    const std::string path = disk.addFile("a.mp4");
    EXPECT_EQ(disk.store._srDeleteAllTempFiles(), 10u);
    disk.addFile("a.mp4");
    disk.remove(path, "removed");
    disk.settle();
    EXPECT_EQ(disk.order, Order{"removed"});
    EXPECT_FALSE(disk.exists(path));
}

}  // namespace
}  // namespace lumacast
