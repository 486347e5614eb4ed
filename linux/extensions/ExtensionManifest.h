#pragma once
// Manifests of installed extensions.

#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "base/Value.h"
#include "linux/apps/Manifest.h"

namespace lumacast {

/// What an extension asks to be let through its sandbox.
struct ExtensionGrants {
    bool network = true;
    std::vector<std::string> directories;  ///< absolute, without ".."; it may write there
    std::vector<std::string> environment;  ///< names of variables of the daemon's that it may see
};

/// What `manifest.json` of an extension says; README.md has the format. A value.
struct ExtensionManifest {
    std::string identifier;
    std::string extensionPoint;
    std::string executable;               ///< a path within the folder
    std::vector<std::string> icons;       ///< paths within the folder, the best one first
    std::string processMode;              ///< as written; may be empty
    std::optional<Value> activationRule;  ///< as written: one that is no dictionary counts as none to whoever reads it
    Manifest names;                       ///< displayName and its translations
    ExtensionGrants grants;

    /// A pure parser of the whole file. The text says why a manifest is none.
    static std::variant<ExtensionManifest, std::string> parse(std::string_view text);

    /// Its name in the first of these languages it has, else its plain name, else its identifier.
    std::string displayName(const std::vector<Locale>& locales) const;
};

/// Whether a path stays below the folder it is taken from: relative, with no empty component, "." or "..".
bool isPathWithin(std::string_view path);

}  // namespace lumacast
