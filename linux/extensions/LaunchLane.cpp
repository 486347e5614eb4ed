#include "linux/extensions/LaunchLane.h"

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <utility>

#include "linux/ipc/QuietThread.h"
#include "linux/system/WordPointers.h"

namespace lumacast {

namespace {

constexpr int kFirst = 3;
constexpr int kLowestOwn = 32;  // above what the program is given: moving one there can't hit another

Fd moved(int descriptor) {
    return Fd(::fcntl(descriptor, F_DUPFD_CLOEXEC, kLowestOwn));
}

Started perform(const Start& start) {
    Started started;
    std::vector<Fd> given;
    const Fd null(::open("/dev/null", O_RDONLY | O_CLOEXEC));
    given.push_back(moved(null.get()));
    given.push_back(moved(start.output));
    for (const int descriptor : start.descriptors) given.push_back(moved(descriptor));
    for (const Fd& descriptor : given) {
        if (descriptor) continue;
        started.error = EMFILE;
        return started;
    }

    posix_spawn_file_actions_t actions;
    posix_spawnattr_t attributes;
    ::posix_spawn_file_actions_init(&actions);
    ::posix_spawnattr_init(&attributes);
    ::posix_spawn_file_actions_adddup2(&actions, given[0].get(), STDIN_FILENO);
    ::posix_spawn_file_actions_adddup2(&actions, given[1].get(), STDOUT_FILENO);
    ::posix_spawn_file_actions_adddup2(&actions, given[1].get(), STDERR_FILENO);
    int next = kFirst;
    for (std::size_t i = 2; i < given.size(); ++i) ::posix_spawn_file_actions_adddup2(&actions, given[i].get(), next++);
    ::posix_spawn_file_actions_addclosefrom_np(&actions, next);  // should a library have forgotten one
    sigset_t none, all;
    ::sigemptyset(&none);
    ::sigfillset(&all);
    ::posix_spawnattr_setsigmask(&attributes, &none);
    ::posix_spawnattr_setsigdefault(&attributes, &all);
    ::posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSID);
    pid_t pid = 0;
    started.error = ::posix_spawn(&pid, start.arguments.front().c_str(), &actions, &attributes,
                                  pointersTo(start.arguments).data(), pointersTo(start.environment).data());
    ::posix_spawnattr_destroy(&attributes);
    ::posix_spawn_file_actions_destroy(&actions);
    if (started.error != 0) return started;
    // A child that nobody has waited for keeps its number.
    started.process.reset(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)));
    if (started.process) {
        started.pid = pid;
        return started;
    }
    started.error = errno;
    ::kill(pid, SIGKILL);
    while (::waitpid(pid, nullptr, 0) < 0 && errno == EINTR) {
    }
    return started;
}

}  // namespace

LaunchLane::LaunchLane() : thread_(quietThread([this] { run(); })) {}

LaunchLane::~LaunchLane() {
    {
        const std::lock_guard lock(mutex_);
        isOver_ = true;
        tasks_.clear();
    }
    wake_.notify_all();
    thread_.join();
}

void LaunchLane::start(Start start, std::function<void(Started)> started) {
    {
        const std::lock_guard lock(mutex_);
        tasks_.push_back([start = std::move(start), started = std::move(started)] { started(perform(start)); });
    }
    wake_.notify_all();
}

void LaunchLane::run() {
    std::unique_lock lock(mutex_);
    while (true) {
        wake_.wait(lock, [&] { return isOver_ || !tasks_.empty(); });
        if (isOver_) return;
        const auto task = std::move(tasks_.front());
        tasks_.pop_front();
        lock.unlock();
        task();
        lock.lock();
    }
}

}  // namespace lumacast
