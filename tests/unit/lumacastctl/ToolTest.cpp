// The tool as it is built: what it prints and its exit status.

#include <atomic>

#include "client/lumacastctl/ExitStatus.h"
#include "linux/admin/UnixSocket.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/unit/linux_apps/RunningProgram.h"
#include "tests/unit/lumacastctl/FindingMatchers.h"
#include "tests/unit/lumacastctl/Snapshots.h"
#include "tests/unit/lumacastctl/StandInDaemon.h"
#include "tests/unit/lumacastctl/ToolFixture.h"

namespace lumacast::ctl {
namespace {

using ::testing::HasSubstr;
using ::testing::Not;

TEST_F(Tool, ShowsTheStatusOfARunningDaemon) {
    const StandInDaemon daemon(runtimeDirectory(), snapshotOfARecording);
    const Outcome result = run({"status"});
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.complaints, "");
    EXPECT_THAT(result.out, HasSubstr("org.example.Player (pid 4711): recording\n  elapsed  1:02.5\n"));
    EXPECT_THAT(result.out, HasSubstr("Free space: 81.6 GB in /root/private/var/mobile/Library/Lumacast/\n"));
}

TEST_F(Tool, AnswersTheStatusAsJson) {
    const StandInDaemon daemon(runtimeDirectory(), snapshotOfARecording);
    const Outcome result = run({"status", "--json"});
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.out, jsonText(snapshotOfARecording()) + "\n");
}

TEST_F(Tool, SaysWhatToDoWhenNoDaemonRuns) {
    const Outcome result = run({"status"});
    EXPECT_EQ(result.status, 1);
    EXPECT_EQ(result.out, "");
    EXPECT_THAT(result.complaints, HasSubstr("the daemon isn't running: nobody answers at " + scratch_.path("run") +
                                             "/lumacast/admin.sock"));
    EXPECT_THAT(result.complaints, HasSubstr("Start lumacastd"));
}

TEST_F(Tool, SaysSoWhenTheDaemonIsBusy) {
    const StandInDaemon daemon(runtimeDirectory(), emptySnapshot, StandInDaemon::Lane::Hangs);
    const Outcome result = run({"status"});
    EXPECT_EQ(result.status, 1);
    EXPECT_EQ(result.out, "");
    EXPECT_THAT(result.complaints, HasSubstr("no status to give: the daemon is busy"));
}

TEST_F(Tool, SaysSoWhenTheDaemonDoesNotAnswer) {
    const Fd listener = listenAt(runtimeDirectory() + "/admin.sock");
    ASSERT_TRUE(listener);
    const Outcome result = run({"status"});
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.complaints, HasSubstr("the daemon does not answer"));
}

TEST_F(Tool, TellsWrongUsageFromEverythingElse) {
    const std::vector<std::vector<std::string>> wrong{{},
                                                      {"nonsense"},
                                                      {"status", "more"},
                                                      {"status", "--jsonx"},
                                                      {"status", "--watch", "2"},
                                                      {"doctor", "--watch"},
                                                      {"status", "doctor"},
                                                      {"storage", "nonsense"},
                                                      {"storage", "list", "purgeable"},
                                                      {"storage", "list", "more"},
                                                      {"storage", "purge"},
                                                      {"storage", "purge", "0"},
                                                      {"storage", "purge", "-3"},
                                                      {"storage", "purge", "much"},
                                                      {"storage", "purge", "3", "4"},
                                                      {"save"},
                                                      {"save", "a.mp4", "b.mp4"},
                                                      {"save", "--watch", "a.mp4"},
                                                      {"usage", "more"},
                                                      {"usage", "--watch"},
                                                      {"doctor", "--pid", "0"},
                                                      {"doctor", "--pid", "-4"},
                                                      {"doctor", "--pid", "many"},
                                                      {"doctor", "--pid", "99999999999"},
                                                      {"doctor", "--pid", "1", "--exe", "/bin/true"}};
    for (const auto& arguments : wrong) {
        const Outcome result = run(arguments);
        EXPECT_EQ(result.status, 2) << ::testing::PrintToString(arguments);
        EXPECT_EQ(result.out, "") << ::testing::PrintToString(arguments);
        EXPECT_NE(result.complaints, "") << ::testing::PrintToString(arguments);
    }
}

TEST_F(Tool, DocumentsItsExitStatuses) {
    const std::string readme = ScratchDirectory::read(LC_SOURCE_DIR "/client/lumacastctl/README.md");
    for (const ExitStatusRow& row : kExitStatuses)
        EXPECT_THAT(readme, HasSubstr("| " + std::to_string(row.status) + " | " + row.meaning + " |\n"));
    for (const std::vector<std::string>& arguments :
         {std::vector<std::string>{"--help"}, {"status", "--help"}, {"doctor", "--help"}, {"storage", "--help"},
          {"save", "--help"}, {"usage", "--help"}, {"storage", "list", "--help"}, {"storage", "purgeable", "--help"},
          {"storage", "purge", "--help"}}) {
        const Outcome result = run(arguments);
        EXPECT_EQ(result.status, 0);
        EXPECT_THAT(result.out, HasSubstr(exitStatusText() + "\n"));
    }
}

TEST_F(Tool, ShowsAndPurgesTheStorage) {
    const Dictionary storage{{"filesBytes", std::uint64_t{5}},
                             {"files", Array{Dictionary{{"name", "a.mp4"}, {"bytes", std::uint64_t{5}}}}}};
    std::atomic<int> purged{0};
    const StandInDaemon daemon(
        runtimeDirectory(), emptySnapshot, StandInDaemon::Lane::Runs,
        {{"storage", [&](const auto&, const AdminAnswer& answer) { answer(storage); }},
         {"purge", [&](const std::vector<std::string>& arguments, const AdminAnswer& answer) {
              purged = std::stoi(arguments.at(0));
              answer({{"urgency", 3}, {"freedBytes", std::uint64_t{1234}}});
          }}});
    EXPECT_EQ(run({"storage", "list"}).out, "a.mp4  5 bytes  unknown\n");
    EXPECT_THAT(run({"storage", "purgeable"}).out, HasSubstr("Movies:     5 bytes in 1 file\n"));
    EXPECT_THAT(run({"storage"}).out, HasSubstr("a.mp4  5 bytes  unknown\n\nPurgeable:  unknown\n"));
    for (const auto& arguments : {std::vector<std::string>{"storage", "--json"}, {"storage", "list", "--json"},
                                  {"storage", "--json", "list"}}) {
        const Outcome result = run(arguments);
        EXPECT_EQ(result.status, 0);
        EXPECT_EQ(result.out, jsonText(storage) + "\n");
    }
    EXPECT_EQ(purged, 0);
    const Outcome result = run({"storage", "purge", "3"});
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.out, "Purge at urgency 3: 1.2 kB given back.\n");
    EXPECT_EQ(purged, 3);
    EXPECT_EQ(run({"storage", "purge", "2", "--json"}).out, "{\"urgency\":3,\"freedBytes\":1234}\n");
    EXPECT_EQ(purged, 2);
}

TEST_F(Tool, FailsWhenItsOutputCannotBeWritten) {
    const StandInDaemon daemon(runtimeDirectory(), snapshotOfARecording);
    EXPECT_EQ(run({"status"}, "/dev/full").status, 1);
}

TEST_F(Tool, FindsProblemsWhereThereIsNothing) {
    const Outcome result = run({"doctor"});
    EXPECT_EQ(result.status, 3);
    EXPECT_EQ(result.complaints, "");
    EXPECT_THAT(result.out, HasSubstr("problem display: DISPLAY is not set"));
    EXPECT_THAT(result.out, HasSubstr("ok      preferences: LCSuppressAlert is not set"));
    EXPECT_THAT(result.out, HasSubstr("problem daemon: it isn't running"));
    EXPECT_THAT(result.out, HasSubstr("ok      identity: process " + std::to_string(::getpid())));
}

TEST_F(Tool, FindsNoProblemWhereAllIsWell) {
    const test::PrivateDisplay display("320x200x24");
    const std::string program = installExecutable(scratch_.path("player"));
    const RunningProgram player(program);
    set("DISPLAY", display.name());
    scratch_.write("config/lumacast/com.orvane.lumacastd.conf", "LCSuppressAlert=true\n");
    scratch_.write("data/applications/org.example.Player.desktop",
                   "[Desktop Entry]\nType=Application\nName=Player\nExec=" + program + "\n");
    std::filesystem::create_directories(scratch_.path("data/lumacast"));
    std::filesystem::copy(LC_SOURCE_DIR "/resources/Lumacast.bundle", scratch_.path("data/lumacast/Lumacast.bundle"),
                          std::filesystem::copy_options::recursive);
    const StandInDaemon daemon(runtimeDirectory(), emptySnapshot);
    const Outcome result = run({"doctor", "--pid", std::to_string(number(player.pid()))});
    EXPECT_EQ(result.status, 0) << result.out;
    EXPECT_THAT(result.out, Not(HasSubstr("problem ")));
    EXPECT_THAT(result.out, HasSubstr(" is org.example.Player (\"Player\")"));

    // One thing less, and it says so.
    std::filesystem::remove(scratch_.path("data/applications/org.example.Player.desktop"));
    const Outcome without = run({"doctor", "--exe", program});
    EXPECT_EQ(without.status, 3);
    EXPECT_THAT(without.out, HasSubstr("problem identity: " + program + " belongs to no application"));
}

}  // namespace
}  // namespace lumacast::ctl
