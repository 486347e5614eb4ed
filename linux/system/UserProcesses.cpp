#include "linux/display/Processes.h"

#include <dirent.h>
#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <charconv>
#include <memory>
#include <string>
#include <string_view>
#include <system_error>

#include "linux/system/ParentProcess.h"

namespace lumacast::x11 {
namespace {

constexpr std::size_t kMostAncestors = 64;

struct CloseDirectory {
    void operator()(DIR* directory) const { ::closedir(directory); }
};

}  // namespace

std::optional<HeldProcess> HeldProcess::hold(ProcessID pid) {
    if (number(pid) <= 0) return std::nullopt;
    Fd descriptor(static_cast<int>(::syscall(SYS_pidfd_open, number(pid), 0)));
    if (!descriptor) return std::nullopt;
    HeldProcess process(pid, std::move(descriptor));
    if (process.ended()) return std::nullopt;
    return process;
}

bool HeldProcess::ended() const {
    pollfd polled{descriptor_.get(), POLLIN, 0};
    return ::poll(&polled, 1, 0) != 0;
}

std::vector<ProcessID> ancestorsOf(ProcessID pid) {
    std::vector<ProcessID> ancestors;
    for (ProcessID parent = parentOf(pid); number(parent) > 0 && ancestors.size() < kMostAncestors;
         parent = parentOf(parent))
        ancestors.push_back(parent);
    return ancestors;
}

std::vector<ProcessID> processesOfThisUser() {
    std::vector<ProcessID> processes;
    const std::unique_ptr<DIR, CloseDirectory> directory(::opendir("/proc"));
    while (const dirent* const entry = directory ? ::readdir(directory.get()) : nullptr) {
        const std::string_view name(entry->d_name);
        std::int32_t pid = 0;
        const auto [end, error] = std::from_chars(name.data(), name.data() + name.size(), pid);
        if (error != std::errc{} || end != name.data() + name.size() || pid <= 0) continue;
        struct stat status {};
        if (::fstatat(::dirfd(directory.get()), entry->d_name, &status, 0) != 0 || status.st_uid != ::geteuid())
            continue;
        processes.push_back(ProcessID{pid});
    }
    return processes;
}

}  // namespace lumacast::x11
