#pragma once
// The user's and the administrator's preferences of the daemon.

#include <optional>
#include <string>
#include <vector>

#include "base/Value.h"
#include "client/lumacastctl/doctor/Finding.h"

namespace lumacast::ctl {

struct PreferenceFacts {
    struct File {
        enum class State {
            Missing,
            Read,
            Unreadable,  ///< there, but not readable, no file, or too large: the daemon takes it for missing
        };
        std::string path;
        State state = State::Missing;
    };
    struct Preference {
        std::optional<Value> value;  ///< as the daemon gets it
        std::string path;            ///< the file that decides; empty when none has it
    };
    std::vector<File> files;  ///< the most important first, the user's own
    Preference suppressAlert, bitRate, fullResolution;
};

/// `configDirectories` as LinuxEnvironment has them. Blocks as long as the disk does.
PreferenceFacts probePreferences(const std::vector<std::string>& configDirectories);

Findings checkPreferences(const PreferenceFacts& facts);

}  // namespace lumacast::ctl
