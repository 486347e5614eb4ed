#include "linux/apps/Manifest.h"

#include <algorithm>

#include "linux/system/Json.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumTranslations = 512;

using Translations = std::vector<std::pair<std::string, std::string>>;

/// "name[de]" for the key "name" gives "de".
std::optional<std::string> languageOf(std::string_view key, std::string_view entry) {
    if (!entry.starts_with(key) || !entry.ends_with(']')) return std::nullopt;
    entry.remove_prefix(key.size());
    if (entry.size() < 3 || entry.front() != '[') return std::nullopt;
    return std::string(entry.substr(1, entry.size() - 2));
}

std::optional<std::string> best(const Translations& translations, const std::vector<Locale>& locales) {
    std::vector<std::string> available;
    for (const auto& [language, text] : translations) available.push_back(language);
    for (const Locale& locale : locales) {
        const auto matches = matchingLocalizations({languageTag(locale)}, available);
        for (const auto& [language, text] : translations)
            if (!matches.empty() && language == matches.front()) return text;
        if (locale.language == "en") return std::nullopt;  // the plain text counts as English
    }
    return std::nullopt;
}

}  // namespace

bool isBundleIdentifier(std::string_view text) {
    if (text.empty() || text.size() > 255 || text.front() == '.') return false;
    return std::all_of(text.begin(), text.end(), [](char c) {
        return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '.' || c == '-' ||
               c == '_';
    });
}

std::optional<Manifest> Manifest::parse(std::string_view text) {
    const auto document = valueFromJson(text);
    const Dictionary* entries = document ? document->as<Dictionary>() : nullptr;
    if (!entries) return std::nullopt;
    Manifest manifest;
    for (const auto& [key, value] : entries->entries()) {
        const std::string* string = value.as<std::string>();
        if (!string) continue;
        if (key == "identifier" && isBundleIdentifier(*string)) manifest.identifier = *string;
        if (key == "name") manifest.name = *string;
        if (key == "icon") manifest.icon = *string;
        if (key == "displayName") manifest.displayName = *string;
        if (key == "developmentLanguage" && isBundleIdentifier(*string)) manifest.developmentLanguage = *string;
        if (const auto language = languageOf("name", key);
            language && manifest.localizedNames.size() < kMaximumTranslations)
            manifest.localizedNames.emplace_back(*language, *string);
        if (const auto language = languageOf("displayName", key);
            language && manifest.localizedDisplayNames.size() < kMaximumTranslations)
            manifest.localizedDisplayNames.emplace_back(*language, *string);
    }
    return manifest;
}

std::optional<std::string> Manifest::localizedName(const std::vector<Locale>& locales) const {
    return best(localizedNames, locales);
}

std::optional<std::string> Manifest::localizedDisplayName(const std::vector<Locale>& locales) const {
    return best(localizedDisplayNames, locales);
}

}  // namespace lumacast
