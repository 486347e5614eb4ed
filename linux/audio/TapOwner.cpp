#include "linux/audio/TapOwner.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <charconv>
#include <string_view>

#include "linux/system/ParentProcess.h"

namespace lumacast::sound {

namespace {

constexpr int kMostAncestors = 64;
constexpr std::size_t kMostFamily = 256;

FileDescriptor openProcess(ProcessID pid) {
    return FileDescriptor(number(pid) > 0 ? static_cast<int>(::syscall(SYS_pidfd_open, number(pid), 0)) : -1);
}

bool hasProcessEnded(const FileDescriptor& process) {
    pollfd polled{process.get(), POLLIN, 0};
    return ::poll(&polled, 1, 0) != 0;
}

bool descendsFrom(ProcessID pid, ProcessID ancestor) {
    for (int step = 0; step < kMostAncestors && number(pid) > 0; ++step) {
        pid = parentOf(pid);
        if (pid == ancestor) return true;
    }
    return false;
}

/// The file name of the program that the process runs; empty when that can't be told.
std::string binaryOf(ProcessID pid) {
    std::array<char, 4096> buffer;
    const ssize_t length =
        ::readlink(("/proc/" + std::to_string(number(pid)) + "/exe").c_str(), buffer.data(), buffer.size());
    if (length <= 0) return {};
    std::string_view path(buffer.data(), static_cast<std::size_t>(length));
    // A program that was replaced since it was started.
    constexpr std::string_view kDeleted = " (deleted)";
    if (path.ends_with(kDeleted)) path.remove_suffix(kDeleted.size());
    return std::string(path.substr(path.rfind('/') + 1));
}

/// The machine's identifier, as the clients of the sound server read it; empty where it has none.
std::string thisMachine() {
    for (const char* const path : {"/etc/machine-id", "/var/lib/dbus/machine-id"}) {
        const FileDescriptor file(::open(path, O_RDONLY | O_CLOEXEC | O_NONBLOCK));
        std::array<char, 64> buffer;
        const ssize_t length = file ? ::read(file.get(), buffer.data(), buffer.size()) : -1;
        if (length < 32) continue;
        return std::string(buffer.data(), 32);
    }
    return {};
}

bool fits(const ClientIdentity& claim) {
    if (claim.binary != binaryOf(claim.pid)) return false;
    const std::string machine = thisMachine();
    return machine.empty() || claim.machine.empty() || claim.machine == machine;
}

}  // namespace

std::shared_ptr<TapOwner> TapOwner::hold(ProcessID pid, ApplicationOf applicationOf) {
    FileDescriptor process = openProcess(pid);
    if (!process || hasProcessEnded(process)) return nullptr;
    return std::shared_ptr<TapOwner>(new TapOwner(pid, std::move(process), std::move(applicationOf)));
}

bool TapOwner::hasEnded() const { return hasProcessEnded(process_); }

bool TapOwner::owns(const ListedClient& client, const ClientIdentity& identity) {
    if (hasEnded() || (!identity.isKernelChecked && !fits(identity))) return false;
    if (identity.pid == pid_) return true;
    const FileDescriptor held = openProcess(identity.pid);
    if (!held || !descendsFrom(identity.pid, pid_)) return false;
    const std::pair key(client.index, identity.pid);
    if (family_.count(key) == 0) {
        if (!isSameApplication(identity.pid)) return false;
        if (family_.size() >= kMostFamily) family_.clear();
        family_.insert(key);
    }
    // Still the one that was looked at.
    return !hasProcessEnded(held) && !hasEnded();
}

bool TapOwner::isSameApplication(ProcessID pid) {
    if (!applicationOf_) return false;
    const auto own = applicationOf_(pid_);
    return own && applicationOf_(pid) == own;
}

}  // namespace lumacast::sound
