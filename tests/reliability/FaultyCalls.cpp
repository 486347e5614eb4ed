// The file calls of a daemon that is otherwise the shipped one: each can be made to fail, and the process to end before or after
// it (FaultPlan.h says how). Linked in the place of linux/calls/SystemCalls.cpp.

#include "linux/calls/SystemCalls.h"

#include <fcntl.h>
#include <linux/fs.h>
#include <signal.h>
#include <stdio.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <mutex>
#include <optional>
#include <sstream>
#include <vector>

#include "tests/reliability/FaultPlan.h"
#include "tests/reliability/Journal.h"

namespace lumacast::calls::once {

namespace {

using test::Fault;

std::int64_t hostNanoseconds() {
    timespec now{};
    ::clock_gettime(CLOCK_MONOTONIC, &now);
    return std::int64_t{now.tv_sec} * 1'000'000'000 + now.tv_nsec;
}

std::string pathOf(int descriptor) {
    char target[4096];
    const std::string link = "/proc/self/fd/" + std::to_string(descriptor);
    const ssize_t length = ::readlink(link.c_str(), target, sizeof target);
    return length > 0 ? std::string(target, static_cast<std::size_t>(length)) : std::string();
}

std::string pathOf(int folder, const std::string& name) {
    if (name.starts_with('/')) return name;
    const std::string around = folder == AT_FDCWD ? "." : pathOf(folder);
    if (name.empty() || name == ".") return around;
    return around + "/" + name;
}

std::string targetOfDescriptor(int descriptor) {
    const std::string path = pathOf(descriptor);
    if (path.starts_with("socket:")) return "socket";
    if (path.starts_with("/memfd:")) return "memory";
    return test::targetOf(path);
}

/// What was accepted at the service's socket has its name.
std::string targetOfSocket(int socket) {
    sockaddr_un name{};
    socklen_t size = sizeof name;
    const bool isNamed = ::getsockname(socket, reinterpret_cast<sockaddr*>(&name), &size) == 0 && name.sun_path[0] != '\0' &&
                         size > sizeof name.sun_family;
    return isNamed ? "socket" : "channel";
}

[[noreturn]] void endAtOnce() {
    for (;;) ::kill(::getpid(), SIGKILL);
}

int errorOf(Fault fault) {
    switch (fault) {
        case Fault::NoSpace: return ENOSPC;
        case Fault::InputOutput: return EIO;
        case Fault::Interrupted: return EINTR;
        case Fault::BrokenPipe: return EPIPE;
        case Fault::NoBuffers: return ENOBUFS;
        case Fault::WouldBlock: return EAGAIN;
        case Fault::Short:
        case Fault::KillBefore:
        case Fault::KillAfter: break;
    }
    return 0;
}

/// What takes room on the disk, and fails as long as there is none.
bool takesRoom(const std::string& call) {
    return call == "write" || call == "writeAt" || call == "copyRange" || call == "reserve" || call == "openToMake" ||
           call == "makeDirectoryAt";
}

/// The folder of the plan, the counts and the notes.
class Faults {
public:
    Faults() {
        const char* folder = std::getenv("LC_FAULTS");
        if (!folder) return;
        folder_ = folder;
        std::ifstream file(folder_ + "/plan");
        std::string fault;
        if (file >> call_ >> target_ >> number_ >> fault)
            for (const auto& each : test::kFaultNames)
                if (each.name == fault) fault_ = each.fault;
        calls_ = ::open((folder_ + "/calls").c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0600);
        journal_ = ::open((folder_ + "/journal").c_str(), O_WRONLY | O_APPEND | O_CLOEXEC);
    }

    /// The fault of this call, if it has one; kills before it.
    std::optional<Fault> begin(const std::string& call, const std::string& target) {
        const std::lock_guard lock(mutex_);
        if (!isArmed()) return std::nullopt;
        std::optional<Fault> fault;
        if (fault_ && call == call_ && target == target_ && ++counted_ == number_) fault = fault_;
        if (isFull_ && takesRoom(call)) fault = Fault::NoSpace;
        if (fault == Fault::KillBefore) {
            note(call, target, "-", 0, fault);
            endAtOnce();
        }
        if (fault == Fault::NoSpace) isFull_ = true;
        return fault;
    }
    void end(const std::string& call, const std::string& target, std::int64_t result, std::optional<Fault> fault) {
        const int error = result < 0 ? errno : 0;
        {
            const std::lock_guard lock(mutex_);
            if (isArmed()) note(call, target, std::to_string(result), error, fault);
            if (fault == Fault::KillAfter) endAtOnce();
        }
        errno = error;
    }
    void journal(test::JournalEntry entry) {
        if (journal_ < 0) return;
        const int error = errno;
        const std::lock_guard lock(mutex_);
        entry.time = static_cast<std::uint64_t>(hostNanoseconds());
        const std::string bytes = test::encode(entry);
        (void)!::write(journal_, bytes.data(), bytes.size());
        errno = error;
    }
    bool hasJournal() const { return journal_ >= 0; }

private:
    bool isArmed() const {
        return !folder_.empty() && ::syscall(SYS_faccessat, AT_FDCWD, (folder_ + "/armed").c_str(), F_OK) == 0;
    }
    void note(const std::string& call, const std::string& target, const std::string& result, int error,
              std::optional<Fault> fault) const {
        std::string line = std::to_string(hostNanoseconds()) + " " + call + " " + target + " " + result + " " +
                           std::to_string(error);
        if (fault) line += " " + std::string(test::nameOf(*fault));
        line += "\n";
        (void)!::write(calls_, line.data(), line.size());
    }

    std::mutex mutex_;
    std::string folder_, call_, target_;
    std::uint64_t number_ = 0, counted_ = 0;
    std::optional<Fault> fault_;
    bool isFull_ = false;  ///< since a call failed for want of space, until the end
    int calls_ = -1, journal_ = -1;
};

Faults& faults() {
    static Faults instance;
    return instance;
}

/// `perform` is the call; it is told how many of `count` bytes it may take.
std::int64_t run(const std::string& call, const std::string& target, std::size_t count, const auto& perform) {
    const auto fault = faults().begin(call, target);
    std::int64_t result = -1;
    if (fault && errorOf(*fault) != 0) {
        errno = errorOf(*fault);
    } else if (fault == Fault::Short && count > 1) {
        result = perform(count / 2);
    } else {
        result = perform(count);
    }
    faults().end(call, target, result, fault);
    return result;
}

int run(const std::string& call, const std::string& target, const auto& perform) {
    return static_cast<int>(run(call, target, 0, [&](std::size_t) { return perform(); }));
}

}  // namespace

int openAt(int folder, const std::string& path, int flags, mode_t mode) {
    const bool makes = (flags & O_CREAT) != 0 || (flags & O_TMPFILE) == O_TMPFILE;
    const std::string whole = pathOf(folder, path);
    return run(makes ? "openToMake" : "open", test::targetOf(whole), [&] {
        const int file = ::openat(folder, path.c_str(), flags, mode);
        if (makes && file >= 0) faults().journal({test::JournalEntry::Kind::Make, pathOf(file), "", 0, {}, 0});
        return file;
    });
}

int openResolved(int folder, const std::string& path, const open_how& how) {
    return run("open", test::targetOf(pathOf(folder, path)), [&] {
        return static_cast<int>(::syscall(SYS_openat2, folder, path.c_str(), &how, sizeof how));
    });
}

int makeDirectoryAt(int folder, const std::string& path, mode_t mode) {
    const std::string whole = pathOf(folder, path);
    return run("makeDirectoryAt", test::targetOf(whole), [&] {
        const int result = ::mkdirat(folder, path.c_str(), mode);
        if (result == 0) faults().journal({test::JournalEntry::Kind::MakeDirectory, whole, "", 0, {}, 0});
        return result;
    });
}

ssize_t write(int file, const void* bytes, std::size_t count) {
    return run("write", targetOfDescriptor(file), count, [&](std::size_t most) {
        const off_t offset = faults().hasJournal() ? ::lseek(file, 0, SEEK_CUR) : -1;
        const ssize_t result = ::write(file, bytes, most);
        if (result > 0 && offset >= 0)
            faults().journal({test::JournalEntry::Kind::Write, pathOf(file), "", static_cast<std::uint64_t>(offset),
                              test::bytesAt(bytes, result), 0});
        return result;
    });
}

ssize_t writeAt(int file, const void* bytes, std::size_t count, off_t offset) {
    return run("writeAt", targetOfDescriptor(file), count, [&](std::size_t most) {
        const ssize_t result = ::pwrite(file, bytes, most, offset);
        if (result > 0)
            faults().journal({test::JournalEntry::Kind::Write, pathOf(file), "", static_cast<std::uint64_t>(offset),
                              test::bytesAt(bytes, result), 0});
        return result;
    });
}

ssize_t copyRange(int from, int to, std::size_t count) {
    return run("copyRange", targetOfDescriptor(to), count,
               [&](std::size_t most) { return ::copy_file_range(from, nullptr, to, nullptr, most, 0); });
}

int clone(int from, int to) {
    return run("clone", targetOfDescriptor(to), [&] { return ::ioctl(to, FICLONE, from); });
}

int reserve(int file, off_t size) {
    return run("reserve", targetOfDescriptor(file), [&] { return ::fallocate(file, FALLOC_FL_KEEP_SIZE, 0, size); });
}

int truncate(int file, off_t size) {
    return run("truncate", targetOfDescriptor(file), [&] { return ::ftruncate(file, size); });
}

int sync(int file) {
    return run("sync", targetOfDescriptor(file), [&] {
        const int result = ::fsync(file);
        if (result == 0) faults().journal({test::JournalEntry::Kind::Sync, pathOf(file), "", 0, {}, 0});
        return result;
    });
}

int syncData(int file) {
    return run("syncData", targetOfDescriptor(file), [&] {
        const int result = ::fdatasync(file);
        if (result == 0) faults().journal({test::JournalEntry::Kind::Sync, pathOf(file), "", 0, {}, 0});
        return result;
    });
}

int startWriteBack(int file, off_t offset, off_t count, unsigned flags) {
    return run("startWriteBack", targetOfDescriptor(file),
               [&] { return ::sync_file_range(file, offset, count, flags); });
}

int rename(int fromFolder, const std::string& from, int toFolder, const std::string& to) {
    const std::string before = pathOf(fromFolder, from), after = pathOf(toFolder, to);
    return run("rename", test::targetOf(after), [&] {
        const int result = ::renameat(fromFolder, from.c_str(), toFolder, to.c_str());
        if (result == 0) faults().journal({test::JournalEntry::Kind::Rename, before, after, 0, {}, 0});
        return result;
    });
}

int renameToNew(int fromFolder, const std::string& from, int toFolder, const std::string& to) {
    return run("renameToNew", test::targetOf(pathOf(toFolder, to)), [&] {
        return ::renameat2(fromFolder, from.c_str(), toFolder, to.c_str(), RENAME_NOREPLACE);
    });
}

int link(int fromFolder, const std::string& from, int toFolder, const std::string& to, int flags) {
    return run("link", test::targetOf(pathOf(toFolder, to)),
               [&] { return ::linkat(fromFolder, from.c_str(), toFolder, to.c_str(), flags); });
}

int unlinkAt(int folder, const std::string& path, int flags) {
    const std::string whole = pathOf(folder, path);
    return run("unlinkAt", test::targetOf(whole), [&] {
        const int result = ::unlinkat(folder, path.c_str(), flags);
        if (result == 0) faults().journal({test::JournalEntry::Kind::Remove, whole, "", 0, {}, 0});
        return result;
    });
}

int statFileSystem(int file, struct statvfs& status) {
    return run("statFileSystem", targetOfDescriptor(file), [&] { return ::fstatvfs(file, &status); });
}

ssize_t sendMessage(int socket, const msghdr& message, int flags) {
    std::size_t count = 0;
    for (std::size_t i = 0; i < message.msg_iovlen; ++i) count += message.msg_iov[i].iov_len;
    return run("sendMessage", targetOfSocket(socket), count, [&](std::size_t most) -> std::int64_t {
        if (most == count) return ::sendmsg(socket, &message, flags);
        std::vector<iovec> parts(message.msg_iov, message.msg_iov + message.msg_iovlen);
        std::size_t left = most;
        for (iovec& part : parts) {
            part.iov_len = std::min(part.iov_len, left);
            left -= part.iov_len;
        }
        msghdr shorter = message;
        shorter.msg_iov = parts.data();
        return ::sendmsg(socket, &shorter, flags);
    });
}

}  // namespace lumacast::calls::once
