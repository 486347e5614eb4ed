#pragma once
// The system's texts, and the names of applications, in the user's language.

#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "base/Identifiers.h"
#include "platform/Bundles.h"

namespace lumacast {

/// A bundle identifier without its last component, see Localization::baseIdentifier.
struct BaseIdentifier {
    std::string text;
    bool operator==(const BaseIdentifier&) const = default;
};

/// Finds the client framework's resource bundle, picks the language and looks texts up. Callable from any lane; blocks
/// no longer than the Bundles role.
class Localization {
public:
    explicit Localization(Bundles& bundles) : bundles_(bundles) {}

    /// `_lcFrameworkBundle` — the client framework's resource bundle, opened once and kept; null when it is not
    /// installed.
    std::shared_ptr<const Bundle> _lcFrameworkBundle();
    /// `localizedBundle` — its language folder that best matches the user's preferred languages, or null.
    std::shared_ptr<const Bundle> localizedBundle();
    /// `fallbackBundle` — its language folder for the base language of the user's first preferred language, or null.
    std::shared_ptr<const Bundle> fallbackBundle();
    /// `_lcLocalizedStringFromFrameworkBundleWithKey:` — the text of the table "Localizable": from localizedBundle,
    /// else fallbackBundle, else the framework bundle itself. None when all three lack it.
    std::optional<std::string> _lcLocalizedStringFromFrameworkBundleWithKey(std::string_view key);

    /// `_lcLocalizedAppName` — the bundle's display name in the user's language, else the plain one, else the bundle's
    /// name, else "".
    static std::string _lcLocalizedAppName(const Bundle& bundle);
    /// `_lcLocalizedAppNameFromBundleID:` — the same for an installed bundle; none when it can't be found.
    std::optional<std::string> _lcLocalizedAppNameFromBundleID(const BundleIdentifier& identifier);
    /// `bundleWithPID:` — the bundle of the process's executable, or null.
    std::shared_ptr<const Bundle> bundleWithPID(ProcessID pid);
    /// A text with its first "%@" replaced by the argument.
    static std::string filledIn(std::string text, std::string_view argument);
    /// `baseIdentifier:` — the identifier without its last dot-separated component ("a.b.c" gives "a.b", "x" gives "").
    static BaseIdentifier baseIdentifier(std::string_view identifier);

private:
    Bundles& bundles_;
    std::once_flag frameworkOnce_;
    std::shared_ptr<const Bundle> framework_;
};

}  // namespace lumacast
