// The tool as it is built: what it prints and its exit status.

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>

#include "linux/admin/UnixSocket.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/unit/linux_apps/RunningProgram.h"
#include "tests/unit/lumacastctl/FindingMatchers.h"
#include "tests/unit/lumacastctl/Snapshots.h"
#include "tests/unit/lumacastctl/StandInDaemon.h"

namespace lumacast::ctl {
namespace {

using ::testing::HasSubstr;
using ::testing::Not;

constexpr char kTool[] = LC_BINARY_DIR "/bin/lumacastctl";

struct Outcome {
    int status = -1;  ///< the exit status; -1 when it did not exit by itself
    std::string out, complaints;
};

/// A user's directories of the test's own, and the tool run with nothing but them in its environment.
class Tool : public ::testing::Test {
protected:
    Tool() {
        for (const char* name : {"run", "config", "data", "state"}) scratch_.makeDirectory(name);
        std::filesystem::permissions(scratch_.path("run"), std::filesystem::perms::owner_all);
        set("HOME", scratch_.path());
        set("XDG_RUNTIME_DIR", scratch_.path("run"));
        set("XDG_CONFIG_HOME", scratch_.path("config"));
        set("XDG_CONFIG_DIRS", scratch_.path("no-config"));
        set("XDG_DATA_HOME", scratch_.path("data"));
        set("XDG_DATA_DIRS", scratch_.path("no-data"));
        set("XDG_STATE_HOME", scratch_.path("state"));
        set("PATH", "/usr/bin:/bin");
    }

    void set(const std::string& name, const std::string& value) { environment_.push_back(name + "=" + value); }
    std::string runtimeDirectory() const { return scratch_.makeDirectory("run/lumacast"); }

    Outcome run(std::vector<std::string> arguments, const std::string& output = {}) {
        const std::string out = output.empty() ? scratch_.path("out") : output;
        const std::string complaints = scratch_.path("complaints");
        arguments.insert(arguments.begin(), kTool);
        std::vector<char*> words, variables;
        for (std::string& word : arguments) words.push_back(word.data());
        for (std::string& variable : environment_) variables.push_back(variable.data());
        words.push_back(nullptr);
        variables.push_back(nullptr);
        posix_spawn_file_actions_t actions;
        posix_spawn_file_actions_init(&actions);
        posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, out.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
        posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, complaints.c_str(), O_WRONLY | O_CREAT | O_TRUNC,
                                         0600);
        pid_t pid = 0;
        const int error = ::posix_spawn(&pid, kTool, &actions, nullptr, words.data(), variables.data());
        posix_spawn_file_actions_destroy(&actions);
        Outcome result;
        int status = 0;
        if (error != 0 || ::waitpid(pid, &status, 0) != pid) return result;
        if (WIFEXITED(status)) result.status = WEXITSTATUS(status);
        if (output.empty()) result.out = ScratchDirectory::read(out);
        result.complaints = ScratchDirectory::read(complaints);
        return result;
    }

    ScratchDirectory scratch_;
    std::vector<std::string> environment_;
};

TEST_F(Tool, ShowsTheStatusOfARunningDaemon) {
    const StandInDaemon daemon(runtimeDirectory(), snapshotOfARecording);
    const Outcome result = run({"status"});
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.complaints, "");
    EXPECT_THAT(result.out, HasSubstr("org.example.Player (pid 4711): recording\n  elapsed  1:02.5\n"));
    EXPECT_THAT(result.out, HasSubstr("Free space: 81.6 GB in /root/private/var/mobile/Library/Lumacast/\n"));
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
    const FileDescriptor listener = listenAt(runtimeDirectory() + "/admin.sock");
    ASSERT_TRUE(listener);
    const Outcome result = run({"status"});
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.complaints, HasSubstr("the daemon does not answer"));
}

TEST_F(Tool, TellsWrongUsageFromEverythingElse) {
    const std::vector<std::vector<std::string>> wrong{{},
                                                      {"nonsense"},
                                                      {"status", "more"},
                                                      {"status", "--json"},
                                                      {"status", "doctor"},
                                                      {"storage", "nonsense"},
                                                      {"storage", "list", "purgeable"},
                                                      {"storage", "list", "more"},
                                                      {"storage", "purge"},
                                                      {"storage", "purge", "0"},
                                                      {"storage", "purge", "-3"},
                                                      {"storage", "purge", "much"},
                                                      {"storage", "purge", "3", "4"},
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
    for (const std::vector<std::string>& arguments :
         {std::vector<std::string>{"--help"}, {"status", "--help"}, {"doctor", "--help"}, {"storage", "--help"},
          {"storage", "list", "--help"}, {"storage", "purgeable", "--help"}, {"storage", "purge", "--help"}}) {
        const Outcome result = run(arguments);
        EXPECT_EQ(result.status, 0);
        EXPECT_THAT(result.out, HasSubstr("Exit status:\n  0  all is well\n  1  the daemon isn't running"));
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
    EXPECT_THAT(result.out, HasSubstr("problem preferences: LCSuppressAlert is not set"));
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
