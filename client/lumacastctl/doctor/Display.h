#pragma once
// The display whose windows are to be recorded.

#include <chrono>
#include <compare>
#include <cstdint>
#include <optional>
#include <string>

#include "client/lumacastctl/doctor/Finding.h"
#include "linux/system/LinuxEnvironment.h"

namespace lumacast::ctl {

/// What there is to know of the display, gathered by probeDisplay, judged by checkDisplay.
struct DisplayFacts {
    enum class Reach {
        NotLocal,   ///< named by another machine's name, or not a display's name at all
        NoServer,   ///< nobody listens there, or this user is not let in
        NoAnswer,   ///< somebody listens and says nothing
        Connected,
    };
    struct Version {
        std::uint32_t major = 0, minor = 0;
        auto operator<=>(const Version&) const = default;
    };

    bool isWaylandSession = false;
    std::string name;  ///< $DISPLAY; empty when it is not set
    Reach reach = Reach::NoServer;
    // Only when connected; an extension the server lacks has no version.
    std::optional<Version> composite, damage, fixes, sharedMemory, resources;
    bool takesMemoryByDescriptor = false;  ///< it was given some, and took it
    std::uint32_t width = 0, height = 0;   ///< pixels
    bool pixelsAreBgrx = false;            ///< 32 bits a pixel in memory: blue, green, red, unused
};

/// Asks the display server, for at most `patience`.
DisplayFacts probeDisplay(const LinuxEnvironment::Variables& variables, std::chrono::milliseconds patience);

Findings checkDisplay(const DisplayFacts& facts);

}  // namespace lumacast::ctl
