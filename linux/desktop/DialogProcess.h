#pragma once
#include <sys/types.h>

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "linux/desktop/DialogProgram.h"
#include "linux/ipc/Fd.h"

namespace lumacast {

/// One dialog program that runs, in a process group of its own, with nothing of this process but its output. It dies
/// with the thread that started it, and so with this process. Of that thread alone. Destroying it ends the whole group
/// and leaves no zombie.
class DialogProcess final {
public:
    struct Command {
        std::string path;
        std::vector<std::string> arguments;    ///< the program's name first
        std::vector<std::string> environment;  ///< "NAME=value", nothing else is passed on
    };

    /// Null when it can't be started: the program is not there or can't be run, or there are no more processes. Waits
    /// for the start, not for the program.
    static std::unique_ptr<DialogProcess> start(const Command& command);
    ~DialogProcess();
    DialogProcess(const DialogProcess&) = delete;
    DialogProcess& operator=(const DialogProcess&) = delete;

    pid_t pid() const { return pid_; }
    /// Readable when the program has ended.
    int descriptor() const { return process_.get(); }
    /// Readable when it has printed something; -1 when it won't print any more.
    int output() const { return output_.get(); }

    /// Takes what was printed. False when it is more than any button prints.
    [[nodiscard]] bool readOutput();
    /// How it ended; waits for that. None when that can't be told.
    std::optional<DialogEnd> end();

private:
    DialogProcess(pid_t pid, Fd process, Fd output)
        : pid_(pid), process_(std::move(process)), output_(std::move(output)) {}

    const pid_t pid_;
    bool reaped_ = false;
    Fd process_;
    Fd output_;
    std::string printed_;
};

}  // namespace lumacast
