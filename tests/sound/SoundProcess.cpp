#include "tests/sound/SoundProcess.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <string_view>

namespace lumacast::test {

namespace {

std::string_view nameOf(std::string_view variable) { return variable.substr(0, variable.find('=')); }

std::vector<std::string> variablesWith(const std::vector<std::string>& changes) {
    std::vector<std::string> variables;
    for (char** variable = environ; *variable != nullptr; ++variable)
        if (std::none_of(changes.begin(), changes.end(),
                         [&](const std::string& change) { return nameOf(change) == nameOf(*variable); }))
            variables.emplace_back(*variable);
    for (const std::string& change : changes)
        if (change.find('=') != std::string::npos) variables.push_back(change);
    return variables;
}

std::vector<char*> pointersTo(std::vector<std::string>& words) {
    std::vector<char*> pointers;
    for (std::string& word : words) pointers.push_back(word.data());
    pointers.push_back(nullptr);
    return pointers;
}

}  // namespace

SoundProcess::SoundProcess(std::vector<std::string> command, const std::vector<std::string>& environment) {
    int in[2] = {-1, -1}, out[2] = {-1, -1};
    if (::pipe2(in, O_CLOEXEC) != 0 || ::pipe2(out, O_CLOEXEC) != 0) return;
    const Fd theirInput(in[0]), theirOutput(out[1]);
    input_.reset(in[1]);
    output_.reset(out[0]);
    std::vector<std::string> variables = variablesWith(environment);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, theirInput.get(), STDIN_FILENO);
    posix_spawn_file_actions_adddup2(&actions, theirOutput.get(), STDOUT_FILENO);
    posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
    if (::posix_spawnp(&pid_, command.front().c_str(), &actions, nullptr, pointersTo(command).data(),
                       pointersTo(variables).data()) != 0)
        pid_ = -1;
    posix_spawn_file_actions_destroy(&actions);
}

bool SoundProcess::hasEnded() const {
    siginfo_t info{};
    return pid_ <= 0 ||
           ::waitid(P_PID, static_cast<id_t>(pid_), &info, WEXITED | WNOHANG | WNOWAIT) != 0 || info.si_pid != 0;
}

std::string SoundProcess::ownEnd() const {
    siginfo_t info{};
    if (pid_ <= 0 || ::waitid(P_PID, static_cast<id_t>(pid_), &info, WEXITED | WNOHANG | WNOWAIT) != 0 || info.si_pid == 0)
        return {};
    return (info.si_code == CLD_EXITED ? "exit " : "signal ") + std::to_string(info.si_status);
}

std::string SoundProcess::ask(const std::string& line) {
    const std::string text = line + "\n";
    if (::write(input_.get(), text.data(), text.size()) != static_cast<ssize_t>(text.size())) return {};
    return readLine();
}

std::string SoundProcess::readLine(std::chrono::milliseconds patience) {
    const auto end = std::chrono::steady_clock::now() + patience;
    while (true) {
        const std::size_t newline = pending_.find('\n');
        if (newline != std::string::npos) {
            const std::string line = pending_.substr(0, newline);
            pending_.erase(0, newline + 1);
            return line;
        }
        const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(end - std::chrono::steady_clock::now());
        pollfd polled{output_.get(), POLLIN, 0};
        if (left.count() <= 0 || ::poll(&polled, 1, static_cast<int>(left.count())) <= 0) return {};
        char buffer[256];
        const ssize_t length = ::read(output_.get(), buffer, sizeof buffer);
        if (length <= 0) return {};
        pending_.append(buffer, static_cast<std::size_t>(length));
    }
}

void SoundProcess::send(int signal) const {
    if (pid_ > 0) ::kill(pid_, signal);
}

void SoundProcess::end() {
    input_.reset();
    if (pid_ <= 0) return;
    send(SIGCONT);
    send(SIGTERM);
    const auto limit = std::chrono::steady_clock::now() + std::chrono::seconds(5);
    while (!hasEnded() && std::chrono::steady_clock::now() < limit) ::poll(nullptr, 0, 5);
    kill();
}

void SoundProcess::kill() {
    if (pid_ <= 0) return;
    send(SIGKILL);
    ::waitpid(pid_, nullptr, 0);
    pid_ = -1;
}

TonePlayer::TonePlayer(const std::string& server, const std::vector<std::string>& options)
    : process_(
          [&] {
              std::vector<std::string> command{LC_TONE_PLAYER};
              command.insert(command.end(), options.begin(), options.end());
              return command;
          }(),
          {"PULSE_SERVER=" + server, "DISPLAY"}) {
    int pid = 0;
    if (std::sscanf(process_.readLine().c_str(), "ready %d", &pid) == 1) playing_ = ProcessID{pid};
}

bool TonePlayer::tell(const std::string& command) {
    const std::string answer = process_.ask(command);
    return !answer.empty() && answer != "failed";
}

std::int64_t TonePlayer::beep(const std::string& name) {
    const std::string answer = process_.ask("beep " + name), start = "beep " + name + " ";
    long long moment = 0;
    if (!answer.starts_with(start)) return 0;
    return std::sscanf(answer.c_str() + start.size(), "%lld", &moment) == 1 ? moment : 0;
}

}  // namespace lumacast::test
