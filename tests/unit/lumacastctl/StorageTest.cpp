#include "client/lumacastctl/storage/Storage.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <time.h>

#include "client/lumacastctl/ExitStatus.h"
#include "client/lumacastctl/Fields.h"
#include "client/lumacastctl/Text.h"
#include "client/lumacastctl/storage/StorageCommand.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/unit/lumacastctl/Snapshots.h"
#include "tests/unit/lumacastctl/StandInDaemon.h"

namespace lumacast::ctl {
namespace {

Dictionary storageAnswer() {
    return {{"temporaryDirectory", "/root/private/var/mobile/Library/Lumacast/"},
            {"freeBytes", std::uint64_t{81'600'000'000}},
            {"purgeableBytes", std::uint64_t{4096}},
            {"filesBytes", std::uint64_t{12'345'778}},
            {"files", Array{Dictionary{{"name", "Player.mp4"},
                                       {"bytes", std::uint64_t{12'345'678}},
                                       {"modified", 1'700'000'000.5},
                                       {"recording", true}},
                            Dictionary{{"name", "A long name.mp4"},
                                       {"bytes", std::uint64_t{100}},
                                       {"modified", 1'600'000'000.0},
                                       {"recording", false}},
                            Dictionary{{"name", "gone.mp4"}, {"recording", false}}}}};
}

constexpr double kNow = 1'700'000'060.0;

/// Dates are local time.
class Storage : public ::testing::Test {
protected:
    Storage() {
        ::setenv("TZ", "UTC-2", 1);  // two hours east
        ::tzset();
    }
    ~Storage() override {
        ::unsetenv("TZ");
        ::tzset();
    }
    static StorageReport read(const Dictionary& answer) {
        const auto result = readStorage(jsonText(answer));
        const auto* report = std::get_if<StorageReport>(&result);
        EXPECT_TRUE(report) << std::get<std::string>(result);
        return report ? *report : StorageReport();
    }
};

TEST_F(Storage, TheMoviesAreListedForPeople) {
    EXPECT_EQ(filesText(read(storageAnswer()), kNow),
              "Player.mp4       12.3 MB    2023-11-15 00:13:20  59 s       being recorded\n"
              "A long name.mp4  100 bytes  2020-09-13 14:26:40  1157 days\n"
              "gone.mp4         unknown    unknown\n");
    Dictionary answer = storageAnswer();
    answer.set("files", Array());
    EXPECT_EQ(filesText(read(answer), kNow), "There are no temporary movies.\n");
}

TEST_F(Storage, WhatTheFilesAreIsListedForPeople) {
    const Dictionary movies{
        {"movies", Array{Dictionary{{"name", "Player.mp4"}, {"state", "unfinished"}, {"beingWritten", true}},
                         Dictionary{{"name", "A long name.mp4"}, {"state", "recovered"}, {"seconds", 83.25}},
                         Dictionary{{"name", "not listed.mp4"}, {"state", "finished"}}}}};
    const auto merged = readStorage(withMovies(jsonText(storageAnswer()), jsonText(movies)));
    EXPECT_EQ(filesText(std::get<StorageReport>(merged), 1'600'000'000.0 + 7300),
              "Player.mp4       12.3 MB    2023-11-15 00:13:20  0 s          being recorded\n"
              "A long name.mp4  100 bytes  2020-09-13 14:26:40  2 h  1:23.2  recovered: the recording was cut off\n"
              "gone.mp4         unknown    unknown\n");
    const auto textOf = [](const char* state, bool isBeingWritten) {
        const Dictionary one{
            {"movies", Array{Dictionary{{"name", "a"}, {"state", state}, {"beingWritten", isBeingWritten}}}}};
        const auto read = readStorage(withMovies(R"({"files": [{"name": "a"}]})", jsonText(one)));
        return filesText(std::get<StorageReport>(read), 0);
    };
    EXPECT_EQ(textOf("finished", false), "a  unknown  unknown  finished\n");
    EXPECT_EQ(textOf("unfinished", false), "a  unknown  unknown  unfinished: the recording was cut off\n");
    EXPECT_EQ(textOf("unfinishedCopy", false), "a  unknown  unknown  unfinished copy\n");
    EXPECT_EQ(textOf("unfinishedCopy", true), "a  unknown  unknown  being written\n");
    EXPECT_EQ(textOf("other", false), "a  unknown  unknown  not a movie\n");
    EXPECT_EQ(textOf("something new", false), "a  unknown  unknown\n");
}

TEST_F(Storage, WhatADaemonSaysNothingOfStaysAsItIs) {
    const std::string storage = jsonText(storageAnswer());
    for (const char* movies : {"", "{", R"({"error": "unknown request"})", R"({"movies": 3})", R"({"movies": [3, {}]})"})
        EXPECT_EQ(withMovies(storage, movies), storage) << movies;
    EXPECT_EQ(withMovies("no JSON", R"({"movies": []})"), "no JSON");
}

TEST_F(Storage, WhatCouldBeGivenBackIsWrittenForPeople) {
    EXPECT_EQ(purgeableText(read(storageAnswer())),
              "Purgeable:  4.1 kB, the directory's own entry\n"
              "Movies:     12.3 MB in 3 files\n"
              "Free space: 81.6 GB in /root/private/var/mobile/Library/Lumacast/\n");
    EXPECT_EQ(purgeableText(read({{"files", Array{Dictionary{{"name", "a"}}}}})),
              "Purgeable:  unknown\n"
              "Movies:     0 bytes in 1 file\n"
              "Free space: unknown, or none\n");
}

TEST_F(Storage, NamesHaveNoControlCharacters) {
    const std::string text = filesText(
        read({{"files", Array{Dictionary{{"name", "\x1B]0;x\x07.mp4"}, {"bytes", std::uint64_t{1}}}}}}), kNow);
    EXPECT_EQ(text, "?]0;x?.mp4  1 byte  unknown\n");
}

TEST_F(Storage, MomentsOutOfRangeAreUnknown) {
    for (const double seconds : {1e12, -1e12, 1e300}) EXPECT_EQ(momentText(seconds), "unknown");
    EXPECT_EQ(momentText(-0.5), "1970-01-01 01:59:59");
}

TEST_F(Storage, APurgeSaysWhatItGaveBack) {
    const auto outcome = [](const Dictionary& answer) { return std::get<PurgeOutcome>(readPurge(jsonText(answer))); };
    EXPECT_EQ(purgeText(3, outcome({{"urgency", 3}, {"freedBytes", std::uint64_t{2'500'000}}})),
              "Purge at urgency 3: 2.5 MB given back.\n");
    EXPECT_EQ(purgeText(3, outcome({{"urgency", 3}, {"freedBytes", std::uint64_t{0}}})),
              "Purge at urgency 3: 0 bytes given back.\n");
    EXPECT_EQ(purgeText(2, outcome({{"urgency", 2}, {"freedBytes", Value()}})),
              "Purge at urgency 2: nothing was to be given back. Below urgency 3 files go only when a recording has "
              "just ended.\n");
}

TEST_F(Storage, AnswersThatAreNoneAreNotUnderstood) {
    const auto why = [](const auto& result) { return std::get<std::string>(result); };
    for (const char* answer : {"", "[]", "{}", R"({"files": 3})", R"({"files": [3]})", R"({"files": [{"bytes": 3}]})"})
        EXPECT_EQ(why(readStorage(answer)), kNotUnderstood) << answer;
    for (const char* answer : {"", "[]", "{}", R"({"freedBytes": -1})", R"({"freedBytes": "much"})"})
        EXPECT_EQ(why(readPurge(answer)), kNotUnderstood) << answer;
    EXPECT_EQ(why(readStorage(R"({"files": [], "error": "the disk"})")), "the disk");
    EXPECT_EQ(why(readPurge(R"({"error": "no"})")), "no");
}

/// The commands' end to end, through the socket.
class StorageCommand : public Storage {
protected:
    StandInDaemon daemon() {
        return StandInDaemon(scratch_.path(), emptySnapshot, StandInDaemon::Lane::Runs,
                             {{"storage", [](const auto&, const AdminAnswer& answer) { answer(storageAnswer()); }},
                              {"purge", [](const auto& arguments, const AdminAnswer& answer) {
                                   if (arguments.at(0) == "7") return answer({{"error", "not\x1B now"}});
                                   answer({{"urgency", 2}, {"freedBytes", Value()}});
                               }}});
    }
    std::string out() const { return ScratchDirectory::read(scratch_.path("out")); }
    std::string complaints() const { return ScratchDirectory::read(scratch_.path("complaints")); }
    template <class Command>
    int run(Command command) {
        std::FILE* out = std::fopen(scratch_.path("out").c_str(), "w");
        std::FILE* complaints = std::fopen(scratch_.path("complaints").c_str(), "w");
        const int status = command(scratch_.path(), out, complaints);
        std::fclose(out);
        std::fclose(complaints);
        return status;
    }
    int show(StoragePart part, Form form) {
        return run([&](const auto& directory, auto* out, auto* complaints) {
            return showStorage(directory, part, form, out, complaints);
        });
    }
    int purge(std::int32_t urgency, Form form) {
        return run([&](const auto& directory, auto* out, auto* complaints) {
            return purgeStorage(directory, urgency, form, out, complaints);
        });
    }

    ScratchDirectory scratch_;
};

TEST_F(StorageCommand, ShowsThePartAskedFor) {
    const StandInDaemon running = daemon();
    const StorageReport report = read(storageAnswer());
    EXPECT_EQ(show(StoragePart::List, Form::Text), kGood);
    EXPECT_EQ(out().substr(0, 30), filesText(report, kNow).substr(0, 30));
    EXPECT_THAT(out(), ::testing::HasSubstr("being recorded\n"));
    EXPECT_EQ(show(StoragePart::Purgeable, Form::Text), kGood);
    EXPECT_EQ(out(), purgeableText(report));
    EXPECT_EQ(show(StoragePart::All, Form::Text), kGood);
    EXPECT_TRUE(out().starts_with("Player.mp4 ")) << out();
    EXPECT_TRUE(out().ends_with("\n\n" + purgeableText(report))) << out();
    EXPECT_EQ(complaints(), "");
}

TEST_F(StorageCommand, AnswersJsonAsTheDaemonGaveIt) {
    const StandInDaemon running = daemon();
    EXPECT_EQ(show(StoragePart::List, Form::Json), kGood);
    EXPECT_EQ(out(), jsonText(storageAnswer()) + "\n");
    EXPECT_EQ(purge(2, Form::Json), kGood);
    EXPECT_EQ(out(), "{\"urgency\":2,\"freedBytes\":null}\n");
}

TEST_F(StorageCommand, PurgesAndSaysWhyNot) {
    const StandInDaemon running = daemon();
    EXPECT_EQ(purge(2, Form::Text), kGood);
    EXPECT_EQ(out(), purgeText(2, {}));
    EXPECT_EQ(purge(7, Form::Text), kNoAnswer);
    EXPECT_EQ(out(), "");
    EXPECT_EQ(complaints(), "lumacastctl: the daemon can't do that: not? now\nTry again in a moment.\n");
    EXPECT_EQ(purge(7, Form::Json), kNoAnswer);
    EXPECT_EQ(out(), "");
}

TEST_F(StorageCommand, SaysSoWhenNoDaemonRuns) {
    EXPECT_EQ(show(StoragePart::All, Form::Text), kNoAnswer);
    EXPECT_EQ(purge(3, Form::Json), kNoAnswer);
    EXPECT_EQ(out(), "");
    EXPECT_TRUE(complaints().starts_with("lumacastctl: the daemon isn't running: ")) << complaints();
}

}  // namespace
}  // namespace lumacast::ctl
