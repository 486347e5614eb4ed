#pragma once
// The daemon's texts, in the user's languages.

#include <optional>
#include <string>
#include <vector>

#include "client/lumacastctl/doctor/Finding.h"
#include "platform/Bundles.h"

namespace lumacast::ctl {

struct ResourceFacts {
    std::string path;  ///< where the bundle is, or would be installed
    std::optional<std::vector<std::string>> localizations;  ///< none when there is no bundle
    std::vector<std::string> languages;  ///< the user's, most wanted first
    std::vector<std::string> suitable;   ///< those of `localizations` that suit them
    std::string dataHome;                ///< the user's own data directory
};

/// Asks as the daemon does.
ResourceFacts probeResources(Bundles& bundles, const std::string& dataHome);

Findings checkResources(const ResourceFacts& facts);

}  // namespace lumacast::ctl
