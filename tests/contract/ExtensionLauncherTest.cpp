// The program that confines itself and becomes the extension, by itself.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <filesystem>
#include <string>
#include <vector>

#include "linux/ipc/Fd.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast {
namespace {

namespace fs = std::filesystem;

/// An ordinary user whose processes nobody else's test counts.
constexpr uid_t kOrdinaryUser = 61'001;

class ExtensionLauncherTest : public ::testing::Test {
protected:
    /// Where an ordinary user can run them.
    ExtensionLauncherTest() : launcher_(scratch_.path("launcher")), program_(scratch_.path("program")) {
        fs::copy_file(LC_EXTENSION_LAUNCHER, launcher_);
        fs::copy_file(LC_EXTENSION_PROBE, program_);
        for (const std::string& path : {scratch_.path(), launcher_, program_}) fs::permissions(path, fs::perms(0755));
    }
    struct Ended {
        int status = -1;  ///< -1: by a signal
        std::string printed;
    };
    /// Runs it as an ordinary user, with `connection` as descriptor 3 when there is one, and ends all it has started.
    Ended run(const std::vector<std::string>& options, const std::vector<std::string>& program, int connection = -1) {
        std::vector<std::string> words{launcher_};
        words.insert(words.end(), options.begin(), options.end());
        words.push_back("--");
        words.insert(words.end(), program.begin(), program.end());
        std::vector<char*> pointers;
        for (std::string& word : words) pointers.push_back(word.data());
        pointers.push_back(nullptr);
        int ends[2] = {-1, -1};
        if (::pipe2(ends, O_CLOEXEC) != 0) return {};
        const Fd output(ends[0]);
        Fd theirs(ends[1]);
        const pid_t child = ::fork();
        if (child == 0) {
            ::setsid();
            ::dup2(theirs.get(), STDOUT_FILENO);
            if (connection >= 0 && connection != 3) ::dup2(connection, 3);
            if (connection == 3) ::fcntl(3, F_SETFD, 0);
            if (::geteuid() == 0 && ::setresuid(kOrdinaryUser, kOrdinaryUser, kOrdinaryUser) != 0) ::_exit(1);
            ::execv(pointers[0], pointers.data());
            ::_exit(1);
        }
        theirs.reset();
        if (child <= 1) return {};
        int status = 0;
        siginfo_t info{};
        ::waitid(P_PID, static_cast<id_t>(child), &info, WEXITED | WNOWAIT);
        ::kill(-child, SIGKILL);
        ::waitpid(child, &status, 0);
        Ended ended{WIFEXITED(status) ? WEXITSTATUS(status) : -1, {}};
        std::array<char, 256> some{};
        for (ssize_t count = 0; (count = ::read(output.get(), some.data(), some.size())) > 0;)
            ended.printed.append(some.data(), static_cast<std::size_t>(count));
        return ended;
    }

    const ScratchDirectory scratch_;
    const std::string launcher_, program_;
};

TEST_F(ExtensionLauncherTest, AProgramIsNotBegunWhenTheDaemonHasGoneMeanwhile) {
    int ends[2] = {-1, -1};
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
    Fd ours(ends[0]);
    const Fd theirs(ends[1]);
    EXPECT_EQ(run({"--connected", "3"}, {"/bin/true"}, theirs.get()).status, 0);
    ours.reset();
    EXPECT_EQ(run({"--connected", "3"}, {"/bin/true"}, theirs.get()).status, 125);
}

TEST_F(ExtensionLauncherTest, AProgramWithoutItsParentIsNotBegun) {
    EXPECT_EQ(run({"--parent", std::to_string(::getpid())}, {"/bin/true"}).status, 0);
    EXPECT_EQ(run({"--parent", std::to_string(::getppid())}, {"/bin/true"}).status, 125);
}

TEST_F(ExtensionLauncherTest, ItsProcessesAreLimitedToWhatItIsTold) {
    const std::string made = run({"--limit", "processes=40"}, {program_, "--forks"}).printed;
    ASSERT_FALSE(made.empty());
    // The user's other processes count too, where it isn't this test's own user.
    if (::geteuid() == 0)
        EXPECT_EQ(made, "39\n") << "and itself";
    else
        EXPECT_LE(std::stoi(made), 39);
}

TEST_F(ExtensionLauncherTest, WhatItDoesNotUnderstandOrCantDoIsNoReasonToRunUnconfined) {
    for (const std::vector<std::string>& options : {std::vector<std::string>{"--unknown"},
                                                    {"--limit", "processes"},
                                                    {"--limit", "unknown=5"},
                                                    {"--limit", "processes=-1"},
                                                    {"--calls", "none"},
                                                    {"--parent", "x"},
                                                    {"--read"}})
        EXPECT_EQ(run(options, {"/bin/true"}).status, 125) << options.front();
}

}  // namespace
}  // namespace lumacast
