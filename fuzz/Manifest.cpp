// Manifests of application folders (`manifest.json`), and JSON in general: the whole input is one file.

#include "linux/apps/Manifest.h"

#include "fuzz/Input.h"
#include "fuzz/Property.h"
#include "linux/system/Json.h"

namespace lumacast::fuzz {

namespace {

std::size_t depthOf(const Value& value) {
    std::size_t below = 0;
    if (const auto* items = value.as<Array>()) {
        for (const Value& item : *items) below = std::max(below, depthOf(item));
    } else if (const auto* entries = value.as<Dictionary>()) {
        for (const auto& [key, item] : entries->entries()) below = std::max(below, depthOf(item));
    } else {
        return 0;
    }
    return below + 1;
}

std::string printed(const Manifest& manifest) {
    Dictionary document{{"identifier", manifest.identifier}, {"developmentLanguage", manifest.developmentLanguage}};
    if (manifest.name) document.set("name", *manifest.name);
    if (manifest.displayName) document.set("displayName", *manifest.displayName);
    for (const auto& [language, name] : manifest.localizedNames) document.set("name[" + language + "]", name);
    for (const auto& [language, name] : manifest.localizedDisplayNames)
        document.set("displayName[" + language + "]", name);
    return jsonText(document);
}

void checkManifest(const Manifest& manifest) {
    require(manifest.identifier.empty() || isBundleIdentifier(manifest.identifier), "an identifier is one");
    require(isBundleIdentifier(manifest.developmentLanguage), "a language can't leave its folder");
    require(manifest.localizedNames.size() <= 512 && manifest.localizedDisplayNames.size() <= 512,
            "a manifest has at most 512 translations");
    const auto again = Manifest::parse(printed(manifest));
    require(again.has_value(), "a printed manifest is a manifest");
    require(again->identifier == manifest.identifier && again->name == manifest.name &&
                again->displayName == manifest.displayName && again->localizedNames == manifest.localizedNames &&
                again->localizedDisplayNames == manifest.localizedDisplayNames &&
                again->developmentLanguage == manifest.developmentLanguage,
            "a printed manifest reads as the same manifest");
    for (const char* language : {"en", "de_AT", "pt_BR", "sr_RS@latin"}) {
        const std::vector<Locale> locales = userLocales(language, language);
        (void)manifest.localizedName(locales);
        (void)manifest.localizedDisplayName(locales);
    }
}

}  // namespace

void manifest(Bytes input) {
    const std::string_view text = textOf(input);
    if (const auto value = valueFromJson(text)) {
        require(depthOf(*value) <= 16, "a document is at most 16 deep");
        const auto again = valueFromJson(jsonText(*value));
        require(again.has_value(), "a printed document is a document");
        require(*again == *value, "a printed document reads as the same document");
    }
    const auto parsed = Manifest::parse(text);
    if (parsed) checkManifest(*parsed);
}

}  // namespace lumacast::fuzz
