#include "client/lumacastctl/record/StopWish.h"

#include <poll.h>
#include <signal.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <array>
#include <string_view>

namespace lumacast::ctl {

namespace {

constexpr std::string_view kKeys = "qQ\n ";

}  // namespace

StopWish::StopWish() {
    sigset_t wanted;
    sigemptyset(&wanted);
    sigaddset(&wanted, SIGINT);
    sigaddset(&wanted, SIGTERM);
    sigaddset(&wanted, SIGHUP);  // the terminal has gone
    sigaddset(&wanted, SIGQUIT);
    ::pthread_sigmask(SIG_BLOCK, &wanted, &mask_);
    signals_ = Fd(::signalfd(-1, &wanted, SFD_CLOEXEC | SFD_NONBLOCK));
    termios now{};
    if (::isatty(STDIN_FILENO) != 1 || ::tcgetattr(STDIN_FILENO, &now) != 0) {
        inputIsOpen_ = false;
        return;
    }
    terminal_ = now;
    now.c_lflag &= ~static_cast<tcflag_t>(ICANON | ECHO);
    now.c_cc[VMIN] = 1;
    now.c_cc[VTIME] = 0;
    ::tcsetattr(STDIN_FILENO, TCSANOW, &now);
}

StopWish::~StopWish() {
    if (terminal_) ::tcsetattr(STDIN_FILENO, TCSANOW, &*terminal_);
    signalfd_siginfo pending{};
    while (signals_ && ::read(signals_.get(), &pending, sizeof pending) > 0) {}
    ::pthread_sigmask(SIG_SETMASK, &mask_, nullptr);
}

bool StopWish::came(std::chrono::milliseconds limit) {
    if (came_) return true;
    std::array<pollfd, 2> polled{
        {{signals_.get(), POLLIN, 0}, {inputIsOpen_ ? STDIN_FILENO : -1, POLLIN, 0}}};
    if (::poll(polled.data(), polled.size(), static_cast<int>(limit.count())) <= 0) return false;
    if (polled[0].revents != 0) came_ = true;
    if (polled[1].revents != 0) {
        std::array<char, 64> keys{};
        const ssize_t count = ::read(STDIN_FILENO, keys.data(), keys.size());
        if (count <= 0) inputIsOpen_ = false;  // the terminal has gone; the signal comes too
        for (ssize_t i = 0; i < count; ++i)
            came_ |= kKeys.find(keys[static_cast<std::size_t>(i)]) != std::string_view::npos;
    }
    return came_;
}

}  // namespace lumacast::ctl
