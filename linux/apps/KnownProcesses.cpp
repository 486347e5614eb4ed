#include "linux/apps/KnownProcesses.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

namespace lumacast {

namespace {

/// What the kernel knows of a file already: a file server is not asked.
std::optional<struct statx> look(const std::string& path) {
    struct statx now = {};
    return ::statx(AT_FDCWD, path.c_str(), AT_STATX_DONT_SYNC, STATX_INO, &now) == 0 ? std::optional(now) : std::nullopt;
}

}  // namespace

std::optional<std::string> KnownProcesses::path(ProcessID pid, std::chrono::steady_clock::duration freshness) {
    const std::lock_guard lock(mutex_);
    const auto found = known_.find(pid);
    if (found == known_.end()) return std::nullopt;
    const Known& known = found->second;
    const std::string folder = "/proc/" + std::to_string(number(pid));
    const auto process = look(folder), program = look(folder + "/exe");
    const bool runs = process && program && process->stx_ino == known.folder &&
                      makedev(program->stx_dev_major, program->stx_dev_minor) == known.device &&
                      program->stx_ino == known.file;
    if (runs && std::chrono::steady_clock::now() - known.lookedUp <= freshness) return known.path;
    known_.erase(found);
    return std::nullopt;
}

void KnownProcesses::keep(ProcessID pid, const Fd& process, const ProcessImage& image) {
    struct stat folder = {};
    if (::fstat(process.get(), &folder) != 0) return;
    const std::lock_guard lock(mutex_);
    if (known_.size() >= kMost && !known_.contains(pid)) known_.clear();
    known_[pid] = {folder.st_ino, image.status.st_dev, image.status.st_ino, image.path,
                   std::chrono::steady_clock::now()};
}

}  // namespace lumacast
