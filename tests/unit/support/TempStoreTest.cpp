#include "support/TempStore.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <vector>

#include "tests/fakes/FakeError.h"
#include "tests/fakes/FakePlatform.h"

namespace lumacast {
namespace {

class TempStoreTest : public ::testing::Test {
protected:
    ~TempStoreTest() override { world_.scheduler.endWorld(); }

    /// A store whose directory was set up.
    TempStore& ready() {
        store_._srSetupTempDirectory();
        fakes_.logSink.clear();
        return store_;
    }
    void settle() { world_.scheduler.runUntilIdle(); }
    std::string addFile(const std::string& name) {
        const std::string path = store_.pathFor(name);
        fakes_.fileSystem.addFile(path, 10);
        return path;
    }
    bool exists(const std::string& path) { return fakes_.fileSystem.exists(path); }

    SimWorld world_{1};
    FakePlatform& fakes_ = world_.fakes;
    TempStore store_{fakes_.platform()};
};

TEST_F(TempStoreTest, ThePathIsTheDevicesWithItsTrailingSlash) {
    EXPECT_EQ(store_._srTempPath(), "/private/var/mobile/Library/Lumacast/");
    EXPECT_EQ(store_.pathFor("a.mp4"), "/private/var/mobile/Library/Lumacast//a.mp4");
}

TEST_F(TempStoreTest, ThePathLiesBeneathTheConfiguredRoot) {
    SimWorld world(1, "/home/user/root");
    EXPECT_EQ(TempStore(world.fakes.platform())._srTempPath(), "/home/user/root/private/var/mobile/Library/Lumacast/");
}

TEST_F(TempStoreTest, SetUpMakesTheDirectoryOnce) {
    store_._srSetupTempDirectory();
    EXPECT_TRUE(exists(store_._srTempPath()));
    const std::string path = addFile("kept.mp4");
    fakes_.faults.failNext("FileSystem.createDirectory");
    store_._srSetupTempDirectory();
    EXPECT_TRUE(exists(path));
    EXPECT_TRUE(fakes_.faults.failures().empty()) << "a directory that is there is not made again";
    EXPECT_EQ(fakes_.logSink.logged(), (std::vector<std::string>{"_srSetupTempDirectory", "_srSetupTempDirectory"}));
    EXPECT_TRUE(fakes_.logSink.printed().empty());
}

TEST_F(TempStoreTest, AFailedSetUpIsPrintedAndLogged) {
    fakes_.faults.failNext("FileSystem.createDirectory");
    store_._srSetupTempDirectory();
    EXPECT_FALSE(exists(store_._srTempPath()));
    EXPECT_EQ(fakes_.logSink.logged(),
              (std::vector<std::string>{"_srSetupTempDirectory", "error creating temp directory"}));
    ASSERT_EQ(fakes_.logSink.printed().size(), 1u);
    EXPECT_EQ(fakes_.logSink.printed()[0], "error: " + describe(fakeSystemError(ETIMEDOUT)));
    const auto lines = fakes_.logSink.lines();
    ASSERT_GE(lines.size(), 2u);
    EXPECT_EQ(lines[lines.size() - 2].text, fakes_.logSink.printed()[0]) << "printed before it is logged";
}

TEST_F(TempStoreTest, ARemovalAnswersLaterWithoutBlocking) {
    const std::string path = (ready(), addFile("a.mp4"));
    std::vector<std::optional<Error>> answers;
    store_._srRemoveFile(URL::file(path), [&](std::optional<Error> error) { answers.push_back(error); });
    EXPECT_TRUE(exists(path)) << "the caller is not kept waiting";
    EXPECT_TRUE(answers.empty());
    settle();
    EXPECT_FALSE(exists(path));
    ASSERT_EQ(answers.size(), 1u);
    EXPECT_FALSE(answers[0]);
    EXPECT_TRUE(fakes_.logSink.lines().empty());
}

TEST_F(TempStoreTest, RemovingAFileThatDoesNotExistIsNoError) {
    std::vector<std::optional<Error>> answers;
    ready()._srRemoveFile(URL::file(store_.pathFor("none.mp4")),
                          [&](std::optional<Error> error) { answers.push_back(error); });
    settle();
    ASSERT_EQ(answers.size(), 1u);
    EXPECT_FALSE(answers[0]);
    EXPECT_TRUE(fakes_.logSink.lines().empty());
}

TEST_F(TempStoreTest, AFileThatTheDiskDoesNotAnswerForIsRemovedAllTheSame) {
    const std::string path = (ready(), addFile("a.mp4"));
    fakes_.faults.failNext("FileSystem.exists");
    fakes_.faults.failNext("FileSystem.attributes");
    store_._srRemoveFile(URL::file(path), {});
    settle();
    fakes_.faults.clear();
    EXPECT_FALSE(exists(path)) << "no answer is not the answer that nothing is there";
}

TEST_F(TempStoreTest, WhatLeavesTheDirectoryIsAnErrorAndNotNothing) {
    std::vector<std::optional<Error>> answers;
    ready()._srRemoveFile(URL::file(store_.pathFor("../a.mp4")),
                          [&](std::optional<Error> error) { answers.push_back(error); });
    store_._srRemoveFile(URL::file((addFile("b.mp4"), store_.pathFor("b.mp4/a.mp4"))),
                         [&](std::optional<Error> error) { answers.push_back(error); });
    settle();
    EXPECT_EQ(answers, (std::vector<std::optional<Error>>{fakeSystemError(EACCES), std::nullopt}));
}

TEST_F(TempStoreTest, AFailedRemovalIsLoggedAndHandedOver) {
    const std::string path = (ready(), addFile("a.mp4"));
    fakes_.faults.failNext("FileSystem.remove");
    std::vector<std::optional<Error>> answers;
    store_._srRemoveFile(URL::file(path), [&](std::optional<Error> error) { answers.push_back(error); });
    settle();
    ASSERT_EQ(answers.size(), 1u);
    EXPECT_EQ(answers[0], fakeSystemError(EIO));
    EXPECT_EQ(fakes_.logSink.lines(),
              (std::vector<FakeLogSink::Line>{{LogLevel::Default, "_lxRemoveFile error: 5"}}));
    EXPECT_TRUE(exists(path));
}

TEST_F(TempStoreTest, ARemovalNeedsNoCompletion) {
    const std::string path = (ready(), addFile("a.mp4"));
    store_._srRemoveFile(URL::file(path), {});
    settle();
    EXPECT_FALSE(exists(path));
}

TEST_F(TempStoreTest, RemovalsRunInTheOrderAsked) {
    // In any interleaving: each seed chooses who of the background tasks goes first.
    for (std::uint64_t seed = 1; seed <= 50; ++seed) {
        SimWorld world(seed);
        TempStore store(world.fakes.platform());
        std::vector<int> order;
        for (int i = 0; i < 8; ++i)
            store._srRemoveFile(URL::file(store.pathFor("a.mp4")),
                                [&order, i](std::optional<Error>) { order.push_back(i); });
        world.scheduler.runUntilIdle();
        EXPECT_EQ(order, (std::vector<int>{0, 1, 2, 3, 4, 5, 6, 7})) << seed;
    }
}

TEST_F(TempStoreTest, ACompletionMayAskForTheNextRemoval) {
    const std::string first = (ready(), addFile("a.mp4")), second = addFile("b.mp4");
    bool done = false;
    store_._srRemoveFile(URL::file(first), [&](std::optional<Error>) {
        store_._srRemoveFile(URL::file(second), [&](std::optional<Error>) { done = true; });
    });
    settle();
    EXPECT_TRUE(done);
    EXPECT_FALSE(exists(second));
    store_._srRemoveFile(URL::file(first), [&](std::optional<Error>) { done = false; });
    settle();
    EXPECT_FALSE(done) << "a queue that ran empty takes work again";
}

TEST_F(TempStoreTest, ARemovalOutlivesItsStore) {
    SimWorld world(1);
    auto store = std::make_unique<TempStore>(world.fakes.platform());
    store->_srSetupTempDirectory();
    const std::string path = store->pathFor("a.mp4");
    world.fakes.fileSystem.addFile(path, 10);
    store->_srRemoveFile(URL::file(path), {});
    store.reset();
    world.scheduler.runUntilIdle();
    EXPECT_FALSE(world.fakes.fileSystem.exists(path));
}

TEST_F(TempStoreTest, AWritersRemovalLeavesTheFileOfALaterWriter) {
    const std::string path = (ready(), addFile("a.mp4"));
    const std::uint64_t older = store_.claimPath(path), later = store_.claimPath(path);
    EXPECT_GT(later, older);
    int answers = 0;
    store_.removeFileOfClaim(URL::file(path), older, [&](std::optional<Error> error) { answers += error ? 100 : 1; });
    settle();
    EXPECT_TRUE(exists(path));
    EXPECT_EQ(answers, 1) << "a removal that is skipped is answered without an error";
    store_.removeFileOfClaim(URL::file(path), later, [&](std::optional<Error> error) { answers += error ? 100 : 1; });
    settle();
    EXPECT_FALSE(exists(path));
    EXPECT_EQ(answers, 2);
}

TEST_F(TempStoreTest, WhatCountsIsTheClaimWhenItIsTheRemovalsTurn) {
    const std::string path = (ready(), addFile("a.mp4"));
    const std::uint64_t older = store_.claimPath(path);
    store_.removeFileOfClaim(URL::file(path), older, {});
    (void)store_.claimPath(path);
    settle();
    EXPECT_TRUE(exists(path));
}

TEST_F(TempStoreTest, ALaterWriterThatHasGoneWhenItIsTheRemovalsTurnLeavesItsFile) {
    const std::string path = (ready(), addFile("a.mp4"));
    const std::uint64_t older = store_.claimPath(path);
    auto holdOlder = store_.holdClaim(path, older), holdLater = store_.holdClaim(path, store_.claimPath(path));
    store_.removeFileOfClaim(URL::file(path), older, {});
    holdOlder.reset();
    holdLater.reset();
    settle();
    EXPECT_TRUE(exists(path));
    EXPECT_EQ(store_.claimedPathCount(), 0u) << "forgotten once nobody can ask any more";
}

TEST_F(TempStoreTest, AClaimOnAnotherPathChangesNothing) {
    const std::string path = (ready(), addFile("a.mp4"));
    const std::uint64_t claim = store_.claimPath(path);
    (void)store_.claimPath(store_.pathFor("b.mp4"));
    store_.removeFileOfClaim(URL::file(path), claim, {});
    settle();
    EXPECT_FALSE(exists(path));
}

TEST_F(TempStoreTest, AnOrdinaryRemovalKnowsNoClaims) {
    const std::string path = (ready(), addFile("a.mp4"));
    (void)store_.claimPath(path);
    store_._srRemoveFile(URL::file(path), {});
    settle();
    EXPECT_FALSE(exists(path));
}

TEST_F(TempStoreTest, AClaimGoesWithItsHolder) {
    const std::string path = (ready(), addFile("a.mp4"));
    const std::uint64_t older = store_.claimPath(path), later = store_.claimPath(path);
    auto holdOlder = store_.holdClaim(path, older), holdLater = store_.holdClaim(path, later);
    holdLater.reset();
    EXPECT_EQ(store_.claimedPathCount(), 1u);
    store_.removeFileOfClaim(URL::file(path), older, {});
    settle();
    EXPECT_TRUE(exists(path)) << "somebody is left who could take the later one's file for its own";
    holdOlder.reset();
    EXPECT_EQ(store_.claimedPathCount(), 0u);
    EXPECT_EQ(store_.lastClaim(), later);
    EXPECT_GT(store_.claimPath(path), later) << "numbers are never given out again";
}

TEST_F(TempStoreTest, ARememberedPathKeepsItsClaimsWhenTheirHoldersHaveGone) {
    const std::string path = (ready(), addFile("a.mp4"));
    const std::uint64_t older = store_.claimPath(path);
    auto remembered = store_.rememberClaims(path), twice = store_.rememberClaims(path);
    store_.holdClaim(path, older).reset();
    EXPECT_FALSE(store_.isClaimedAfter(path, older));
    store_.holdClaim(path, store_.claimPath(path)).reset();
    EXPECT_TRUE(store_.isClaimedAfter(path, older));
    twice.reset();
    EXPECT_TRUE(store_.isClaimedAfter(path, older));
    remembered.reset();
    EXPECT_EQ(store_.claimedPathCount(), 0u);
}

TEST_F(TempStoreTest, OneHoldersEndLeavesTheOtherPathsAndClaimsAlone) {
    const std::string a = store_.pathFor("a.mp4"), b = store_.pathFor("b.mp4");
    const std::uint64_t claimA = store_.claimPath(a), claimB = store_.claimPath(b), laterA = store_.claimPath(a);
    store_.holdClaim(a, claimA).reset();
    store_.holdClaim(b, claimB).reset();
    EXPECT_EQ(store_.claimedPathCount(), 1u);
    store_.holdClaim(a, laterA).reset();
    EXPECT_EQ(store_.claimedPathCount(), 0u);
}

TEST_F(TempStoreTest, AHoldOutlivesItsStore) {
    SimWorld world(1);
    auto store = std::make_unique<TempStore>(world.fakes.platform());
    auto hold = store->holdClaim("a", store->claimPath("a"));
    const std::weak_ptr<void> watched = hold;
    store.reset();
    EXPECT_FALSE(watched.expired()) << "a hold is its holder's";
    // What its end touches outlives the store: for the builds with sanitizers to see.
    hold.reset();
    EXPECT_TRUE(watched.expired());
}

TEST_F(TempStoreTest, ExactlyOneHundredMillionBytesAreNotEnough) {
    ready();
    fakes_.fileSystem.setFreeSize(100'000'000);
    EXPECT_EQ(store_._srDeviceFreeDiskSpace(), 100'000'000u);
    EXPECT_FALSE(store_._srDeviceHasSufficientFreeSpaceForRecording());
    fakes_.fileSystem.setFreeSize(100'000'001);
    EXPECT_TRUE(store_._srDeviceHasSufficientFreeSpaceForRecording());
}

TEST_F(TempStoreTest, UnreadableSpaceCountsAsNone) {
    ready();
    fakes_.faults.failNext("FileSystem.freeSize", 2);
    EXPECT_EQ(store_._srDeviceFreeDiskSpace(), 0u);
    EXPECT_FALSE(store_._srDeviceHasSufficientFreeSpaceForRecording());
    EXPECT_TRUE(store_._srDeviceHasSufficientFreeSpaceForRecording());
}

}  // namespace
}  // namespace lumacast
