// Recording the display with the tool: what it shows, and where the movie goes.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cstdlib>
#include <filesystem>

#include "client/lumacastctl/ExitStatus.h"
#include "client/lumacastctl/record/RecordCommand.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/contract/Skip.h"
#include "tests/unit/lumacastctl/ToolFixture.h"

namespace lumacast::ctl {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;

DaemonStatus statusOf(const std::string& sessions) {
    const auto status = readStatus(R"({"sessions":[)" + sessions + "]}");
    EXPECT_TRUE(std::holds_alternative<DaemonStatus>(status));
    const auto* daemon = std::get_if<DaemonStatus>(&status);
    return daemon ? *daemon : DaemonStatus{};
}

TEST(RecordLine, TheDisplaysRecordingIsFoundAmongTheOthers) {
    const std::string application = R"({"bundleID":"a","recording":true,"current":{"elapsedSeconds":1}})";
    const std::string idle = R"({"bundleID":"b","recording":false,"wholeDisplay":true})";
    EXPECT_FALSE(displayRecording(statusOf(application + "," + idle)));
    const auto found = displayRecording(statusOf(
        application + R"(,{"bundleID":"b","recording":true,"wholeDisplay":true,"current":{"elapsedSeconds":2.5}})"));
    ASSERT_TRUE(found);
    EXPECT_EQ(found->elapsedSeconds, 2.5);
}

TEST(RecordLine, SaysHowLongHowLargeAndHowManyFrames) {
    RunningRecording recording;
    EXPECT_EQ(recordLine(recording), "0:00.0");
    recording.elapsedSeconds = 65;
    recording.bytes = 1'240'000;
    recording.frames = 200;
    EXPECT_EQ(recordLine(recording), "1:05.0   1.2 MB   200 frames");
    recording.recorded = 190;
    recording.dropped = 3;
    EXPECT_EQ(recordLine(recording), "1:05.0   1.2 MB   190 frames (3 dropped)");
}

class MoveMovie : public ::testing::Test {
protected:
    ScratchDirectory scratch_;
    const std::string movie_ = scratch_.write("movie.mp4", "the movie");
};

TEST_F(MoveMovie, GoesWhereItIsWanted) {
    const std::string target = scratch_.path("a film.mp4");
    EXPECT_EQ(moveMovie(movie_, target), std::nullopt);
    EXPECT_FALSE(fs::exists(movie_));
    EXPECT_EQ(fs::file_size(target), 9u);
}

TEST_F(MoveMovie, OnAnotherFileSystemItIsCopiedAndTheFirstOneGoes) {
    const fs::path shared = "/dev/shm";
    struct stat here {}, there {};
    ASSERT_EQ(::stat(scratch_.path().c_str(), &here), 0);
    ASSERT_EQ(::stat(shared.c_str(), &there), 0);
    ASSERT_NE(here.st_dev, there.st_dev) << "there is no second file system to try it on";
    const fs::path target = shared / ("lumacastctl-test-" + std::to_string(::getpid()));
    EXPECT_EQ(moveMovie(movie_, target), std::nullopt);
    EXPECT_FALSE(fs::exists(movie_));
    EXPECT_EQ(fs::file_size(target), 9u);
    // Nor does it copy over what is there.
    const std::string other = scratch_.write("other.mp4", "another one");
    EXPECT_TRUE(moveMovie(other, target));
    EXPECT_EQ(fs::file_size(target), 9u);
    EXPECT_TRUE(fs::exists(other));
    fs::remove(target);
}

// Without its name a copy is gone after a power cut, and the first one may be gone by then, too. The system tells the order.
TEST_F(MoveMovie, ACopyHasItsNameOnTheDiskBeforeTheFirstOneGoes) {
    if (std::system("strace -f -o /dev/null true 2>/dev/null") != 0) LC_SKIP("this machine lets no process be traced");
    const std::string trace = scratch_.path("trace.txt"), self = fs::read_symlink("/proc/self/exe").string();
    const std::string command = "ASAN_OPTIONS=detect_leaks=0 strace -f -y -o '" + trace + "' -e trace=fsync,unlink,unlinkat '" + self +
                                "' --gtest_filter=MoveMovie.OnAnotherFileSystemItIsCopiedAndTheFirstOneGoes > '" +
                                scratch_.path("traced.log") + "' 2>&1";
    ASSERT_EQ(std::system(command.c_str()), 0) << ScratchDirectory::read(scratch_.path("traced.log"));
    const std::string calls = ScratchDirectory::read(trace);
    const auto bytes = calls.find("/dev/shm/lumacastctl-test-"), removal = calls.find("/movie.mp4\"");
    const auto name = calls.find("</dev/shm>");
    ASSERT_NE(bytes, std::string::npos) << calls;
    ASSERT_NE(removal, std::string::npos) << calls;
    EXPECT_LT(bytes, name) << calls;
    EXPECT_LT(name, removal) << calls;
}

TEST_F(MoveMovie, NeverReplacesAnything) {
    const std::string target = scratch_.write("kept.mp4", "kept");
    EXPECT_TRUE(moveMovie(movie_, target));
    EXPECT_TRUE(fs::exists(movie_));
    EXPECT_EQ(fs::file_size(target), 4u);
}

TEST_F(MoveMovie, StaysWhereItIsWhenItCantGo) {
    EXPECT_TRUE(moveMovie(movie_, scratch_.path("no such folder/film.mp4")));
    EXPECT_TRUE(fs::exists(movie_));
}

class Record : public Tool {
protected:
    /// What recording says, with nobody to record.
    std::string complaintsOf(const std::string& output) {
        std::FILE* const complaints = std::fopen(scratch_.path("complaints").c_str(), "w");
        EXPECT_EQ(recordDisplay(runtimeDirectory(), {.size = {640, 360}, .output = output}, Screen::Plain, stdout,
                                complaints, [](std::chrono::milliseconds) { return false; },
                                [](const std::string&) { return 0; }),
                  kNotRecorded);
        std::fclose(complaints);
        return ScratchDirectory::read(scratch_.path("complaints"));
    }
};

TEST_F(Record, WithoutADaemonItSaysThatNothingIsRecorded) {
    const std::string complaints = complaintsOf(scratch_.path("film.mp4"));
    EXPECT_THAT(complaints, HasSubstr("the display is not recorded: "));
    EXPECT_FALSE(fs::exists(scratch_.path("film.mp4")));
}

TEST_F(Record, AFileThatIsThereIsNotRecordedOver) {
    EXPECT_THAT(complaintsOf(scratch_.write("film.mp4", "kept")), HasSubstr("film.mp4 is there already"));
}

TEST_F(Record, AFolderThatIsNotThereIsSaidBefore) {
    EXPECT_THAT(complaintsOf(scratch_.path("nowhere/film.mp4")), HasSubstr("nowhere is no folder"));
}

TEST_F(Record, WithoutADisplayItSaysWhoKnowsMore) {
    const Outcome outcome = run({"record", "--display"});
    EXPECT_EQ(outcome.status, kNotRecorded);
    EXPECT_THAT(outcome.complaints, HasSubstr("lumacastctl doctor"));
}

TEST_F(Record, WhatToRecordMustBeSaid) {
    EXPECT_EQ(run({"record"}).status, 2);
    EXPECT_EQ(run({"record", "--display", "--duration", "0"}).status, 2);
    EXPECT_EQ(run({"record", "--display", "--duration", "soon"}).status, 2);
}

}  // namespace
}  // namespace lumacast::ctl
