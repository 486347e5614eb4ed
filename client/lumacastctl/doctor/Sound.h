#pragma once
// The sound server: the daemon speaks to PulseAudio's socket, which PipeWire has too where its pulse server runs.

#include <optional>
#include <string>
#include <vector>

#include "client/lumacastctl/doctor/Finding.h"
#include "linux/system/LinuxEnvironment.h"

namespace lumacast::ctl {

struct SoundFacts {
    struct Socket {
        std::string server;  ///< "PulseAudio" or "PipeWire"
        std::string path;
        bool answers = false;  ///< somebody listens there
    };
    std::vector<Socket> sockets;  ///< where servers are looked for, all of them
};

/// Never blocks.
SoundFacts probeSound(const LinuxEnvironment::Variables& variables);

Findings checkSound(const SoundFacts& facts);

}  // namespace lumacast::ctl
