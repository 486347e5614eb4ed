#include "fuzz/Targets.h"

#include <algorithm>
#include <array>
#include <stdexcept>
#include <string>

namespace lumacast::fuzz {

namespace {

constexpr std::array kTargets{
    Target{"archives", archives},
    Target{"authority_file", authorityFile},
    Target{"broadcast_settings", broadcastSettings},
    Target{"connections", connections},
    Target{"desktop_entry", desktopEntry},
    Target{"device_info", deviceInfo},
    Target{"extension_items", extensionItems},
    Target{"extension_manifest", extensionManifest},
    Target{"frames", frames},
    Target{"manifest", manifest},
    Target{"messages", messages},
    Target{"movies", movies},
    Target{"payloads", payloads},
    Target{"preferences", preferences},
    Target{"recoveries", recoveries},
    Target{"sound_server", soundServer},
    Target{"strings_table", stringsTable},
    Target{"values", values},
};

}  // namespace

std::span<const Target> targets() {
    return kTargets;
}

const Target& targetNamed(std::string_view name) {
    const auto found =
        std::find_if(kTargets.begin(), kTargets.end(), [&](const Target& target) { return target.name == name; });
    if (found == kTargets.end()) throw std::out_of_range("no target is named " + std::string(name));
    return *found;
}

}  // namespace lumacast::fuzz
