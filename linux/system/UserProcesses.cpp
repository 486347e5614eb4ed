#include "linux/system/UserProcesses.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <charconv>
#include <memory>
#include <string_view>
#include <system_error>

namespace lumacast {
namespace {

struct CloseDirectory {
    void operator()(DIR* directory) const { ::closedir(directory); }
};

}  // namespace

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

}  // namespace lumacast
