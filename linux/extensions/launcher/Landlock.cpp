#include "linux/extensions/launcher/Landlock.h"

#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>

#include "linux/ipc/Fd.h"

namespace lumacast::launcher {

namespace {

// The kernel's own numbers (linux/landlock.h); the headers of this system lack the newer ones.
constexpr long kCreateRuleset = 444, kAddRule = 445, kRestrictSelf = 446;
constexpr unsigned kAskVersion = 1;
constexpr int kPathBeneath = 1;
constexpr std::uint64_t kExecute = 1 << 0, kWriteFile = 1 << 1, kReadFile = 1 << 2, kReadDirectory = 1 << 3;
constexpr std::uint64_t kFirstVersion = (1 << 13) - 1;  ///< with all that removes and makes files
constexpr std::uint64_t kRefer = 1 << 13, kTruncate = 1 << 14, kIoctlDevice = 1 << 15;
constexpr std::uint64_t kOfFiles = kExecute | kWriteFile | kReadFile | kTruncate | kIoctlDevice;
constexpr std::uint64_t kScopeAbstractSockets = 1 << 0, kScopeSignals = 1 << 1;

struct RulesetAttributes {
    std::uint64_t files = 0;
    std::uint64_t network = 0;
    std::uint64_t scoped = 0;
};

struct __attribute__((packed)) PathRule {
    std::uint64_t allowed;
    std::int32_t parent;
};

std::uint64_t filesOf(int version) {
    std::uint64_t all = kFirstVersion;
    if (version >= 2) all |= kRefer;
    if (version >= 3) all |= kTruncate;
    if (version >= 5) all |= kIoctlDevice;
    return all;
}

/// How much of the attributes a version knows.
std::size_t sizeFor(int version) {
    return version >= 6 ? 24 : version >= 4 ? 16 : 8;
}

bool allow(int ruleset, const std::string& path, std::uint64_t rights) {
    const Fd place(::open(path.c_str(), O_PATH | O_CLOEXEC));
    struct stat status = {};
    if (!place || ::fstat(place.get(), &status) != 0) return errno == ENOENT || errno == EACCES || errno == ENOTDIR;
    if (!S_ISDIR(status.st_mode)) rights &= kOfFiles;
    const PathRule rule{rights, place.get()};
    return ::syscall(kAddRule, ruleset, kPathBeneath, &rule, 0) == 0;
}

}  // namespace

int landlockVersion() {
    const long version = ::syscall(kCreateRuleset, nullptr, 0, kAskVersion);
    return version > 0 ? static_cast<int>(version) : 0;
}

bool restrictFiles(const FileRules& rules) {
    const int version = landlockVersion();
    if (version == 0) {
        errno = ENOSYS;
        return false;
    }
    RulesetAttributes attributes;
    attributes.files = filesOf(version);
    if (version >= 6) attributes.scoped = kScopeAbstractSockets | kScopeSignals;
    const Fd ruleset(static_cast<int>(::syscall(kCreateRuleset, &attributes, sizeFor(version), 0)));
    if (!ruleset) return false;
    for (const std::string& path : rules.readable)
        if (!allow(ruleset.get(), path, kExecute | kReadFile | kReadDirectory)) return false;
    for (const std::string& path : rules.writable)
        if (!allow(ruleset.get(), path, attributes.files)) return false;
    if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) return false;
    return ::syscall(kRestrictSelf, ruleset.get(), 0) == 0;
}

}  // namespace lumacast::launcher
