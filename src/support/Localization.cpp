#include "support/Localization.h"

namespace lumacast {

namespace {

constexpr std::string_view kTable = "Localizable";
constexpr std::string_view kTableType = "strings";

}  // namespace

std::shared_ptr<const Bundle> Localization::_lcFrameworkBundle() {
    std::call_once(frameworkOnce_, [this] { framework_ = bundles_.open(bundles_.frameworkBundlePath()); });
    return framework_;
}

std::shared_ptr<const Bundle> Localization::localizedBundle() {
    const auto framework = _lcFrameworkBundle();
    if (!framework) return nullptr;
    const auto preferred = bundles_.preferredLocalizations(framework->localizations());
    if (preferred.empty()) return nullptr;
    return bundles_.open(framework->resourcePath() + "/" + preferred.front() + ".lproj");
}

std::shared_ptr<const Bundle> Localization::fallbackBundle() {
    const auto framework = _lcFrameworkBundle();
    const auto languages = bundles_.preferredLanguages();
    if (!framework || languages.empty()) return nullptr;
    const std::string base = languages.front().substr(0, languages.front().find('-'));
    const auto path = framework->resource(kTable, kTableType, base);
    return path ? bundles_.open(path->substr(0, path->rfind('/'))) : nullptr;
}

std::optional<std::string> Localization::_lcLocalizedStringFromFrameworkBundleWithKey(std::string_view key) {
    using Finder = std::shared_ptr<const Bundle> (Localization::*)();
    for (const Finder find :
         {&Localization::localizedBundle, &Localization::fallbackBundle, &Localization::_lcFrameworkBundle})
        if (const auto bundle = (this->*find)())
            if (auto text = bundle->string(key, kTable)) return text;
    return std::nullopt;
}

std::string Localization::_lcLocalizedAppName(const Bundle& bundle) {
    if (auto name = bundle.localizedInfo(kInfoDisplayName)) return *name;
    if (auto name = bundle.info(kInfoDisplayName)) return *name;
    return bundle.info(kInfoName).value_or("");
}

std::optional<std::string> Localization::_lcLocalizedAppNameFromBundleID(const BundleIdentifier& identifier) {
    const auto bundle = bundles_.withIdentifier(identifier);
    if (!bundle) return std::nullopt;
    return _lcLocalizedAppName(*bundle);
}

std::shared_ptr<const Bundle> Localization::bundleWithPID(ProcessID pid) {
    const auto executable = bundles_.executablePath(pid);
    if (!executable) return nullptr;
    const auto path = bundles_.bundlePathForExecutable(*executable);
    return path ? bundles_.open(*path) : nullptr;
}

std::string Localization::filledIn(std::string text, std::string_view argument) {
    constexpr std::string_view kPlace = "%@";
    const auto place = text.find(kPlace);
    if (place != std::string::npos) text.replace(place, kPlace.size(), argument);
    return text;
}

BaseIdentifier Localization::baseIdentifier(std::string_view identifier) {
    const auto dot = identifier.rfind('.');
    return {std::string(dot == std::string_view::npos ? std::string_view() : identifier.substr(0, dot))};
}

}  // namespace lumacast
