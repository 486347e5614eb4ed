#pragma once
// Processes of this machine, held so that a number that is used again is not taken for them.

#include <optional>
#include <vector>

#include "base/Identifiers.h"
#include "linux/ipc/Fd.h"

namespace lumacast::x11 {

/// One process. Not thread-safe to change, but ended() is callable from any thread.
class HeldProcess final {
public:
    /// None for a process that doesn't exist.
    static std::optional<HeldProcess> hold(ProcessID pid);

    ProcessID pid() const { return pid_; }
    /// Readable when the process has ended.
    int descriptor() const { return descriptor_.get(); }
    bool ended() const;

private:
    HeldProcess(ProcessID pid, Fd descriptor) : pid_(pid), descriptor_(std::move(descriptor)) {}

    ProcessID pid_;
    Fd descriptor_;
};

/// The process's parent, its parent and so on, at most 64 of them.
std::vector<ProcessID> ancestorsOf(ProcessID pid);
/// Every running process of the user that this process runs as.
std::vector<ProcessID> processesOfThisUser();

}  // namespace lumacast::x11
