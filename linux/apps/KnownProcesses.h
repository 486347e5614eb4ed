#pragma once
#include <chrono>
#include <map>
#include <mutex>
#include <optional>
#include <string>

#include "base/Identifiers.h"
#include "linux/apps/ProcessImage.h"
#include "linux/ipc/Fd.h"

namespace lumacast {

/// The programs of processes that were looked up lately, so that a process that asks often is not looked up each time.
/// A process that has ended or runs another program is known no more, however short ago it was looked up: its folder in
/// /proc has an inode of its own, and the program another file. Thread-safe; never waits for a disk; holds no
/// descriptors.
class KnownProcesses final {
public:
    /// Where the program was started from, if it was looked up no longer ago than `freshness`.
    std::optional<std::string> path(ProcessID pid, std::chrono::steady_clock::duration freshness);
    /// Takes note of what was found through `process`, a handle on the process's folder.
    void keep(ProcessID pid, const Fd& process, const ProcessImage& image);

private:
    static constexpr std::size_t kMost = 1024;

    struct Known {
        ino_t folder = 0;
        dev_t device = 0;
        ino_t file = 0;
        std::string path;
        std::chrono::steady_clock::time_point lookedUp;
    };
    std::mutex mutex_;
    std::map<ProcessID, Known> known_;
};

}  // namespace lumacast
