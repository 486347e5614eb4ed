// Manifests of upload extensions: the whole input is one `manifest.json`, written by whoever made the extension.

#include "linux/extensions/ExtensionManifest.h"

#include <algorithm>
#include <filesystem>
#include <set>

#include "fuzz/Input.h"
#include "fuzz/Property.h"
#include "linux/system/Json.h"

namespace lumacast::fuzz {

namespace {

namespace fs = std::filesystem;

Value listOf(const std::vector<std::string>& texts) {
    Array list;
    for (const std::string& text : texts) list.emplace_back(text);
    return Value(std::move(list));
}

std::string printed(const ExtensionManifest& manifest) {
    Dictionary document{{"identifier", manifest.identifier},
                        {"extensionPoint", manifest.extensionPoint},
                        {"executable", manifest.executable},
                        {"icons", listOf(manifest.icons)},
                        {"processMode", manifest.processMode},
                        {"developmentLanguage", manifest.names.developmentLanguage},
                        {"grants", Dictionary{{"network", manifest.grants.network},
                                              {"directories", listOf(manifest.grants.directories)},
                                              {"environment", listOf(manifest.grants.environment)}}}};
    if (manifest.activationRule) document.set("activationRule", *manifest.activationRule);
    if (manifest.names.displayName) document.set("displayName", *manifest.names.displayName);
    for (const auto& [language, name] : manifest.names.localizedDisplayNames)
        document.set("displayName[" + language + "]", name);
    return jsonText(document);
}

void requirePlain(const std::string& text) {
    require(text.size() <= 1024, "a path has a limit");
    require(std::none_of(text.begin(), text.end(), [](char c) { return static_cast<unsigned char>(c) < 0x20; }),
            "a path has no control characters");
}

/// What the standard library makes of a path is the same path: nothing in it leads out, or nowhere.
void requireWithin(const std::string& path) {
    requirePlain(path);
    require((fs::path("/folder") / path).lexically_normal() == "/folder/" + path, "a path stays within its folder");
    require(!path.ends_with('/'), "a path names a file");
}

void requireSafe(const ExtensionGrants& grants) {
    static const std::set<std::string> kRefused{"PATH", "HOME", "TMPDIR", "GLIBC_TUNABLES", "LD_PRELOAD", "GCONV_PATH"};
    require(grants.directories.size() <= 32 && grants.environment.size() <= 32, "what is granted has a limit");
    for (const std::string& directory : grants.directories) {
        requirePlain(directory);
        const fs::path path(directory);
        require(path.is_absolute() && path.has_filename() && path.lexically_normal() == directory,
                "a directory is granted by its plain path");
    }
    for (const std::string& name : grants.environment) {
        require(!kRefused.contains(name) && !name.starts_with("LD_") && !name.starts_with("MALLOC_"),
                "what the loader takes orders from is never granted");
        require(!name.empty() && name.find_first_of(std::string_view("=\0 \n", 4)) == std::string::npos,
                "a variable's name can't set another one");
    }
}

void check(const ExtensionManifest& manifest) {
    require(isBundleIdentifier(manifest.identifier) && isBundleIdentifier(manifest.extensionPoint),
            "identifiers can be those of bundles");
    require(manifest.names.identifier == manifest.identifier, "there is one identifier");
    requireWithin(manifest.executable);
    require(manifest.icons.size() <= 16, "icons have a limit");
    std::for_each(manifest.icons.begin(), manifest.icons.end(), requireWithin);
    requireSafe(manifest.grants);
    (void)manifest.displayName(userLocales("de_AT", "de_AT:en"));

    const auto parsed = ExtensionManifest::parse(printed(manifest));
    const auto* again = std::get_if<ExtensionManifest>(&parsed);
    require(again, "a printed manifest is a manifest");
    require(again->identifier == manifest.identifier && again->extensionPoint == manifest.extensionPoint &&
                again->executable == manifest.executable && again->icons == manifest.icons &&
                again->processMode == manifest.processMode && again->activationRule == manifest.activationRule,
            "a printed manifest reads as the same manifest");
    require(again->names.displayName == manifest.names.displayName &&
                again->names.localizedDisplayNames == manifest.names.localizedDisplayNames,
            "and has the same names");
    require(again->grants.network == manifest.grants.network &&
                again->grants.directories == manifest.grants.directories &&
                again->grants.environment == manifest.grants.environment,
            "and is granted the same");
}

}  // namespace

void extensionManifest(Bytes input) {
    const auto parsed = ExtensionManifest::parse(textOf(input));
    if (const auto* manifest = std::get_if<ExtensionManifest>(&parsed)) return check(*manifest);
    require(!std::get<std::string>(parsed).empty(), "a manifest that is none is refused for a reason");
}

}  // namespace lumacast::fuzz
