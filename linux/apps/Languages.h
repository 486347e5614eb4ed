#pragma once
// The user's languages, as the environment gives them and as language tags.

#include <string>
#include <string_view>
#include <vector>

namespace lumacast {

/// A locale's name in its parts: `language_COUNTRY@modifier` (the encoding is left out).
struct Locale {
    std::string language;
    std::string country;
    std::string modifier;
    bool operator==(const Locale&) const = default;
};

/// Reads a locale's name, e.g. "pt_BR.UTF-8" or "sr_RS@latin". The language is empty for "C", "POSIX" and anything that
/// is not a name.
Locale parseLocale(std::string_view name);

/// The language tag of a locale (BCP 47): "pt-BR", "sr-Latn-RS". Modifiers that name no script are left out.
std::string languageTag(const Locale& locale);

/// The user's locales, most wanted first: those of $LANGUAGE (separated by colons), then the message locale. A message
/// locale of "C" or "POSIX" switches $LANGUAGE off, as it does for every other program. English when nothing is left,
/// so never empty.
std::vector<Locale> userLocales(std::string_view languageList, std::string_view messageLocale);

/// Those of `available` (tags or locale names) that suit the languages `wanted`, best first: for each wanted language
/// the same tag, then the tag shortened from its end ("de-AT", "de"), then, for a language wanted without a country,
/// any of its variants. Upper and lower case, '-' and '_' count as the same. Each answer is spelled as in `available`.
std::vector<std::string> matchingLocalizations(const std::vector<std::string>& wanted,
                                               const std::vector<std::string>& available);

}  // namespace lumacast
