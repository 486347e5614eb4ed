#pragma once
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <string>

#include "base/Identifiers.h"

namespace lumacast {

/// Puts a real program, one that waits until it is ended, at `path`. Answers the path.
inline std::string installExecutable(const std::string& path) {
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    std::filesystem::copy_file("/usr/bin/sleep", path);
    return path;
}

/// A process of a program made by installExecutable, ended with the object.
class RunningProgram final {
public:
    explicit RunningProgram(const std::string& path) {
        char name[] = "program";
        char seconds[] = "1000000";
        char* arguments[] = {name, seconds, nullptr};
        char* environment[] = {nullptr};
        // posix_spawn returns when the new process runs the program, or could not.
        if (::posix_spawn(&pid_, path.c_str(), nullptr, nullptr, arguments, environment) != 0) pid_ = 0;
    }
    ~RunningProgram() {
        if (pid_ <= 0) return;
        ::kill(pid_, SIGKILL);
        ::waitpid(pid_, nullptr, 0);
    }
    RunningProgram(const RunningProgram&) = delete;
    RunningProgram& operator=(const RunningProgram&) = delete;

    ProcessID pid() const { return ProcessID(pid_); }

private:
    pid_t pid_ = 0;
};

}  // namespace lumacast
