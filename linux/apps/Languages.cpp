#include "linux/apps/Languages.h"

#include <algorithm>

namespace lumacast {

namespace {

constexpr std::size_t kMaximumLocales = 32;

char lower(char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; }

bool isWord(std::string_view text) {
    return std::all_of(text.begin(), text.end(), [](char c) {
        return (lower(c) >= 'a' && lower(c) <= 'z') || (c >= '0' && c <= '9') || c == '-';
    });
}

std::string normalized(std::string_view tag) {
    std::string result(tag);
    std::transform(result.begin(), result.end(), result.begin(), [](char c) { return c == '_' ? '-' : lower(c); });
    return result;
}

void add(std::vector<Locale>& locales, std::string_view name) {
    Locale locale = parseLocale(name);
    if (locale.language.empty() || locales.size() == kMaximumLocales) return;
    if (std::find(locales.begin(), locales.end(), locale) == locales.end()) locales.push_back(std::move(locale));
}

}  // namespace

Locale parseLocale(std::string_view name) {
    Locale locale;
    if (const auto at = name.find('@'); at != std::string_view::npos) {
        locale.modifier = name.substr(at + 1);
        name = name.substr(0, at);
    }
    name = name.substr(0, name.find('.'));
    if (const auto underscore = name.find('_'); underscore != std::string_view::npos) {
        locale.country = name.substr(underscore + 1);
        name = name.substr(0, underscore);
    }
    const bool valid = name.size() >= 2 && name.size() <= 8 && isWord(name) && isWord(locale.country) &&
                       isWord(locale.modifier) && normalized(name) != "posix";
    if (!valid) return {};
    locale.language = name;
    return locale;
}

std::string languageTag(const Locale& locale) {
    std::string tag = locale.language;
    if (locale.modifier == "latin") tag += "-Latn";
    if (locale.modifier == "cyrillic") tag += "-Cyrl";
    if (!locale.country.empty()) tag += "-" + locale.country;
    return tag;
}

std::vector<Locale> userLocales(std::string_view languageList, std::string_view messageLocale) {
    std::vector<Locale> locales;
    const std::string_view name = messageLocale.substr(0, messageLocale.find('.'));
    if (name != "C" && name != "POSIX") {
        while (!languageList.empty()) {
            const std::size_t colon = languageList.find(':');
            add(locales, languageList.substr(0, colon));
            languageList.remove_prefix(colon == std::string_view::npos ? languageList.size() : colon + 1);
        }
    }
    add(locales, messageLocale);
    if (locales.empty()) locales.push_back({"en", "", ""});
    return locales;
}

std::vector<std::string> matchingLocalizations(const std::vector<std::string>& wanted,
                                               const std::vector<std::string>& available) {
    std::vector<std::string> result;
    const auto take = [&](auto&& suits) {
        for (const std::string& candidate : available)
            if (suits(normalized(candidate)) && std::find(result.begin(), result.end(), candidate) == result.end())
                result.push_back(candidate);
    };
    for (const std::string& language : wanted) {
        std::string tag = normalized(language);
        const bool bare = tag.find('-') == std::string::npos;
        while (true) {
            take([&](const std::string& candidate) { return candidate == tag; });
            const std::size_t dash = tag.rfind('-');
            if (dash == std::string::npos) break;
            tag.resize(dash);
        }
        if (bare) take([&](const std::string& candidate) { return candidate.starts_with(tag + "-"); });
    }
    return result;
}

}  // namespace lumacast
