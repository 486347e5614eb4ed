#include "linux/store/ProgramOutput.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>

#include "linux/ipc/Fd.h"
#include "linux/system/WordPointers.h"

namespace lumacast {

namespace {

using Clock = std::chrono::steady_clock;

/// A child process in a group of its own, killed and reaped with this object.
class Child final {
public:
    Child(ProgramRun run, int output) {
        posix_spawn_file_actions_t actions;
        posix_spawnattr_t attributes;
        if (::posix_spawn_file_actions_init(&actions) != 0) return;
        if (::posix_spawnattr_init(&attributes) == 0) {
            sigset_t none, all;
            ::sigemptyset(&none);
            ::sigfillset(&all);
            // This process's lanes take no signals; the program is to be ended by them.
            ::posix_spawnattr_setsigmask(&attributes, &none);
            ::posix_spawnattr_setsigdefault(&attributes, &all);
            ::posix_spawnattr_setflags(&attributes,
                                       POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETPGROUP);
            ::posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
            ::posix_spawn_file_actions_adddup2(&actions, output, STDOUT_FILENO);
            ::posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
            if (::posix_spawn(&pid_, run.command.front().c_str(), &actions, &attributes, pointersTo(run.command).data(),
                              pointersTo(run.environment).data()) != 0)
                pid_ = -1;
            ::posix_spawnattr_destroy(&attributes);
        }
        ::posix_spawn_file_actions_destroy(&actions);
        if (pid_ > 0) end_.reset(static_cast<int>(::syscall(SYS_pidfd_open, pid_, 0)));
    }
    ~Child() { reap(); }
    Child(const Child&) = delete;
    Child& operator=(const Child&) = delete;

    bool isThere() const { return pid_ > 0 && end_; }
    /// Can be read when it has ended.
    int end() const { return end_.get(); }

    /// Ends it, if it hasn't ended by itself; whether it had, with status 0.
    bool reap() {
        if (pid_ <= 0) return false;
        ::kill(-pid_, SIGKILL);  // with what it has started; nobody has waited for it, so the number is its
        int status = 0;
        while (::waitpid(pid_, &status, 0) < 0 && errno == EINTR) {
        }
        pid_ = -1;
        return WIFEXITED(status) && WEXITSTATUS(status) == 0;
    }

private:
    pid_t pid_ = -1;
    Fd end_;
};

/// Waits until `descriptor` can be read; false when the time is over or `cancel` can be read first.
bool waitFor(int descriptor, int cancel, Clock::time_point deadline) {
    while (true) {
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - Clock::now()).count();
        if (left <= 0) return false;
        std::array<pollfd, 2> polled{pollfd{descriptor, POLLIN, 0}, pollfd{cancel, POLLIN, 0}};
        const int ready = ::poll(polled.data(), polled.size(), static_cast<int>(std::min<long long>(left, 60'000)));
        if (ready < 0 && errno != EINTR) return false;
        if (ready > 0) return polled[1].revents == 0;
    }
}

}  // namespace

std::optional<std::string> outputOf(const ProgramRun& run, int cancel) {
    int ends[2] = {-1, -1};
    if (run.command.empty() || ::pipe2(ends, O_CLOEXEC) != 0) return std::nullopt;
    const Fd output(ends[0]);
    Fd theirs(ends[1]);
    Child child(run, theirs.get());
    theirs.reset();
    if (!child.isThere()) return std::nullopt;
    const auto deadline = Clock::now() + run.patience;
    std::string text;
    while (waitFor(output.get(), cancel, deadline)) {
        char bytes[4096];
        const ssize_t got = ::read(output.get(), bytes, sizeof bytes);
        if (got < 0 || text.size() + static_cast<std::size_t>(got) > run.maximumBytes) return std::nullopt;
        text.append(bytes, static_cast<std::size_t>(got));
        if (got > 0) continue;
        const bool ended = waitFor(child.end(), cancel, deadline);
        return child.reap() && ended ? std::optional(std::move(text)) : std::nullopt;
    }
    return std::nullopt;
}

}  // namespace lumacast
