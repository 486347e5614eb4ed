#pragma once
// What the store says about one application.

#include <optional>
#include <string>
#include <vector>

#include "base/Identifiers.h"
#include "base/Value.h"

namespace lumacast {

struct LCStoreInfo {
    std::optional<BundleIdentifier> bundleID;
    std::optional<std::string> appName;
    std::optional<std::string> author;
    std::optional<std::string> itemURL;  ///< text as the store gives it
    std::optional<std::vector<std::string>> categories;

    /// `dictionary` — one entry for each property that is set; the categories in one text, when there is any.
    Dictionary dictionary() const;
};

}  // namespace lumacast
