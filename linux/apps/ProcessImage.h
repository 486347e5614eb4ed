#pragma once
#include <sys/stat.h>

#include <optional>
#include <string>

#include "base/Identifiers.h"
#include "linux/ipc/Fd.h"

namespace lumacast {

/// The program a process runs.
struct ProcessImage {
    std::string path;        ///< where it was started from
    bool deleted = false;    ///< that file is gone, or another one has taken its place (a package was updated)
    struct stat status = {};  ///< of the image itself
};

/// The image of a running process, from /proc. None for a process that is gone (all is read through one handle, so it
/// is never another one that took its number), that is a kernel thread or another user's, whose path is longer than
/// 4096 bytes or not UTF-8, whose image never had a path, or that lives in a mount namespace where the path names
/// another file than it does here. Callable from any lane; waits for the disk that holds the program.
std::optional<ProcessImage> processImage(ProcessID pid);

/// The same in two steps: a handle on the process's folder in /proc, good for that process alone; and its image.
Fd openProcess(ProcessID pid);
std::optional<ProcessImage> processImage(const Fd& process);

}  // namespace lumacast
