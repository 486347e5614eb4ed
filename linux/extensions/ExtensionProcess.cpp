#include "linux/extensions/ExtensionProcess.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <utility>

namespace lumacast {

namespace {

/// What it may print in a second; then it waits.
constexpr std::size_t kOutputBytes = 256 * 1024;
constexpr int kPidfd = 3;  // P_PIDFD, missing from older headers

void send(int process, int signal) {
    if (process >= 0) ::syscall(SYS_pidfd_send_signal, process, signal, nullptr, 0);
}

/// Two connected sockets. The second is to be the process's; of what comes from it the kernel says who sent it.
std::array<Fd, 2> makePair() {
    int ends[2] = {-1, -1};
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) return {};
    const int on = 1;
    ::setsockopt(ends[0], SOL_SOCKET, SO_PASSCRED, &on, sizeof on);
    return {Fd(ends[0]), Fd(ends[1])};
}

/// Who has sent the first byte that waits; a pid of 0 when there is none, -1 when none will come.
ucred senderOf(int socket) {
    char byte = 0;
    iovec part{&byte, 1};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(ucred))> control{};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    ucred sender{};
    const ssize_t count = ::recvmsg(socket, &message, MSG_PEEK | MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
    if (count == 0 || (count < 0 && errno != EAGAIN && errno != EINTR)) sender.pid = -1;
    if (count <= 0) return sender;
    for (cmsghdr* header = CMSG_FIRSTHDR(&message); header; header = CMSG_NXTHDR(&message, header))
        if (header->cmsg_level == SOL_SOCKET && header->cmsg_type == SCM_CREDENTIALS)
            std::memcpy(&sender, CMSG_DATA(header), sizeof sender);
    return sender;
}

std::string describeEnd(const siginfo_t& info) {
    if (info.si_code == CLD_EXITED) return "ended with status " + std::to_string(info.si_status);
    return "was ended by signal " + std::to_string(info.si_status);
}

}  // namespace

ExtensionProcess::ExtensionProcess(Reactor& reactor, Log& log, std::string name, Events events)
    : reactor_(reactor),
      log_(log),
      name_(std::move(name)),
      events_(std::move(events)),
      lines_([this](const std::string& line) { log_.line("%s: %s", name_, line); }) {}

ExtensionProcess::~ExtensionProcess() {
    endNow();
}

void ExtensionProcess::start(LaunchLane& lane, const ConfinedCommand& command) {
    self_ = shared_from_this();
    auto requests = makePair(), auxiliary = makePair();
    int pipe[2] = {-1, -1};
    if (!requests[0] || !auxiliary[0] || ::pipe2(pipe, O_CLOEXEC) != 0) {
        Started failed;
        failed.error = errno;
        return took(std::move(failed));
    }
    requests_.socket = std::move(requests[0]);
    auxiliary_.socket = std::move(auxiliary[0]);
    output_.reset(pipe[0]);
    ::fcntl(output_.get(), F_SETFL, O_NONBLOCK);
    struct Theirs {
        Fd output, requests, auxiliary;
    };
    const auto theirs = std::make_shared<Theirs>(Theirs{Fd(pipe[1]), std::move(requests[1]), std::move(auxiliary[1])});
    Start start{command.arguments,
                command.environment,
                theirs->output.get(),
                {theirs->requests.get(), theirs->auxiliary.get()}};
    lane.start(std::move(start), [self = shared_from_this(), theirs](Started started) {
        *theirs = Theirs();
        const auto shared = std::make_shared<Started>(std::move(started));
        self->reactor_.async([self, shared] { self->took(std::move(*shared)); });
    });
}

void ExtensionProcess::took(Started started) {
    bool isKilled = false, isOver = false;
    {
        const std::lock_guard lock(mutex_);
        process_ = std::move(started.process);
        group_ = started.pid;
        isKilled = isKilled_;
        isOver = isOver_;
    }
    if (started.pid <= 0) {
        if (auto ended = std::exchange(events_, {}).ended; ended && !isOver)
            ended("could not be started: " + std::string(std::strerror(started.error)), started.error);
        self_.reset();
        return;
    }
    if (isKilled || isOver) {
        const std::lock_guard lock(mutex_);
        killAll();
    }
    if (!isOver) watchAll();
}

void ExtensionProcess::watchAll() {
    const auto watch = [this](int descriptor, auto task) {
        return reactor_.watch(descriptor, EPOLLIN, [weak = weak_from_this(), task](std::uint32_t) {
            const auto self = weak.lock();
            return self ? task(*self) : Reactor::Again::No;
        });
    };
    endWatch_ = watch(process_.get(), [](ExtensionProcess& self) {
        self.end();
        return Reactor::Again::No;
    });
    requestsWatch_ = watch(requests_.socket.get(), [](ExtensionProcess& self) {
        self.lookForHello(self.requests_, self.requestsWatch_);
        return Reactor::Again::No;
    });
    auxiliaryWatch_ = watch(auxiliary_.socket.get(), [](ExtensionProcess& self) {
        self.lookForHello(self.auxiliary_, self.auxiliaryWatch_);
        return Reactor::Again::No;
    });
    outputWatch_ = watch(output_.get(), [](ExtensionProcess& self) { return self.readOutput(); });
}

void ExtensionProcess::lookForHello(Greeting& greeting, std::unique_ptr<Reactor::Watch>& watch) {
    const ucred sender = senderOf(greeting.socket.get());
    if (sender.pid == 0) return;
    watch.reset();
    if (sender.pid < 0) {
        // It has closed its end unheard. Whatever it is, it is no extension.
        log_.error("%s has closed its connection without a word", name_);
        return signal(SIGKILL);
    }
    const int off = 0;
    ::setsockopt(greeting.socket.get(), SOL_SOCKET, SO_PASSCRED, &off, sizeof off);
    greeting.peer.pid = ProcessID{sender.pid};
    greeting.peer.uid = sender.uid;
    greeting.peer.pidfd = Fd(static_cast<int>(::syscall(SYS_pidfd_open, sender.pid, 0)));
    if (requests_.peer.pid == ProcessID{} || auxiliary_.peer.pid == ProcessID{}) return;
    {
        const std::lock_guard lock(mutex_);
        program_ = Fd(::fcntl(requests_.peer.pidfd.get(), F_DUPFD_CLOEXEC, 0));
    }
    if (events_.greeted) events_.greeted(std::move(requests_), std::move(auxiliary_));
}

Reactor::Again ExtensionProcess::readOutput() {
    std::array<char, 4096> some;
    const ssize_t count = ::read(output_.get(), some.data(), some.size());
    if (count < 0 && (errno == EAGAIN || errno == EINTR)) return Reactor::Again::No;
    if (count <= 0) {
        outputWatch_.reset();
        return Reactor::Again::No;
    }
    lines_.add({some.data(), static_cast<std::size_t>(count)}, std::chrono::steady_clock::now());
    outputBytes_ += static_cast<std::size_t>(count);
    if (outputPause_) {
        // One timer for each second in which something was printed.
        if (outputBytes_ >= kOutputBytes) outputWatch_->setEvents(0);
        return Reactor::Again::No;
    }
    outputPause_ = reactor_.after(std::chrono::seconds(1), [weak = weak_from_this()] {
        const auto self = weak.lock();
        if (!self) return;
        self->outputBytes_ = 0;
        self->outputPause_.reset();
        if (self->outputWatch_) self->outputWatch_->setEvents(EPOLLIN);
    });
    return Reactor::Again::No;
}

void ExtensionProcess::signal(int signal) {
    const std::lock_guard lock(mutex_);
    if (isOver_) return;
    if (signal == SIGKILL) isKilled_ = true;
    if (signal == SIGKILL) return killAll();
    send(program_ ? program_.get() : process_.get(), signal);
}

/// With the mutex held. Also what bubblewrap had started when it was killed before that was set up: such a process
/// knows of no parent yet that it should end with.
void ExtensionProcess::killAll() {
    send(program_.get(), SIGKILL);
    send(process_.get(), SIGKILL);
    if (group_ > 1) ::kill(-group_, SIGKILL);
}

void ExtensionProcess::end() {
    siginfo_t info{};
    {
        const std::lock_guard lock(mutex_);
        if (isOver_) return;
        const auto wait = [&](int how) {
            return ::waitid(static_cast<idtype_t>(kPidfd), static_cast<id_t>(process_.get()), &info,
                            WEXITED | WNOHANG | how) == 0 &&
                   info.si_pid != 0;
        };
        if (!wait(WNOWAIT)) return;
        killAll();  // whatever has ended it
        wait(0);
        group_ = 0;
        isOver_ = true;
    }
    // What it has printed last.
    for (int i = 0; i < 16 && outputWatch_; ++i) readOutput();
    lines_.end();
    const auto ended = events_.ended;
    forget();
    if (ended) ended(describeEnd(info), ECONNRESET);
}

void ExtensionProcess::forget() {
    endWatch_.reset();
    requestsWatch_.reset();
    auxiliaryWatch_.reset();
    outputWatch_.reset();
    outputPause_.reset();
    const Events events = std::exchange(events_, {});
    const auto self = std::exchange(self_, nullptr);
}

void ExtensionProcess::endNow() {
    const std::lock_guard lock(mutex_);
    if (isOver_) return;
    isOver_ = true;
    if (!process_) return;
    killAll();
    pollfd end{process_.get(), POLLIN, 0};
    if (::poll(&end, 1, 2000) != 1) return;
    siginfo_t info{};
    ::waitid(static_cast<idtype_t>(kPidfd), static_cast<id_t>(process_.get()), &info, WEXITED | WNOHANG);
    group_ = 0;
}

}  // namespace lumacast
