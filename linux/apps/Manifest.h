#pragma once
// Manifests of application folders.

#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "linux/apps/Languages.h"

namespace lumacast {

/// What `manifest.json` says: {"identifier": "org.example.Player", "name": "Player", "name[de]": "Spieler",
/// "displayName": ..., "displayName[de]": ..., "icon": "player", "developmentLanguage": "en"}. Only the identifier must be
/// there, for an application; a folder of resources may leave it out. A value.
struct Manifest {
    std::string identifier;  ///< empty when the manifest has none
    std::optional<std::string> name;
    std::optional<std::string> displayName;
    std::optional<std::string> icon;  ///< a name of the icon theme, or an absolute path
    std::vector<std::pair<std::string, std::string>> localizedNames;  ///< language tag as written, name
    std::vector<std::pair<std::string, std::string>> localizedDisplayNames;
    std::string developmentLanguage = "en";

    /// A pure parser of the whole file. None when it is not a JSON object; entries of the wrong kind are passed over,
    /// an identifier that is no name of a bundle (letters, digits, '.', '-', '_'; at most 255) counts as none.
    static std::optional<Manifest> parse(std::string_view text);

    std::optional<std::string> localizedName(const std::vector<Locale>& locales) const;
    std::optional<std::string> localizedDisplayName(const std::vector<Locale>& locales) const;
};

/// Whether a text can be a bundle identifier: letters, digits, '.', '-' and '_', 1 to 255 of them, no dot at the start.
bool isBundleIdentifier(std::string_view text);

}  // namespace lumacast
