#include "linux/system/LinuxLogSink.h"

#include <fcntl.h>
#include <poll.h>
#include <pthread.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace lumacast {

namespace {

/// With its level and what is said before it below PIPE_BUF: such a write to a pipe is whole or not at all.
constexpr std::size_t kMaximumText = 4000;

std::string_view levelName(LogLevel level) {
    switch (level) {
        case LogLevel::Error: return "error";
        case LogLevel::Debug: return "debug";
        case LogLevel::Sample: return "sample";
        case LogLevel::Default:
        case LogLevel::Print: break;
    }
    return "info";
}

/// The priorities of syslog(3).
char journalPriority(LogLevel level) {
    switch (level) {
        case LogLevel::Error: return '3';
        case LogLevel::Debug:
        case LogLevel::Sample: return '7';
        case LogLevel::Default:
        case LogLevel::Print: break;
    }
    return '6';
}

std::string presentable(std::string_view text) {
    std::string result(text.substr(0, kMaximumText));
    if (result.size() < text.size())  // never half a UTF-8 character
        while (!result.empty() && (static_cast<unsigned char>(text[result.size()]) & 0xC0) == 0x80) result.pop_back();
    std::replace_if(
        result.begin(), result.end(), [](char c) { return (c >= 0 && c < ' ' && c != '\t') || c == 0x7F; }, ' ');
    return result;
}

std::string droppedNote(std::uint64_t lines) { return std::to_string(lines) + " log lines dropped"; }

/// Writes to a pipe whose reader may have gone: the signal that brings is taken back.
ssize_t writeWithoutSignal(int number, std::string_view bytes) {
    sigset_t pipe;
    sigset_t pending;
    sigset_t before;
    sigemptyset(&pipe);
    sigaddset(&pipe, SIGPIPE);
    sigpending(&pending);
    pthread_sigmask(SIG_BLOCK, &pipe, &before);
    const ssize_t count = ::write(number, bytes.data(), bytes.size());
    const int error = errno;
    if (count < 0 && error == EPIPE && !sigismember(&pending, SIGPIPE)) {
        const timespec now{};
        while (::sigtimedwait(&pipe, nullptr, &now) < 0 && errno == EINTR) {}
    }
    pthread_sigmask(SIG_SETMASK, &before, nullptr);
    errno = error;
    return count;
}

bool leadsToJournal(const LogSinkTargets& targets) {
    struct stat status = {};
    if (targets.journalStream.empty() || ::fstat(targets.standardError, &status) != 0) return false;
    return targets.journalStream == std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino);
}

Fd connectToJournal(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.empty() || path.size() >= sizeof address.sun_path) return {};
    std::copy(path.begin(), path.end(), address.sun_path);
    Fd socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!socket || ::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) return {};
    return socket;
}

}  // namespace

LinuxLogSink::Stream::Stream(int number) : number_(number) {
    struct stat status = {};
    if (::fstat(number, &status) != 0 || S_ISREG(status.st_mode)) return;  // a file's reader holds nobody up
    if (S_ISSOCK(status.st_mode)) {
        kind_ = Kind::Socket;
        return;
    }
    // O_NONBLOCK on the stream itself would also change it for whoever gave it to us. A second opening is our own.
    const std::string path = "/proc/self/fd/" + std::to_string(number);
    reopened_.reset(::open(path.c_str(), O_WRONLY | O_NONBLOCK | O_CLOEXEC | O_NOCTTY));
    kind_ = reopened_ ? Kind::Reopened : Kind::Pollable;
}

bool LinuxLogSink::Stream::write(std::string_view bytes) const {
    ssize_t count = -1;
    switch (kind_) {
        case Kind::Socket:
            count = ::send(number_, bytes.data(), bytes.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
            break;
        case Kind::Pollable: {
            pollfd ready{number_, POLLOUT, 0};
            if (::poll(&ready, 1, 0) != 1 || (ready.revents & POLLOUT) == 0) return false;
            count = writeWithoutSignal(number_, bytes);
            break;
        }
        case Kind::Reopened: count = writeWithoutSignal(reopened_.get(), bytes); break;
        case Kind::Ordinary: count = ::write(number_, bytes.data(), bytes.size()); break;
    }
    return count == static_cast<ssize_t>(bytes.size());
}

LinuxLogSink::LinuxLogSink(const LogSinkTargets& targets)
    : error_(targets.standardError), output_(targets.standardOutput), now_(targets.now) {
    if (leadsToJournal(targets)) journal_ = connectToJournal(targets.journalSocket);
}

void LinuxLogSink::write(LogLevel level, std::string_view text) {
    const std::string line = presentable(text);
    if (level == LogLevel::Print) {
        if (!output_.write(line + "\n")) ++dropped_;
        return;
    }
    const auto folded = repeated_.take(level, line, now_());
    if (folded.before) writeToLog(folded.before->level, folded.before->text);
    if (folded.isWritten) writeToLog(level, line);
}

void LinuxLogSink::flush() {
    if (const auto last = repeated_.end()) writeToLog(last->level, last->text);
}

bool LinuxLogSink::mayBeWritten(LogLevel level) {
    return level == LogLevel::Debug || level == LogLevel::Sample || quota_.take(now_());
}

void LinuxLogSink::writeToLog(LogLevel level, const std::string& line) {
    if (!mayBeWritten(level)) {
        ++unreported_;
        ++dropped_;
        return;
    }
    const std::uint64_t missed = unreported_.exchange(0);
    if (journal_ ? sendToJournal(level, line, missed) : writeToError(level, line, missed)) return;
    unreported_ += missed + 1;
    ++dropped_;
}

bool LinuxLogSink::writeToError(LogLevel level, const std::string& text, std::uint64_t missed) const {
    // One write for both: else the short notes about what was dropped would fill the room the lines did not fit into.
    const std::string note = missed > 0 ? "error " + droppedNote(missed) + "\n" : "";
    return error_.write(note + std::string(levelName(level)) + " " + text + "\n");
}

bool LinuxLogSink::sendToJournal(LogLevel level, const std::string& text, std::uint64_t missed) const {
    if (missed > 0 && !sendToJournal(LogLevel::Error, droppedNote(missed), 0)) return false;
    // The journal's native protocol: one field a line; no text holds a newline here.
    const std::string datagram = std::string("PRIORITY=") + journalPriority(level) +
                                 "\nSYSLOG_IDENTIFIER=lumacastd\nMESSAGE=" + text + "\n";
    return ::send(journal_.get(), datagram.data(), datagram.size(), MSG_DONTWAIT | MSG_NOSIGNAL) ==
           static_cast<ssize_t>(datagram.size());
}

}  // namespace lumacast
