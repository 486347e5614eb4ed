#pragma once
// A display server of the test's own.

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <memory>
#include <string>
#include <vector>

#include "linux/ipc/Fd.h"

namespace lumacast::test {

/// A program that the test starts and ends.
class ChildProcess final {
public:
    /// `inherited` is passed on with the same number; `environment` is added to the test's own ("NAME=value").
    explicit ChildProcess(std::vector<std::string> command, int inherited = -1,
                          const std::vector<std::string>& environment = {}) {
        std::vector<char*> arguments, variables;
        for (std::string& word : command) arguments.push_back(word.data());
        arguments.push_back(nullptr);
        std::vector<std::string> added = environment;
        for (std::string& variable : added) variables.push_back(variable.data());
        for (char** variable = environ; *variable != nullptr; ++variable) variables.push_back(*variable);
        variables.push_back(nullptr);
        posix_spawn_file_actions_t actions;
        posix_spawn_file_actions_init(&actions);
        // Onto itself: that takes away close-on-exec.
        if (inherited >= 0) posix_spawn_file_actions_adddup2(&actions, inherited, inherited);
        posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
        if (::posix_spawnp(&pid_, arguments[0], &actions, nullptr, arguments.data(), variables.data()) != 0) pid_ = -1;
        posix_spawn_file_actions_destroy(&actions);
    }
    ~ChildProcess() {
        send(SIGCONT);
        end(SIGTERM);
    }
    ChildProcess(const ChildProcess&) = delete;
    ChildProcess& operator=(const ChildProcess&) = delete;

    pid_t pid() const { return pid_; }
    void send(int signal) const {
        if (pid_ > 0) ::kill(pid_, signal);
    }
    bool ended() const {
        siginfo_t info{};
        return ::waitid(P_PID, static_cast<id_t>(pid_), &info, WEXITED | WNOHANG | WNOWAIT) != 0 || info.si_pid != 0;
    }
    /// Ends it, if it hasn't ended, and waits for that.
    void end(int signal = SIGKILL) {
        if (pid_ <= 0) return;
        ::kill(pid_, signal);
        ::waitpid(pid_, nullptr, 0);
        pid_ = -1;
    }

private:
    pid_t pid_ = -1;
};

/// A headless display server without a window manager. It has gone when this has.
class PrivateDisplay final {
public:
    /// `name` (":7") when it must be that one.
    explicit PrivateDisplay(const std::string& size = "2200x1300x24", const std::string& name = {},
                            const std::vector<std::string>& options = {}) {
        int ends[2] = {-1, -1};
        if (::pipe2(ends, O_CLOEXEC) != 0) return;
        const Fd read(ends[0]);
        Fd write(ends[1]);
        std::vector<std::string> command{"Xvfb"};
        if (!name.empty()) command.push_back(name);
        for (const std::string& word : {std::string("-displayfd"), std::to_string(write.get()), std::string("-screen"),
                                        std::string("0"), size, std::string("-noreset"), std::string("-nolisten"),
                                        std::string("tcp")})
            command.push_back(word);
        command.insert(command.end(), options.begin(), options.end());
        server_ = std::make_unique<ChildProcess>(command, write.get());
        write.reset();
        char digit = 0;
        std::string number;
        while (::read(read.get(), &digit, 1) == 1 && digit != '\n') number += digit;
        if (!number.empty()) name_ = ":" + number;
    }

    /// A name that nobody else is given while this process runs: for a server that is to be followed by another one of
    /// the same name.
    static std::string nameOfOnesOwn() { return ":" + std::to_string(1000 + ::getpid() % 30000); }

    /// As in $DISPLAY; empty when the server did not start.
    const std::string& name() const { return name_; }
    void hang() const { server_->send(SIGSTOP); }
    void goOn() const { server_->send(SIGCONT); }
    void kill() const { server_->end(SIGTERM); }
    /// At once, without closing its windows first.
    void crash() const { server_->end(SIGKILL); }
    pid_t pid() const { return server_->pid(); }

private:
    std::unique_ptr<ChildProcess> server_;
    std::string name_;
};

}  // namespace lumacast::test
