// lumacastctl status --watch: a block a second until somebody ends it, or the daemon ends.

#include <signal.h>
#include <stdlib.h>

#include <atomic>
#include <memory>
#include <thread>

#include "client/lumacastctl/status/Status.h"
#include "client/lumacastctl/status/StatusCommand.h"
#include "tests/unit/lumacastctl/FindingMatchers.h"
#include "tests/unit/lumacastctl/Snapshots.h"
#include "tests/unit/lumacastctl/StandInDaemon.h"
#include "tests/unit/lumacastctl/ToolFixture.h"

namespace lumacast::ctl {
namespace {

using ::testing::HasSubstr;
using ::testing::Not;

constexpr char kBlock[] =
    "APPLICATION         STATE      ELAPSED     SIZE  RECORDED  DROPPED\n"
    "org.example.Player  recording   1:02.5  12.3 MB      1874        6\n";

std::size_t count(const std::string& text, const std::string& part) {
    std::size_t times = 0;
    for (auto at = text.find(part); at != std::string::npos; at = text.find(part, at + part.size())) ++times;
    return times;
}

class Watch : public Tool {
protected:
    using Clock = std::chrono::steady_clock;
};

TEST_F(Watch, WritesABlockASecondAndEndsWithStatusZeroByControlC) {
    std::atomic<int> asked{0};
    const StandInDaemon daemon(runtimeDirectory(), [&] {
        ++asked;
        return snapshotOfARecording();
    });
    const auto begun = Clock::now();
    const pid_t tool = start({"status", "--watch"});
    ASSERT_TRUE(waitUntil([&] { return count(output(), kBlock) >= 3; })) << output();
    EXPECT_GE(Clock::now() - begun, std::chrono::milliseconds(1900)) << "faster than one a second";
    ::kill(tool, SIGINT);
    const Outcome result = finish(tool);
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.complaints, "");
    EXPECT_EQ(result.out.find('\033'), std::string::npos) << "no escape codes where there is no terminal";
    const std::size_t blocks = count(result.out, kBlock);
    std::string expected;
    for (std::size_t i = 0; i < blocks; ++i) expected += std::string(kBlock) + "\n";
    EXPECT_EQ(result.out, expected) << "whole blocks and nothing else";
    EXPECT_GE(static_cast<std::size_t>(asked.load()), blocks) << "each block is asked for anew";
}

TEST_F(Watch, EndsWithStatusZeroBySigterm) {
    const StandInDaemon daemon(runtimeDirectory(), emptySnapshot);
    const pid_t tool = start({"status", "--watch"});
    ASSERT_TRUE(waitUntil([&] { return !output().empty(); }));
    ::kill(tool, SIGTERM);
    const Outcome result = finish(tool);
    EXPECT_EQ(result.status, 0);
    EXPECT_THAT(result.out, HasSubstr("Nothing is being recorded.\n\n"));
}

TEST_F(Watch, EndsWithStatusOneWhenTheDaemonGoes) {
    auto daemon = std::make_unique<StandInDaemon>(runtimeDirectory(), snapshotOfARecording);
    const pid_t tool = start({"status", "--watch"});
    ASSERT_TRUE(waitUntil([&] { return count(output(), kBlock) >= 1; }));
    daemon.reset();
    const Outcome result = finish(tool);
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.complaints, HasSubstr("the daemon isn't running"));
}

TEST_F(Watch, EndsWithStatusOneWhereThereIsNoDaemon) {
    const Outcome result = run({"status", "--watch"});
    EXPECT_EQ(result.status, 1);
    EXPECT_EQ(result.out, "");
}

TEST_F(Watch, EndsWithStatusOneWhenItsOutputCannotBeWritten) {
    const StandInDaemon daemon(runtimeDirectory(), snapshotOfARecording);
    const Outcome result = run({"status", "--watch"}, "/dev/full");
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.complaints, HasSubstr("the output could not be written"));
}

TEST_F(Watch, WritesALineOfJsonASecondWhenAsked) {
    const StandInDaemon daemon(runtimeDirectory(), snapshotOfARecording);
    const pid_t tool = start({"status", "--watch", "--json"});
    const std::string line = jsonText(snapshotOfARecording()) + "\n";
    ASSERT_TRUE(waitUntil([&] { return count(output(), line) >= 2; })) << output();
    ::kill(tool, SIGINT);
    const Outcome result = finish(tool);
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.out.size() % line.size(), 0u);
}

TEST_F(Watch, ShowsTheNewestBlockAloneOnATerminal) {
    const StandInDaemon daemon(runtimeDirectory(), snapshotOfARecording);
    const Fd terminal(::posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC));
    ASSERT_TRUE(terminal);
    ASSERT_EQ(::grantpt(terminal.get()), 0);
    ASSERT_EQ(::unlockpt(terminal.get()), 0);
    const pid_t tool = start({"status", "--watch"}, ::ptsname(terminal.get()));
    std::string shown;
    ASSERT_TRUE(waitUntil([&] {
        pollfd wait{terminal.get(), POLLIN, 0};
        if (::poll(&wait, 1, 5) != 1) return false;
        std::array<char, 4096> bytes{};
        const ssize_t got = ::read(terminal.get(), bytes.data(), bytes.size());
        if (got > 0) shown.append(bytes.data(), static_cast<std::size_t>(got));
        return count(shown, "Player") >= 2;
    })) << shown;
    ::kill(tool, SIGINT);
    EXPECT_EQ(finish(tool, false).status, 0);
    EXPECT_TRUE(shown.starts_with("\033[H\033[JAPPLICATION ")) << shown;
    EXPECT_EQ(count(shown, "\033"), 2 * count(shown, "APPLICATION"));
}

TEST_F(Watch, GoesOnWhileTheDaemonIsBusy) {
    const StandInDaemon daemon(runtimeDirectory(), emptySnapshot, StandInDaemon::Lane::Hangs);
    int rounds = 0;
    const std::string file = scratch_.path("blocks");
    std::FILE* out = std::fopen(file.c_str(), "w");
    ASSERT_TRUE(out);
    EXPECT_EQ(watchStatus(runtimeDirectory(), Form::Text, Screen::Plain, out, stderr, [&] { return ++rounds < 3; }), 0);
    std::fclose(out);
    EXPECT_EQ(count(ScratchDirectory::read(file), "No status: the daemon is busy"), 3u);
}

TEST(RecordingsTable, HasALineForEachRunningRecording) {
    DaemonStatus status;
    EXPECT_EQ(recordingsTable(status), "Nothing is being recorded.\n");
    ApplicationSession idle;
    idle.application = "org.example.Tea";
    ApplicationSession paused = idle, bare = idle;
    paused.application = "evil\033[2J";
    RunningRecording known;
    known.paused = true;
    known.elapsedSeconds = 3725;
    known.bytes = 5;
    known.recorded = 7;
    known.dropped = 0;
    paused.recording = known;
    bare.recording = RunningRecording();
    status.sessions = {idle, paused, bare};
    EXPECT_EQ(recordingsTable(status),
              "APPLICATION      STATE        ELAPSED     SIZE  RECORDED  DROPPED\n"
              "evil?[2J         paused     1:02:05.0  5 bytes         7        0\n"
              "org.example.Tea  recording     0:00.0        -         -        -\n");
}

}  // namespace
}  // namespace lumacast::ctl
