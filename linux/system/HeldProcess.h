#pragma once
#include <optional>
#include <utility>

#include "base/Identifiers.h"
#include "linux/ipc/Fd.h"

namespace lumacast {

/// One process of this machine, held so that a number that is used again is not taken for it. Not thread-safe to change,
/// but hasEnded() is callable from any thread. Waits for nobody.
class HeldProcess final {
public:
    /// None for a process that does not run, and where the system has no descriptor left.
    static std::optional<HeldProcess> hold(ProcessID pid);

    ProcessID pid() const { return pid_; }
    /// Readable when the process has ended.
    int descriptor() const { return descriptor_.get(); }
    bool hasEnded() const;

private:
    HeldProcess(ProcessID pid, Fd descriptor) : pid_(pid), descriptor_(std::move(descriptor)) {}

    ProcessID pid_;
    Fd descriptor_;
};

}  // namespace lumacast
