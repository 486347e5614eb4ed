#include "tests/checkers/tests/Child.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <utility>

namespace lumacast::checkers {

using std::chrono::steady_clock;

Child::Child(const std::vector<std::string>& command, const std::vector<std::string>& environment,
             const std::string& errorFile) {
    std::array<int, 2> in{-1, -1}, out{-1, -1};
    if (::pipe2(in.data(), O_CLOEXEC) != 0 || ::pipe2(out.data(), O_CLOEXEC) != 0) return;
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, in[0], 0);
    posix_spawn_file_actions_adddup2(&actions, out[1], 1);
    posix_spawn_file_actions_addopen(&actions, 2, errorFile.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
    std::vector<char*> arguments, variables;
    for (const std::string& word : command) arguments.push_back(const_cast<char*>(word.c_str()));
    arguments.push_back(nullptr);
    // Additions come first: the first of two equal names counts.
    for (const std::string& word : environment) variables.push_back(const_cast<char*>(word.c_str()));
    for (char** word = environ; *word != nullptr; ++word) variables.push_back(*word);
    variables.push_back(nullptr);
    // A test that ignores broken pipes doesn't hand that on.
    posix_spawnattr_t attributes;
    posix_spawnattr_init(&attributes);
    sigset_t defaults;
    sigemptyset(&defaults);
    sigaddset(&defaults, SIGPIPE);
    posix_spawnattr_setsigdefault(&attributes, &defaults);
    posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGDEF);
    if (::posix_spawnp(&pid_, arguments[0], &actions, &attributes, arguments.data(), variables.data()) != 0) pid_ = -1;
    posix_spawnattr_destroy(&attributes);
    posix_spawn_file_actions_destroy(&actions);
    ::close(in[0]);
    ::close(out[1]);
    input_ = in[1];
    output_ = out[0];
}

Child::~Child() {
    if (pid_ > 0) ::kill(pid_, SIGTERM);
    wait();
    if (input_ >= 0) ::close(input_);
    if (output_ >= 0) ::close(output_);
}

void Child::send(const std::string& line) {
    const std::string text = line + "\n";
    (void)!::write(input_, text.data(), text.size());
}

bool Child::fill(steady_clock::time_point until) {
    for (;;) {
        const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(until - steady_clock::now()).count();
        pollfd waiting{output_, POLLIN, 0};
        const int ready = left > 0 ? ::poll(&waiting, 1, static_cast<int>(left)) : 0;
        if (ready < 0 && errno == EINTR) continue;
        if (ready <= 0) return false;
        std::array<char, 4096> bytes{};
        const ssize_t count = ::read(output_, bytes.data(), bytes.size());
        if (count > 0) pending_.append(bytes.data(), static_cast<std::size_t>(count));
        return count > 0;
    }
}

std::string Child::readLine(std::chrono::seconds limit) {
    const auto until = steady_clock::now() + limit;
    for (;;) {
        const auto end = pending_.find('\n');
        if (end != std::string::npos) {
            const std::string line = pending_.substr(0, end);
            pending_.erase(0, end + 1);
            return line;
        }
        if (!fill(until)) return "";
    }
}

std::string Child::ask(const std::string& line) {
    send(line);
    return readLine();
}

std::string Child::readAll() {
    const auto until = steady_clock::now() + std::chrono::seconds(60);
    while (fill(until)) {
    }
    return std::exchange(pending_, {});
}

int Child::wait() {
    if (pid_ <= 0) return -1;
    int status = 0;
    while (::waitpid(pid_, &status, 0) < 0 && errno == EINTR) {
    }
    pid_ = -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

}  // namespace lumacast::checkers
