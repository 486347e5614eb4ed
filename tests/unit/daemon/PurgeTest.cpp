// Giving storage back: the four callbacks, and the administrator's commands about the temporary movies.

#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {
namespace {

constexpr char kPurgeLine[] = "LCRecordingManager: cache delete purge callback";
constexpr char kStopLine[] = "LCRecordingManager: stopRecordingSession:handler:";
constexpr char kReportLine[] = "LCRecordingManager:recordingSessionStoppedWithError:movieURL:";
constexpr char kDeleteAllLine[] = "_srDeleteFilesOlderThanTimeToLiveInSeconds: 0";
constexpr char kDeleteOldLine[] = "_srDeleteFilesOlderThanTimeToLiveInSeconds: 86400";
constexpr std::int64_t kInsufficientStorage = -5805;

class PurgeTest : public DaemonWorld {
protected:
    struct Purge {
        bool answered = false;
        std::optional<PurgeRecord> record;
    };
    /// A purge that may not have ended yet.
    std::shared_ptr<Purge> begin(std::int32_t urgency) {
        auto purge = std::make_shared<Purge>();
        fakes_.storagePurge.requestPurge(urgency, [purge](std::optional<PurgeRecord> record) {
            purge->answered = true;
            purge->record = record;
        });
        return purge;
    }
    std::optional<PurgeRecord> purge(std::int32_t urgency) {
        const auto purge = begin(urgency);
        settle();
        EXPECT_TRUE(purge->answered);
        return purge->record;
    }
    /// A purge that has ended; `between` has run on the request lane after its first look at the sessions.
    std::shared_ptr<Purge> beginWithTaskBetweenTheLooks(std::int32_t urgency, Task between) {
        SerialQueue& lane = world_.scheduler.mainQueue();
        const auto goOn = world_.scheduler.semaphore(0);
        lane.async([&goOn] { goOn->wait(); });
        auto purge = begin(urgency);
        settle();  // the first look stands behind the task that waits
        lane.async(std::move(between));
        goOn->signal();
        settle();
        EXPECT_TRUE(purge->answered);
        return purge;
    }
    /// A file that was last modified so many seconds ago.
    std::string addFile(const std::string& name, double age, std::uint64_t size = 10) {
        const std::string path = process_->tempStore().pathFor(name);
        fakes_.fileSystem.addFile(path, size, Date{fakes_.clock.now().secondsSince1970 - age});
        return path;
    }
    bool exists(const std::string& path) { return fakes_.fileSystem.exists(path); }
    /// Where in the log the text stands for the first time; fails when it does not.
    std::ptrdiff_t placeOf(std::string_view text) {
        const Lines lines = fakes_.logSink.logged();
        const auto found = std::find(lines.begin(), lines.end(), text);
        EXPECT_NE(found, lines.end()) << text;
        return found - lines.begin();
    }
    Dictionary command(const std::string& line) {
        Dictionary result;
        EXPECT_TRUE(fakes_.admin.command(line, [&](Dictionary answer) { result = std::move(answer); })) << line;
        settle();
        return result;
    }
};

TEST_F(PurgeTest, TheServiceIsRegisteredUnderItsName) {
    EXPECT_EQ(fakes_.storagePurge.service(), "com.orvane.lumacastd-cache-delete");
    const StoragePurgeCallbacks callbacks = fakes_.storagePurge.callbacks();
    EXPECT_TRUE(callbacks.purgeableSpace && callbacks.purge && callbacks.cancelPurge && callbacks.periodic);
}

TEST_F(PurgeTest, ThePurgeCallbackHoldsTheManager) {
    const auto weak = process_->manager().weak_from_this();
    auto purge = fakes_.storagePurge.callbacks().purge;
    fakes_.storagePurge.registerCallbacks("another", {});
    process_.reset();
    settle();
    EXPECT_FALSE(weak.expired());
    purge = {};
    EXPECT_TRUE(weak.expired());
}

TEST_F(PurgeTest, ThePurgeableSpaceIsTheDirectoryEntrysOwnSize) {
    addFile("a.mp4", 0, 123'456);
    fakes_.logSink.clear();
    std::optional<PurgeRecord> record;
    fakes_.storagePurge.requestPurgeableSpace([&](std::optional<PurgeRecord> answer) { record = answer; });
    settle();
    EXPECT_EQ(record, PurgeRecord{4096});
    EXPECT_EQ(fakes_.logSink.logged(), Lines{"LCRecordingManager: cache delete purgeable space callback"});
}

TEST_F(PurgeTest, ACancelledPurgeAnswersItsArgumentAndLogsNothing) {
    fakes_.logSink.clear();
    for (const std::int32_t urgency : {0, 3, -7})
        EXPECT_EQ(fakes_.storagePurge.callbacks().cancelPurge(urgency), urgency);
    EXPECT_EQ(fakes_.logSink.logged(), Lines{});
}

TEST_F(PurgeTest, BelowUrgencyThreeNothingGoesWhileARecordingRuns) {
    const auto client = makeRecording();
    const std::string old = addFile("old.mp4", 1'000'000);
    EXPECT_EQ(purge(2), std::nullopt);
    EXPECT_TRUE(exists(old));
    EXPECT_TRUE(exists(pathOf("Player")));
    EXPECT_TRUE(session(*client)->isRecording());
    EXPECT_TRUE(client->told.empty());
    EXPECT_EQ(fakes_.logSink.logged(), Lines{kPurgeLine});
}

TEST_F(PurgeTest, BelowUrgencyThreeNothingGoesWithoutARecordingEither) {
    const auto client = makeConnected();
    const std::string old = addFile("old.mp4", 1'000'000);
    fakes_.logSink.clear();
    for (const std::int32_t urgency : {2, 1, 0, -1}) EXPECT_EQ(purge(urgency), std::nullopt);
    EXPECT_TRUE(exists(old));
    EXPECT_EQ(fakes_.logSink.logged(), Lines(4, kPurgeLine));
}

TEST_F(PurgeTest, BelowUrgencyThreeOldFilesGoOnlyWhenTheRecordingEndsBetweenTheTwoLooks) {
    const auto client = makeRecording();
    const std::string old = addFile("old.mp4", 86401), young = addFile("young.mp4", 86400);
    const auto purge =
        beginWithTaskBetweenTheLooks(2, [recorded = session(*client)] { recorded->setRecording(false); });
    EXPECT_EQ(purge->record, PurgeRecord{10});
    EXPECT_FALSE(exists(old));
    EXPECT_TRUE(exists(young)) << "exactly a day old";
    EXPECT_EQ(fakes_.logSink.logged(), (Lines{kPurgeLine, kDeleteOldLine, "deleting old file"}));
    session(*client)->setRecording(true);
    const std::string again = addFile("old.mp4", 86401);
    EXPECT_EQ(beginWithTaskBetweenTheLooks(2, [] {})->record, std::nullopt);
    EXPECT_TRUE(exists(again));
}

TEST_F(PurgeTest, UrgencyThreeStopsTheRecordingTellsItsClientAndDeletesEverything) {
    for (const std::int32_t urgency : {3, 4}) {
        const auto client = makeRecording();
        const std::string young = addFile("young.mp4", 0, 1000);
        const auto record = purge(urgency);
        ASSERT_TRUE(record);
        EXPECT_TRUE(fakes_.fileSystem.files().empty());
        EXPECT_FALSE(session(*client)->isRecording());
        EXPECT_EQ(client->toldOfStop(kInsufficientStorage), 1);
        EXPECT_EQ(client->told.size(), 1u);
        EXPECT_EQ(fakes_.keepAlive.open(), 0);
        EXPECT_LT(placeOf(kPurgeLine), placeOf(kStopLine));
        EXPECT_LT(placeOf(kStopLine), placeOf("recording stopped without handler!"));
        EXPECT_LT(placeOf("recording stopped without handler!"), placeOf(kReportLine));
        EXPECT_LT(placeOf(kReportLine), placeOf(kDeleteAllLine));
        EXPECT_EQ(logged("LCRecordingManager:resetStatesForSession:"), 1u);
        client->die();
        settle();
    }
}

TEST_F(PurgeTest, UrgencyThreeAnswersTheBytesThatAreGone) {
    addFile("old.mp4", 1'000'000, 1000);
    addFile("young.mp4", 0, 234);
    fakes_.logSink.clear();
    EXPECT_EQ(purge(3), PurgeRecord{1234});
    EXPECT_EQ(fakes_.logSink.logged(), (Lines{kPurgeLine, kDeleteAllLine, "deleting old file", "deleting old file"}));
    EXPECT_EQ(purge(3), PurgeRecord{0}) << "a record, though of nothing";
}

TEST_F(PurgeTest, UrgencyThreeDoesNotWaitForTheStopToComplete) {
    const auto client = makeRecording();
    const auto goOn = world_.scheduler.semaphore(0);
    // The stop's removal of the movie stands behind one that does not end.
    process_->tempStore()._srRemoveFile(URL::file(pathOf("Player")), [&](std::optional<Error>) { goOn->wait(); });
    settle();
    addFile("Player.mp4", 0);
    const auto purge = begin(3);
    settle();
    EXPECT_TRUE(purge->answered);
    EXPECT_TRUE(fakes_.fileSystem.files().empty());
    EXPECT_EQ(client->toldOfStop(kInsufficientStorage), 1);
    goOn->signal();
    settle();
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
}

TEST_F(PurgeTest, OnlyTheLastRecordingOfTheRegistryIsStopped) {
    const auto first = makeConnected("First", 600, 60);
    const auto player = makeRecording();
    const auto last = makeConnected("Last", 700, 70);
    session(*first)->setRecording(true);
    (void)purge(3);
    EXPECT_EQ(first->told.size() + last->told.size(), 0u);
    EXPECT_EQ(player->toldOfStop(kInsufficientStorage), 1) << "the idle one behind it does not count";
    EXPECT_TRUE(session(*first)->isRecording());
    session(*last)->setRecording(true);
    (void)purge(3);
    EXPECT_TRUE(session(*first)->isRecording());
    EXPECT_EQ(last->toldOfStop(kInsufficientStorage), 1);
    EXPECT_EQ(player->told.size(), 1u);
}

TEST_F(PurgeTest, ARecordingThatEndsBetweenTheLooksIsNotStoppedAgain) {
    const auto client = makeRecording();
    const auto purge =
        beginWithTaskBetweenTheLooks(3, [recorded = session(*client)] { recorded->setRecording(false); });
    EXPECT_EQ(logged(kStopLine), 0u);
    EXPECT_TRUE(client->told.empty());
    EXPECT_TRUE(fakes_.fileSystem.files().empty());
}

TEST_F(PurgeTest, APurgeThatWaitsForTheDiskHoldsNobodyUpAndSparesWhatIsBegunMeanwhile) {
    const auto client = makeRecording();
    addFile("old.mp4", 1'000'000);
    const auto goOn = world_.scheduler.semaphore(0);
    bool hangs = false;
    fakes_.fileSystem.setDisk([&](const std::string& path) {
        if (path != process_->tempStore()._srTempPath()) return;
        hangs = true;
        goOn->wait();
    });
    const auto purge = begin(3);
    settle();
    ASSERT_TRUE(hangs);
    EXPECT_FALSE(purge->answered);
    EXPECT_EQ(client->toldOfStop(kInsufficientStorage), 1);
    const auto start = client->start();
    settle();
    EXPECT_EQ(start->answers, 1) << "requests are served all the while";
    EXPECT_EQ(start->code(), 0);
    goOn->signal();
    settle();
    EXPECT_TRUE(purge->answered);
    EXPECT_FALSE(exists(process_->tempStore().pathFor("old.mp4")));
    EXPECT_TRUE(exists(pathOf("Player"))) << "this recording began after the purge had stopped the other one";
    EXPECT_TRUE(session(*client)->isRecording());
}

TEST_F(PurgeTest, ThePeriodicCallbackAgesFilesAlsoWhileARecordingRuns) {
    const auto client = makeRecording();
    const std::string old = addFile("old.mp4", 86400.5, 77), young = addFile("young.mp4", 86400, 1);
    std::optional<PurgeRecord> record;
    fakes_.storagePurge.passDay([&](std::optional<PurgeRecord> answer) { record = answer; });
    settle();
    EXPECT_EQ(record, PurgeRecord{77});
    EXPECT_FALSE(exists(old));
    EXPECT_TRUE(exists(young));
    EXPECT_TRUE(exists(pathOf("Player")));
    EXPECT_TRUE(session(*client)->isRecording());
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"LCRecordingManager: cache delete periodic callback", kDeleteOldLine, "deleting old file"}));
}

TEST_F(PurgeTest, RecordingsLeaveNoClaimsBehind) {
    for (int i = 0; i < 5; ++i) {
        const auto client = makeRecording("Player" + std::to_string(i), 500 + i, 7 + static_cast<std::uint32_t>(i));
        EXPECT_EQ(process_->tempStore().claimedPathCount(), 1u);
        (void)client->ask(DaemonMessage::StopRecording);
        settle();
        client->die();
        settle();
    }
    EXPECT_EQ(process_->tempStore().claimedPathCount(), 0u);
}

TEST_F(PurgeTest, TheAdministratorSeesTheMovies) {
    const auto client = makeRecording();
    addFile("old.mp4", 3600, 5000);
    addFile("tomorrow.mp4", -3600, 1);
    fakes_.fileSystem.setFreeSize(7'000'000);
    const Dictionary report = command("storage");
    EXPECT_EQ(*report.find("temporaryDirectory"), Value("/private/var/mobile/Library/Lumacast/"));
    EXPECT_EQ(*report.find("freeBytes"), Value(std::uint64_t{7'000'000}));
    EXPECT_EQ(*report.find("purgeableBytes"), Value(std::uint64_t{4096}));
    const Array files = *report.find("files")->as<Array>();
    ASSERT_EQ(files.size(), 3u);
    std::vector<std::string> names;
    std::uint64_t bytes = 0;
    for (const Value& file : files) {
        const Dictionary& entry = *file.as<Dictionary>();
        names.push_back(*entry.find("name")->as<std::string>());
        bytes += *entry.find("bytes")->as<std::uint64_t>();
        EXPECT_EQ(*entry.find("recording"), Value(names.back() == "Player.mp4")) << names.back();
    }
    EXPECT_EQ(names, (std::vector<std::string>{"tomorrow.mp4", "Player.mp4", "old.mp4"})) << "the newest first";
    EXPECT_EQ(*report.find("filesBytes"), Value(bytes));
    EXPECT_EQ(*files[2].as<Dictionary>()->find("bytes"), Value(std::uint64_t{5000}));
    EXPECT_EQ(*files[2].as<Dictionary>()->find("modified"), Value(Date{fakes_.clock.now().secondsSince1970 - 3600}));
    EXPECT_EQ(report.find("error"), nullptr);
    (void)client->ask(DaemonMessage::StopRecording);
    settle();
    const Dictionary later = command("storage");
    ASSERT_EQ(later.find("files")->as<Array>()->size(), 3u);
    for (const Value& file : *later.find("files")->as<Array>())
        EXPECT_EQ(*file.as<Dictionary>()->find("recording"), Value(false)) << "nothing is being recorded any more";
}

TEST_F(PurgeTest, TheAdministratorIsToldWhatCannotBeRead) {
    addFile("a.mp4", 0);
    fakes_.faults.failNext("FileSystem.attributes", 2);  // the directory's and the file's
    const Dictionary report = command("storage");
    const Array files = *report.find("files")->as<Array>();
    ASSERT_EQ(files.size(), 1u);
    EXPECT_EQ(files[0], Value(Dictionary{{"name", "a.mp4"}, {"recording", false}}));
    EXPECT_EQ(*report.find("filesBytes"), Value(std::uint64_t{0}));
    fakes_.faults.failNext("FileSystem.list");
    const Dictionary failed = command("storage");
    ASSERT_NE(failed.find("error"), nullptr);
    EXPECT_TRUE(failed.find("error")->as<std::string>()->starts_with("the directory can't be listed: "));
}

TEST_F(PurgeTest, TheAdministratorPurgesByUrgency) {
    const auto client = makeRecording();
    addFile("old.mp4", 1'000'000, 5000);
    EXPECT_EQ(Value(command("purge 2")), Value(Dictionary{{"urgency", 2}, {"freedBytes", Value()}}));
    EXPECT_TRUE(session(*client)->isRecording());
    const Dictionary answer = command("purge 3");
    EXPECT_EQ(*answer.find("urgency"), Value(3));
    EXPECT_NE(answer.find("freedBytes")->as<std::uint64_t>(), nullptr);
    EXPECT_FALSE(session(*client)->isRecording());
    EXPECT_TRUE(fakes_.fileSystem.files().empty());
}

TEST_F(PurgeTest, APurgeWithoutAnUrgencyIsRefused) {
    const std::string path = addFile("a.mp4", 0);
    for (const char* line : {"purge", "purge 0", "purge -3", "purge 3 4", "purge 3x", "purge x", "purge 99999999999",
                             "purge +3", "purge 3.5"}) {
        const Dictionary answer = command(line);
        EXPECT_EQ(Value(answer), Value(Dictionary{{"error", "a purge takes one urgency, a whole number from 1 on"}}))
            << line;
    }
    EXPECT_TRUE(exists(path));
}

}  // namespace
}  // namespace lumacast
