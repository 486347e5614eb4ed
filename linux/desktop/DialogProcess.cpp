#include "linux/desktop/DialogProcess.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <initializer_list>

#include "linux/ipc/QuietThread.h"
#include "linux/system/WordPointers.h"

namespace lumacast {
namespace {

constexpr std::size_t kMostOutput = 1024;
constexpr int kLowestOwn = 10;  // above standard input, output and error: moving one there can't hit another

struct Pipe {
    Fd read, write;
};

Fd moved(int descriptor) {
    Fd original(descriptor);
    return Fd(original ? ::fcntl(original.get(), F_DUPFD_CLOEXEC, kLowestOwn) : -1);
}

Pipe makePipe() {
    int ends[2] = {-1, -1};
    if (::pipe2(ends, O_CLOEXEC) != 0) return {};
    Pipe pipe;
    pipe.read = moved(ends[0]);
    pipe.write = moved(ends[1]);
    return pipe;
}

/// Everything the new process needs, made before the fork: behind it only what is safe in a signal handler may run.
struct Start {
    const char* path;
    char** arguments;
    char** environment;
    int null, output, failure;
    pid_t parent;
};

[[noreturn]] void becomeProgram(const Start& start) {
    const auto fail = [&] {
        const int error = errno;
        [[maybe_unused]] const auto written = ::write(start.failure, &error, sizeof error);
        ::_exit(127);
    };
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    if (::getppid() != start.parent) ::_exit(127);  // it has gone before it could be told
    ::setpgid(0, 0);
    struct sigaction standard {};
    standard.sa_handler = SIG_DFL;
    for (int signal = 1; signal < NSIG; ++signal) ::sigaction(signal, &standard, nullptr);
    if (::dup2(start.null, STDIN_FILENO) < 0 || ::dup2(start.output, STDOUT_FILENO) < 0 ||
        ::dup2(start.null, STDERR_FILENO) < 0 || ::chdir("/") != 0)
        fail();
#ifdef SYS_close_range
    constexpr unsigned kCloseOnExec = 4;  // CLOSE_RANGE_CLOEXEC: should a library have forgotten one
    ::syscall(SYS_close_range, 3U, ~0U, kCloseOnExec);
#endif
    sigset_t none;
    ::sigemptyset(&none);
    ::sigprocmask(SIG_SETMASK, &none, nullptr);
    ::execve(start.path, start.arguments, start.environment);
    fail();
    ::_exit(127);
}

void killGroup(pid_t leader) {
    ::kill(-leader, SIGKILL);
    ::kill(leader, SIGKILL);  // it may not lead its group yet
}

}  // namespace

std::unique_ptr<DialogProcess> DialogProcess::start(const Command& command) {
    Pipe output = makePipe(), failure = makePipe();
    const Fd null = moved(::open("/dev/null", O_RDWR | O_CLOEXEC));
    if (!output.write || !failure.write || !null) return nullptr;
    if (::fcntl(output.read.get(), F_SETFL, O_NONBLOCK) != 0) return nullptr;
    std::vector<char*> arguments = pointersTo(command.arguments), environment = pointersTo(command.environment);
    const Start start{command.path.c_str(), arguments.data(),    environment.data(), null.get(),
                      output.write.get(),   failure.write.get(), ::getpid()};
    pid_t pid = -1;
    {
        const SignalsBlocked blocked;  // no handler of this process may run in the other one
        pid = ::fork();
        if (pid == 0) becomeProgram(start);
    }
    if (pid < 0) return nullptr;
    output.write.reset();
    failure.write.reset();
    // A child that nobody has waited for keeps its number.
    Fd process(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)));
    const bool held = static_cast<bool>(process);
    std::unique_ptr<DialogProcess> started(new DialogProcess(pid, std::move(process), std::move(output.read)));
    int error = 0;
    ssize_t count = 0;
    do count = ::read(failure.read.get(), &error, sizeof error);  // its end: closed by the exec
    while (count < 0 && errno == EINTR);
    return held && count == 0 ? std::move(started) : nullptr;
}

DialogProcess::~DialogProcess() {
    if (!reaped_) {
        killGroup(pid_);
        int status = 0;
        while (::waitpid(pid_, &status, 0) < 0 && errno == EINTR) {
        }
    }
}

bool DialogProcess::readOutput() {
    std::array<char, 512> some{};
    while (output_) {
        const ssize_t count = ::read(output_.get(), some.data(), some.size());
        if (count < 0 && errno == EINTR) continue;
        if (count < 0 && errno == EAGAIN) return true;
        if (count <= 0) {
            output_.reset();
            break;
        }
        printed_.append(some.data(), static_cast<std::size_t>(count));
        if (printed_.size() > kMostOutput) return false;
    }
    return true;
}

std::optional<DialogEnd> DialogProcess::end() {
    siginfo_t info{};
    while (::waitid(P_PID, static_cast<id_t>(pid_), &info, WEXITED | WNOWAIT) != 0)
        if (errno != EINTR) return std::nullopt;
    if (!readOutput()) return std::nullopt;
    // What it has started goes with it; until it is waited for, its number stays the group's.
    killGroup(pid_);
    int status = 0;
    while (::waitpid(pid_, &status, 0) < 0)
        if (errno != EINTR) return std::nullopt;
    reaped_ = true;
    DialogEnd end;
    if (WIFEXITED(status)) end.exitStatus = WEXITSTATUS(status);
    end.output = printed_;
    return end;
}

}  // namespace lumacast
