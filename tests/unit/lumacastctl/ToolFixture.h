#pragma once
// The tool as it is built, in an environment of the test's own.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <functional>
#include <string>
#include <vector>

#include "tests/contract/ScratchDirectory.h"

namespace lumacast::ctl {

inline constexpr char kTool[] = LC_BINARY_DIR "/bin/lumacastctl";

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

    Outcome run(const std::vector<std::string>& arguments, const std::string& output = {}) {
        return finish(start(arguments, output), output.empty());
    }

    /// Starts it, with its output and its complaints into files (or devices, when they are named).
    pid_t start(std::vector<std::string> arguments, const std::string& output = {}, const std::string& device = {}) {
        const std::string out = output.empty() ? scratch_.path("out") : output;
        const std::string complaints = device.empty() ? scratch_.path("complaints") : device;
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
        EXPECT_EQ(error, 0);
        return error == 0 ? pid : -1;
    }
    /// Waits for its end.
    Outcome finish(pid_t pid, bool isFile = true) {
        Outcome result;
        int status = 0;
        if (pid <= 0 || ::waitpid(pid, &status, 0) != pid) return result;
        if (WIFEXITED(status)) result.status = WEXITSTATUS(status);
        if (isFile) result.out = output();
        result.complaints = ScratchDirectory::read(scratch_.path("complaints"));
        return result;
    }
    /// What it has written up to now.
    std::string output() const { return ScratchDirectory::read(scratch_.path("out")); }
    static bool waitUntil(const std::function<bool()>& condition) {
        const auto until = std::chrono::steady_clock::now() + std::chrono::seconds(30);
        while (!condition()) {
            if (std::chrono::steady_clock::now() > until) return false;
            ::poll(nullptr, 0, 5);
        }
        return true;
    }

    ScratchDirectory scratch_;
    std::vector<std::string> environment_;
};

}  // namespace lumacast::ctl
