#pragma once
#include <chrono>
#include <map>
#include <mutex>
#include <optional>
#include <string>

#include "base/Identifiers.h"
#include "linux/apps/ProcessImage.h"
#include "linux/system/FileDescriptor.h"

namespace lumacast {

/// The programs of processes that were looked up lately, so that a process that asks often is not looked up each time.
/// Each is kept with a handle on its process: one that has ended or runs another program is known no more, however
/// short ago it was looked up. Thread-safe; never waits for a disk.
class KnownProcesses final {
public:
    /// Where the program was started from, if it was looked up no longer ago than `freshness`.
    std::optional<std::string> path(ProcessID pid, std::chrono::steady_clock::duration freshness);
    /// Takes note of what was found through `process`, a handle on the process's folder.
    void keep(ProcessID pid, FileDescriptor process, const ProcessImage& image);

private:
    static constexpr std::size_t kMost = 256;  // descriptors held

    struct Known {
        FileDescriptor process;
        dev_t device = 0;
        ino_t file = 0;
        std::string path;
        std::chrono::steady_clock::time_point lookedUp;
    };
    std::mutex mutex_;
    std::map<ProcessID, Known> known_;
};

}  // namespace lumacast
