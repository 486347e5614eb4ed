#pragma once
#include <functional>
#include <string>
#include <vector>

#include "base/Value.h"

namespace lumacast {

/// Gives a command's answer, from any lane; what is given after the first time is dropped. Holds no lane up.
using AdminAnswer = std::function<void(Dictionary)>;
/// A question that takes longer than a snapshot or changes something. Called on the main queue with the words that
/// stood behind the command's name; must not wait there.
using AdminCommand = std::function<void(const std::vector<std::string>& arguments, AdminAnswer answer)>;

/// Answers the administrator's questions about the running daemon, on a socket of its own, to the same user or the
/// administrator only.
class AdminService {
public:
    virtual ~AdminService() = default;
    /// Serves a command of this name (one word) from resume on; before resume. A command goes before an entry of the
    /// snapshot with its name. Who asks waits for the answer, up to a limit of the service.
    virtual void addCommand(std::string name, AdminCommand command) = 0;
    /// Begins to answer. `snapshot` is called on the main queue for each question and describes sessions and
    /// recordings.
    virtual void resume(std::function<Dictionary()> snapshot) = 0;
};

}  // namespace lumacast
