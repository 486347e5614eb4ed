#pragma once
// Applications with windows, in processes of their own.

#include <memory>
#include <string>

#include "base/Identifiers.h"
#include "tests/contract/PrivateDisplay.h"

namespace lumacast::test {

/// Another process with one window of 200x150, mapped, which has a tool without windows for a child. Ends with this
/// object.
class XClientProcess final {
public:
    explicit XClientProcess(const std::string& display);

    /// 0 when the process did not get so far.
    ContextID window() const { return window_; }
    ProcessID pid() const { return ProcessID{process_->pid()}; }
    ProcessID tool() const { return tool_; }
    /// Ends the process and its tool at once.
    void end() { process_->end(SIGKILL); }

private:
    std::unique_ptr<ChildProcess> process_;
    ContextID window_{0};
    ProcessID tool_{0};
};

}  // namespace lumacast::test
