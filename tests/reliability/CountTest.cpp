// No call that changes a disk or writes to a peer goes past the place where it can be made to fail: the system, asked by strace,
// counts as many as the notes do.

#include <gtest/gtest.h>
#include <signal.h>

#include <cstdlib>
#include <fstream>
#include <map>
#include <regex>
#include <set>

#include "tests/contract/Skip.h"
#include "tests/reliability/Scenario.h"

namespace lumacast::test {
namespace {

/// The system's names of the calls, and what the notes call them.
const std::map<std::string, std::string> kNames{
    {"openat", "open"},          {"openat2", "open"},      {"open", "open"},          {"creat", "open"},
    {"pwrite64", "writeAt"},     {"write", "write"},       {"writev", "write"},       {"pwritev", "writeAt"},
    {"fsync", "sync"},           {"fdatasync", "syncData"}, {"ftruncate", "truncate"}, {"truncate", "truncate"},
    {"rename", "rename"},        {"renameat", "rename"},   {"renameat2", "rename"},   {"link", "link"},
    {"linkat", "link"},          {"unlink", "unlinkAt"},   {"unlinkat", "unlinkAt"},  {"rmdir", "unlinkAt"},
    {"mkdir", "makeDirectoryAt"}, {"mkdirat", "makeDirectoryAt"}, {"statfs", "statFileSystem"}, {"fstatfs", "statFileSystem"},
    {"fallocate", "reserve"},    {"copy_file_range", "copyRange"}, {"sendfile", "copyRange"}, {"splice", "copyRange"},
    {"sync_file_range", "startWriteBack"}, {"sendmsg", "sendMessage"}, {"sendmmsg", "sendMessage"}, {"sendto", "sendMessage"}};

using Counts = std::map<std::string, std::size_t>;

/// Which of the traced threads are the daemon's own, not those of the processes that it has started. Told each line in turn.
class OwnThreads {
public:
    explicit OwnThreads(long daemon) : own_{daemon} {}
    bool has(long thread) const { return own_.contains(thread); }
    void look(const std::string& line) {
        static const std::regex begun(R"(^(\d+) +clone3?\((.*)$)"), resumed(R"(^(\d+) +<\.\.\. clone3? resumed>(.*)$)");
        static const std::regex answer(R"(= (\d+)(<[^>]*>)?$)");
        std::smatch parts;
        const bool isBegun = std::regex_match(line, parts, begun);
        if (!isBegun && !std::regex_match(line, parts, resumed)) return;
        const long parent = std::stol(parts[1]);
        if (isBegun) makesThread_[parent] = parts[2].str().find("CLONE_THREAD") != std::string::npos;
        const std::string rest = parts[2];
        std::smatch made;
        if (has(parent) && makesThread_[parent] && std::regex_search(rest, made, answer)) own_.insert(std::stol(made[1]));
    }

private:
    std::set<long> own_;
    std::map<long, bool> makesThread_;
};

/// What the system has seen of the daemon: what it did to files in the test's own folder and sent to its clients. strace says after
/// each descriptor what it is.
Counts countOfSystem(const std::string& trace, const std::string& folder, long daemon) {
    Counts counts;
    OwnThreads own(daemon);
    std::ifstream file(trace);
    const std::regex call(R"(^(\d+) +([a-z0-9_]+)\((.*)$)");
    for (std::string line; std::getline(file, line);) {
        own.look(line);
        std::smatch parts;
        if (!std::regex_match(line, parts, call) || !own.has(std::stol(parts[1]))) continue;  // a signal, an end, or the second half of a call
        const auto name = kNames.find(parts[2]);
        if (name == kNames.end()) continue;
        const std::string rest = parts[3];
        const auto mentions = [&](const std::string& text) { return rest.find(text) != std::string::npos; };
        if (name->second == "sendMessage") {
            if (mentions("com.orvane.lumacastd")) ++counts["sendMessage"];
        } else if (name->second == "makeDirectoryAt") {
            if (mentions("Lumacast\", ")) ++counts["makeDirectoryAt"];  // the others are made at the start
        } else if (!mentions(folder) || mentions(folder + "faults/") || mentions(folder + "daemon.log") ||
                   mentions(folder + "run/")) {
            // Somebody else's, the notes themselves, the log, or the sockets' places.
        } else if (name->second != "open") {
            ++counts[name->second];
        } else if (mentions("O_CREAT") || mentions("O_TMPFILE")) {
            ++counts["openToMake"];
        }
    }
    return counts;
}

/// The same of the notes. Opening what is there changes nothing; a channel to an extension has no name by which the system's list
/// could be told from any other socket.
Counts countOfNotes(const std::vector<NotedCall>& calls) {
    Counts counts;
    for (const NotedCall& each : calls)
        if (each.call != "open" && each.call != "clone" && each.target != "memory" && each.target != "channel" &&
            (each.call != "makeDirectoryAt" || each.target == "Lumacast"))
            ++counts[each.call == "renameToNew" ? "rename" : each.call];
    return counts;
}

class Count : public ::testing::TestWithParam<std::unique_ptr<Scenario> (*)()> {};

TEST_P(Count, OfTheNotesIsThatOfTheSystem) {
    if (std::system("strace -f --seccomp-bpf -o /dev/null true 2>/dev/null") != 0)
        LC_SKIP("this machine lets no process be traced");
    const auto scenario = GetParam()();
    auto& world = scenario->world();
    const std::string trace = world.path("trace.txt");
    std::string names = "clone,clone3,";
    for (const auto& [name, ours] : kNames) names += name + ",";
    names.pop_back();
    scenario->startTraced(trace, names);
    Heard heard;
    // A disk that is watched so closely may not say within 40 ms how much room it has; then one asks again.
    for (int i = 0; i < 40 && heard.stop != "ok"; ++i) heard = scenario->record();
    EXPECT_EQ(heard.stop, "ok") << heard.start;
    const pid_t daemon = world.daemon().pid();
    // What follows the answer (a clip or a saved movie is removed) is not to be under way when the daemon ends: begun, and not
    // noted yet.
    (void)waitUntil(
        [&] {
            return scenario->isSettled() &&
                   countOfNotes(scenario->calls()) == countOfSystem(trace, world.path(""), daemon);
        },
        std::chrono::seconds(30));
    EXPECT_EQ(world.endDaemon(SIGTERM), 0);
    const std::regex end("^" + std::to_string(daemon) + R"( +\+\+\+ exited.*$)");  // padded to the width of larger numbers
    EXPECT_TRUE(waitUntil([&] {
        std::ifstream file(trace);
        for (std::string line; std::getline(file, line);)
            if (std::regex_match(line, end)) return true;
        return false;
    })) << "the system's list has no end";
    const Counts noted = countOfNotes(scenario->calls()), seen = countOfSystem(trace, world.path(""), daemon);
    EXPECT_EQ(noted, seen);
    EXPECT_TRUE(noted.contains("writeAt") && noted.at("writeAt") > 5) << "no movie was written";
    std::string text;
    for (const auto& [name, count] : seen) text += " " + name + " " + std::to_string(count);
    std::printf("    %s:%s\n", scenario->name().c_str(), text.c_str());
}

INSTANTIATE_TEST_SUITE_P(OfEachKindOfMovie, Count,
                         ::testing::Values(&plainMovie, &trimmedMovie, &clipMovies, &displayMovie, &mixedMovie));

}  // namespace
}  // namespace lumacast::test
