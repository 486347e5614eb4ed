// Deleting temporary files by age, all of them, and by the beginning of their names; moving; sizes and dates.

#include <gtest/gtest.h>

#include <cerrno>
#include <limits>
#include <vector>

#include "support/TempStore.h"
#include "tests/fakes/FakeError.h"
#include "tests/fakes/FakePlatform.h"

namespace lumacast {
namespace {

using Line = FakeLogSink::Line;
using Lines = std::vector<Line>;

class TempStorePurgeTest : public ::testing::Test {
protected:
    TempStorePurgeTest() {
        store_._srSetupTempDirectory();
        fakes_.logSink.clear();
    }
    ~TempStorePurgeTest() override { world_.scheduler.endWorld(); }

    /// A file last modified so many seconds ago.
    std::string addFile(const std::string& name, double age, std::uint64_t size = 10) {
        const std::string path = store_.pathFor(name);
        fakes_.fileSystem.addFile(path, size, Date{fakes_.clock.now().secondsSince1970 - age});
        return path;
    }
    bool exists(const std::string& path) { return fakes_.fileSystem.exists(path); }
    void settle() { world_.scheduler.runUntilIdle(); }
    static Line deleting(const std::string& seconds) {
        return {LogLevel::Default, "_srDeleteFilesOlderThanTimeToLiveInSeconds: " + seconds};
    }
    const Line deletingOldFile_{LogLevel::Default, "deleting old file"};
    static Line errorLine(int code) {
        return {LogLevel::Error, "error in _lxRemoveFile_srDeleteFilesOlderThanTimeToLiveInSeconds, error code: " +
                                     std::to_string(code)};
    }
    static Line errorPrint(int code) { return {LogLevel::Print, "error = " + describe(fakeSystemError(code))}; }

    SimWorld world_{1};
    FakePlatform& fakes_ = world_.fakes;
    TempStore store_{fakes_.platform()};
};

TEST_F(TempStorePurgeTest, OnlyStrictlyOlderFilesAreDeleted) {
    const std::string older = addFile("older", 100.25), exact = addFile("exact", 100), young = addFile("young", 99);
    EXPECT_EQ(store_._srDeleteFilesOlderThanTimeToLiveInSeconds(100), 10u);
    EXPECT_FALSE(exists(older));
    EXPECT_TRUE(exists(exact)) << "exactly as old as the time to live";
    EXPECT_TRUE(exists(young));
    EXPECT_EQ(fakes_.logSink.lines(), (Lines{deleting("100"), deletingOldFile_}));
}

TEST_F(TempStorePurgeTest, TheTimeToLiveIsLoggedAsAWholeNumber) {
    for (const double seconds : {86400.0, 2.75, -1.5, 1e300, -1e300})
        (void)store_._srDeleteFilesOlderThanTimeToLiveInSeconds(seconds);
    (void)store_._srDeleteFilesOlderThanTimeToLiveInSeconds(std::numeric_limits<double>::quiet_NaN());
    EXPECT_EQ(fakes_.logSink.lines(), (Lines{deleting("86400"), deleting("2"), deleting("-1"), deleting("2147483647"),
                                             deleting("-2147483647"), deleting("0")}));
}

TEST_F(TempStorePurgeTest, AgeIsCountedFromTheModificationNotTheCreation) {
    const std::string path = addFile("new but old inside", 3600);  // made now, dated back
    EXPECT_EQ(store_._srDeleteFilesOlderThanTimeToLiveInSeconds(60), 10u);
    EXPECT_FALSE(exists(path));
}

TEST_F(TempStorePurgeTest, ATimeToLiveOfZeroDeletesAllWhateverTheirAge) {
    addFile("old", 1000, 1);
    addFile("new", 0, 2);
    addFile("of tomorrow", -86400, 4);
    EXPECT_EQ(store_._srDeleteAllTempFiles(), 7u);
    EXPECT_TRUE(fakes_.fileSystem.files().empty());
    EXPECT_TRUE(exists(store_._srTempPath()));
    EXPECT_EQ(fakes_.logSink.lines(), (Lines{deleting("0"), deletingOldFile_, deletingOldFile_, deletingOldFile_}));
}

TEST_F(TempStorePurgeTest, AFileWhoseRemovalFailsIsNotCountedAndNothingIsCountedAfterIt) {
    addFile("1", 10, 1);
    const std::string stays = addFile("2", 10, 2);
    addFile("3", 10, 4);
    const std::string young = addFile("4", 0, 8);
    fakes_.fileSystem.setDisk([this](const std::string& path) {
        if (path.ends_with("2")) fakes_.faults.failNext("FileSystem.remove");
    });
    EXPECT_EQ(store_._srDeleteFilesOlderThanTimeToLiveInSeconds(5), 1u)
        << "what was removed after the failure deliberately does not count";
    EXPECT_EQ(fakes_.fileSystem.files().size(), 2u) << "one failure does not stop the others";
    EXPECT_TRUE(exists(stays));
    EXPECT_TRUE(exists(young));
    // After the removal of 2; after the attributes and the removal of 3; after the attributes of 4.
    EXPECT_EQ(fakes_.logSink.lines(), (Lines{deleting("5"), deletingOldFile_, deletingOldFile_, errorLine(EIO),
                                             errorPrint(EIO), errorLine(EIO), errorPrint(EIO), deletingOldFile_,
                                             errorLine(EIO), errorPrint(EIO), errorLine(EIO), errorPrint(EIO)}));
}

TEST_F(TempStorePurgeTest, TheErrorReportedIsTheLastOne) {
    addFile("1", 10);
    addFile("2", 10);
    fakes_.faults.failNext("FileSystem.remove");
    fakes_.fileSystem.setDisk([this](const std::string& path) {
        if (path.ends_with("1")) fakes_.faults.failNext("FileSystem.attributes");
    });
    EXPECT_EQ(store_._srDeleteFilesOlderThanTimeToLiveInSeconds(5), 0u);
    EXPECT_EQ(fakes_.logSink.lines(), (Lines{deleting("5"), deletingOldFile_, errorLine(EIO), errorPrint(EIO),
                                             errorLine(ETIMEDOUT), errorPrint(ETIMEDOUT)}));
}

TEST_F(TempStorePurgeTest, AFileWithoutReadableAttributesIsKeptUnlessAllGo) {
    const std::string path = addFile("1", 1000);
    fakes_.faults.failNext("FileSystem.attributes");
    EXPECT_EQ(store_._srDeleteFilesOlderThanTimeToLiveInSeconds(5), 0u);
    EXPECT_TRUE(exists(path));
    EXPECT_EQ(fakes_.logSink.lines(), (Lines{deleting("5"), errorLine(ETIMEDOUT), errorPrint(ETIMEDOUT)}));
    fakes_.faults.failNext("FileSystem.attributes");
    EXPECT_EQ(store_._srDeleteAllTempFiles(), 0u) << "removed, and its bytes unknown";
    EXPECT_FALSE(exists(path));
}

TEST_F(TempStorePurgeTest, AnErrorIsGoneWithItsCall) {
    addFile("1", 10);
    fakes_.faults.failNext("FileSystem.remove");
    EXPECT_EQ(store_._srDeleteAllTempFiles(), 0u);
    EXPECT_EQ(store_._srDeleteAllTempFiles(), 10u);
}

TEST_F(TempStorePurgeTest, ADirectoryThatCannotBeListedIsReportedOnce) {
    const std::string path = addFile("1", 10);
    fakes_.faults.failNext("FileSystem.list");
    EXPECT_EQ(store_._srDeleteAllTempFiles(), 0u);
    EXPECT_TRUE(exists(path));
    EXPECT_EQ(fakes_.logSink.lines(), (Lines{deleting("0"), errorLine(EIO), errorPrint(EIO)}));
}

TEST_F(TempStorePurgeTest, TheFileOfAWriterThatBeganMeanwhileIsSpared) {
    const std::string old = addFile("old", 1000), begun = addFile("begun", 1000), before = addFile("before", 1000);
    (void)store_.claimPath(before);
    const std::uint64_t mark = store_.lastClaim();
    (void)store_.claimPath(begun);
    EXPECT_EQ(store_._srDeleteAllTempFiles(mark), 20u);
    EXPECT_FALSE(exists(old));
    EXPECT_FALSE(exists(before)) << "a recording that was there before goes like everything else";
    EXPECT_TRUE(exists(begun));
    EXPECT_EQ(fakes_.logSink.lines(), (Lines{deleting("0"), deletingOldFile_, deletingOldFile_}));
    EXPECT_EQ(store_._srDeleteAllTempFiles(), 10u) << "a purge that begins now knows of no later writer";
}

TEST_F(TempStorePurgeTest, AWriterThatBeginsWhileFilesAreListedIsSparedToo) {
    const std::string path = addFile("begun", 1000);
    fakes_.fileSystem.setDisk([&](const std::string& place) {
        if (!place.ends_with("begun")) (void)store_.claimPath(path);
    });
    EXPECT_EQ(store_._srDeleteFilesOlderThanTimeToLiveInSeconds(60), 0u);
    EXPECT_TRUE(exists(path));
}

TEST_F(TempStorePurgeTest, TheSizeIsTheDirectoryEntrysOwn) {
    addFile("1", 0, 1'000'000);
    EXPECT_EQ(store_._srSizeOfTempDir(), 4096);
    std::optional<Error> error;
    EXPECT_EQ(store_._srSizeOfTempDir(&error), 4096);
    EXPECT_FALSE(error);
    fakes_.faults.failNext("FileSystem.attributes", 2);
    EXPECT_EQ(store_._srSizeOfTempDir(), 0);
    EXPECT_EQ(store_._srSizeOfTempDir(&error), 0);
    EXPECT_EQ(error, fakeSystemError(ETIMEDOUT));
    EXPECT_TRUE(fakes_.logSink.lines().empty());
}

TEST_F(TempStorePurgeTest, TheCreationDateIsTheFilesOwn) {
    const std::string path = addFile("1", 3600);
    EXPECT_EQ(store_._srGetCreationDateForFile(URL::file(path)), fakes_.clock.now());
    fakes_.faults.failNext("FileSystem.attributes");
    EXPECT_EQ(store_._srGetCreationDateForFile(URL::file(path)), std::nullopt);
    EXPECT_EQ(store_._srGetCreationDateForFile(URL::file(store_.pathFor("none"))), std::nullopt);
}

class TempStoreMoveTest : public TempStorePurgeTest {
protected:
    void move(const std::string& from, const std::string& to) {
        store_._srMoveFileFromURL(URL::file(store_.pathFor(from)), URL::file(store_.pathFor(to)),
                                  [this](std::optional<Error> error) { answers_.push_back(error); });
    }
    using Answers = std::vector<std::optional<Error>>;
    Answers answers_;
};

TEST_F(TempStoreMoveTest, AMoveReplacesWhatIsThere) {
    const std::string from = addFile("from", 0, 1), to = addFile("to", 0, 2);
    move("from", "to");
    EXPECT_TRUE(exists(from)) << "the caller is not kept waiting";
    settle();
    EXPECT_EQ(answers_, Answers{std::nullopt});
    EXPECT_FALSE(exists(from));
    EXPECT_EQ(std::get<FileAttributes>(fakes_.fileSystem.attributes(to)).size, 1u);
    EXPECT_TRUE(fakes_.logSink.lines().empty());
}

TEST_F(TempStoreMoveTest, ADirectoryInTheWayIsReplacedToo) {
    addFile("from", 0, 1);
    ASSERT_FALSE(fakes_.fileSystem.createDirectory(store_.pathFor("to")));
    move("from", "to");
    settle();
    EXPECT_EQ(answers_, Answers{std::nullopt}) << "what is there is removed first";
}

TEST_F(TempStoreMoveTest, TheErrorOfRemovingTheDestinationIsIgnored) {
    addFile("from", 0, 1);
    const std::string to = addFile("to", 0, 2);
    fakes_.faults.failNext("FileSystem.remove");
    move("from", "to");
    settle();
    EXPECT_EQ(answers_, Answers{std::nullopt});
    EXPECT_EQ(std::get<FileAttributes>(fakes_.fileSystem.attributes(to)).size, 1u);
    EXPECT_TRUE(fakes_.logSink.lines().empty());
}

TEST_F(TempStoreMoveTest, AFailedMoveIsAnErrorLineAndHandedOver) {
    addFile("from", 0, 1);
    fakes_.faults.failNext("FileSystem.move");
    move("from", "to");
    settle();
    move("none", "to");
    settle();
    EXPECT_EQ(answers_, (Answers{fakeSystemError(EIO), fakeSystemError(ENOENT)}));
    EXPECT_EQ(fakes_.logSink.lines(), (Lines{{LogLevel::Error, "_lxMoveFileFromURL error: 5"},
                                             {LogLevel::Error, "_lxMoveFileFromURL error: 2"}}));
    store_._srMoveFileFromURL(URL::file(store_.pathFor("from")), URL::file(store_.pathFor("to")), {});
    settle();
    EXPECT_TRUE(exists(store_.pathFor("to"))) << "a completion is not needed";
}

TEST_F(TempStorePurgeTest, FilesAreDeletedByTheBeginningOfTheirNames) {
    addFile("\u00C9clair 1.mp4", 0);
    addFile("eclair.mp4", 0);
    const std::string other = addFile("An eclair.mp4", 0);
    store_._srDeleteFilesWithPrefix("ECLAIR");
    EXPECT_EQ(fakes_.fileSystem.files().size(), 3u) << "the caller is not kept waiting";
    settle();
    EXPECT_TRUE(exists(other));
    EXPECT_EQ(fakes_.fileSystem.files().size(), 1u);
    EXPECT_TRUE(fakes_.logSink.lines().empty());
}

TEST_F(TempStorePurgeTest, AFailedDeletionByPrefixIsLoggedAndTheOthersGoOn) {
    addFile("a1", 0);
    addFile("a2", 0);
    fakes_.faults.failNext("FileSystem.remove");
    store_._srDeleteFilesWithPrefix("a");
    settle();
    EXPECT_EQ(fakes_.fileSystem.files().size(), 1u);
    EXPECT_EQ(fakes_.logSink.lines(), (Lines{{LogLevel::Default, "_lxDeleteFilesWithPrefix error: 5"}}));
}

TEST_F(TempStorePurgeTest, ADirectoryThatCannotBeListedHasNoPrefixes) {
    addFile("a1", 0);
    fakes_.faults.failNext("FileSystem.list");
    store_._srDeleteFilesWithPrefix("a");
    settle();
    EXPECT_EQ(fakes_.fileSystem.files().size(), 1u);
    EXPECT_TRUE(fakes_.logSink.lines().empty());
}

/// Passes on to a scheduler and counts what is given to its global queues.
class CountingScheduler final : public Scheduler {
public:
    explicit CountingScheduler(Scheduler& inner) : inner_(inner) {}
    std::shared_ptr<SerialQueue> serialQueue(std::string label) override {
        return inner_.serialQueue(std::move(label));
    }
    GlobalQueue& globalQueue(QueuePriority priority) override {
        return priority == QueuePriority::Default ? default_ : background_;
    }
    SerialQueue& mainQueue() override { return inner_.mainQueue(); }
    void runMainLoop() override { inner_.runMainLoop(); }
    std::unique_ptr<Semaphore> semaphore(int count) override { return inner_.semaphore(count); }
    std::unique_ptr<OwnerlessLock> ownerlessLock() override { return inner_.ownerlessLock(); }
    std::unique_ptr<Timer> timer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds interval,
                                 Task task) override {
        return inner_.timer(std::move(queue), interval, std::move(task));
    }
    int onDefault() const { return default_.count; }
    int onBackground() const { return background_.count; }

private:
    struct Queue final : GlobalQueue {
        explicit Queue(GlobalQueue& itsInner) : inner(itsInner) {}
        void async(Task task) override {
            ++count;
            inner.async(std::move(task));
        }
        GlobalQueue& inner;
        int count = 0;
    };
    Scheduler& inner_;
    Queue default_{inner_.globalQueue(QueuePriority::Default)};
    Queue background_{inner_.globalQueue(QueuePriority::Background)};
};

TEST(TempStorePriorities, RemovalsAreBackgroundWorkMovesAndPrefixesAreNot) {
    SimScheduler scheduler(1);
    CountingScheduler counting(scheduler);
    FakePlatform fakes(counting);
    TempStore store(fakes.platform());
    store._srSetupTempDirectory();
    const URL url = URL::file(store.pathFor("a"));
    store._srRemoveFile(url, {});
    EXPECT_EQ(counting.onBackground(), 1);
    EXPECT_EQ(counting.onDefault(), 0);
    store._srMoveFileFromURL(url, url, {});
    EXPECT_EQ(counting.onDefault(), 1);
    store._srDeleteFilesWithPrefix("a");
    EXPECT_EQ(counting.onDefault(), 2);
    EXPECT_EQ(counting.onBackground(), 1);
    scheduler.runUntilIdle();
    scheduler.endWorld();
}

}  // namespace
}  // namespace lumacast
