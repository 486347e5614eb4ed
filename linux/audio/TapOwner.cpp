#include "linux/audio/TapOwner.h"

#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <string_view>

#include "linux/ipc/Fd.h"
#include "linux/system/Ancestors.h"

namespace lumacast::sound {

namespace {

constexpr std::size_t kMostFamily = 256;

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
        const Fd file(::open(path, O_RDONLY | O_CLOEXEC | O_NONBLOCK));
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
    auto process = HeldProcess::hold(pid);
    if (!process) return nullptr;
    return std::shared_ptr<TapOwner>(new TapOwner(std::move(*process), std::move(applicationOf)));
}

bool TapOwner::owns(const ListedClient& client, const ClientIdentity& identity) {
    if (hasEnded() || (!identity.isKernelChecked && !fits(identity))) return false;
    if (identity.pid == process_.pid()) return true;
    const auto held = HeldProcess::hold(identity.pid);
    if (!held || !descendsFrom(identity.pid, process_.pid())) return false;
    const std::pair key(client.index, identity.pid);
    if (family_.count(key) == 0) {
        if (!isSameApplication(identity.pid)) return false;
        if (family_.size() >= kMostFamily) family_.clear();
        family_.insert(key);
    }
    // Still the one that was looked at.
    return !held->hasEnded() && !hasEnded();
}

bool TapOwner::isSameApplication(ProcessID pid) {
    if (!applicationOf_) return false;
    const auto own = applicationOf_(process_.pid());
    return own && applicationOf_(pid) == own;
}

}  // namespace lumacast::sound
