#pragma once
// The daemon itself: whether it runs and can be reached.

#include <chrono>
#include <optional>
#include <string>

#include "client/lumacastctl/doctor/Finding.h"

namespace lumacast::ctl {

struct DaemonFacts {
    enum class Socket {
        Closed,   ///< nobody listens there
        Silent,   ///< somebody does, and says nothing, or nothing that can be understood
        Answers,
    };
    std::string runtimeDirectory;
    bool runtimeVariableIsSet = false;  ///< $XDG_RUNTIME_DIR
    bool pathFits = true;               ///< the sockets' paths are short enough for the system
    std::string adminPath, servicePath;
    Socket admin = Socket::Closed, service = Socket::Closed;
    std::optional<std::string> temporaryDirectory;  ///< as the daemon says
};

/// Asks both sockets, each for at most `patience`. What connects to the service says nothing and leaves at once.
DaemonFacts probeDaemon(const std::string& runtimeDirectory, bool runtimeVariableIsSet,
                        std::chrono::milliseconds patience);

Findings checkDaemon(const DaemonFacts& facts);

}  // namespace lumacast::ctl
