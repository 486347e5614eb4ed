#include "linux/apps/KnownProcesses.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

namespace lumacast {

std::optional<std::string> KnownProcesses::path(ProcessID pid, std::chrono::steady_clock::duration freshness) {
    const std::lock_guard lock(mutex_);
    const auto found = known_.find(pid);
    if (found == known_.end()) return std::nullopt;
    const Known& known = found->second;
    struct statx now = {};
    // What the kernel knows of the program already will do: a file server is not asked.
    const bool runs = ::statx(known.process.get(), "exe", AT_STATX_DONT_SYNC, STATX_INO, &now) == 0 &&
                      makedev(now.stx_dev_major, now.stx_dev_minor) == known.device && now.stx_ino == known.file;
    if (runs && std::chrono::steady_clock::now() - known.lookedUp <= freshness) return known.path;
    known_.erase(found);
    return std::nullopt;
}

void KnownProcesses::keep(ProcessID pid, FileDescriptor process, const ProcessImage& image) {
    const std::lock_guard lock(mutex_);
    if (known_.size() >= kMost && !known_.contains(pid)) known_.clear();
    known_[pid] = {std::move(process), image.status.st_dev, image.status.st_ino, image.path,
                   std::chrono::steady_clock::now()};
}

}  // namespace lumacast
