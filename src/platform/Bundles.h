#pragma once
// Installed applications and resource bundles.

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/Identifiers.h"
#include "base/Value.h"

namespace lumacast {

/// One bundle: an installed application, or a folder of resources. Immutable; shared.
class Bundle {
public:
    virtual ~Bundle() = default;
    /// None for a plain resource folder.
    virtual std::optional<BundleIdentifier> identifier() const = 0;
    /// A text of the information dictionary in the user's language, e.g. "DisplayName"; none when it has none.
    virtual std::optional<std::string> localizedInfo(std::string_view key) const = 0;
    /// The same from the plain information dictionary.
    virtual std::optional<std::string> info(std::string_view key) const = 0;
    /// The folder with the resources, without a slash at its end.
    virtual std::string resourcePath() const = 0;
    /// The localizations the bundle has, e.g. "en", "pt-BR" (its "*.lproj" folders).
    virtual std::vector<std::string> localizations() const = 0;
    /// The path of the resource `name`.`type` for `localization`, or none.
    virtual std::optional<std::string> resource(std::string_view name, std::string_view type,
                                                std::string_view localization) const = 0;
    /// The text of `key` in the strings table `table`: of this folder when the bundle is a language folder, else of the
    /// bundle's development language. None when the table or the key is not there (never the key's own text).
    virtual std::optional<std::string> string(std::string_view key, std::string_view table) const = 0;
};

inline constexpr std::string_view kInfoDisplayName = "DisplayName";
inline constexpr std::string_view kInfoName = "Name";
/// A name of the icon theme, or an absolute path. The bundle says it of itself.
inline constexpr std::string_view kInfoIcon = "Icon";

/// Which of an application's icons is meant: how large it is shown.
enum class IconFormat : std::int32_t { Small = 0, Medium = 1, Large = 2 };

/// Finds bundles. Answers from memory or within 100 ms; callable from any lane. A missing thing answers null or none.
class Bundles {
public:
    virtual ~Bundles() = default;
    /// The path of the executable of a running process (at most 4096 bytes), or none.
    virtual std::optional<std::string> executablePath(ProcessID pid) = 0;
    /// The path of the bundle that contains this executable, or none.
    virtual std::optional<std::string> bundlePathForExecutable(const std::string& path) = 0;
    /// Opens the bundle, or the language folder, at a path.
    virtual std::shared_ptr<const Bundle> open(const std::string& path) = 0;
    virtual std::shared_ptr<const Bundle> withIdentifier(const BundleIdentifier& identifier) = 0;
    /// `_applicationIconImageForBundleIdentifier:format:` — the application's icon as a PNG file, or none. Reads the disk.
    virtual std::optional<Data> applicationIcon(const BundleIdentifier& identifier, IconFormat format) = 0;
    /// The fixed path of the client framework's resource bundle.
    virtual std::string frameworkBundlePath() = 0;
    /// The user's languages, most wanted first, as language tags ("pt-BR"). Never empty.
    virtual std::vector<std::string> preferredLanguages() = 0;
    /// Those of `available` that suit the user's languages, best first; empty when none does.
    virtual std::vector<std::string> preferredLocalizations(const std::vector<std::string>& available) = 0;
};

}  // namespace lumacast
