#include "linux/extensions/ExtensionManifest.h"

#include <algorithm>

#include "linux/system/Json.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumDepth = 8;
constexpr std::size_t kMaximumIcons = 16;
constexpr std::size_t kMaximumGrants = 32;
constexpr std::size_t kMaximumPath = 1024;

bool isPlainText(std::string_view text) {
    return text.size() <= kMaximumPath &&
           std::none_of(text.begin(), text.end(), [](unsigned char c) { return c < 0x20 || c == 0x7f; });
}

bool isVariableName(std::string_view name) {
    return !name.empty() && name.size() <= 128 && std::all_of(name.begin(), name.end(), [](char c) {
        return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '_';
    });
}

/// What the loader, the C library and language runtimes take orders from is nobody's to grant.
bool isHarmlessVariable(std::string_view name) {
    return isVariableName(name) && !name.starts_with("LD_") && name != "PATH" && name != "HOME" && name != "TMPDIR" &&
           !name.starts_with("GCONV") && !name.starts_with("MALLOC_") && name != "GLIBC_TUNABLES";
}

bool isGrantableDirectory(std::string_view path) {
    return path.starts_with('/') && path.size() > 1 && isPlainText(path) && isPathWithin(path.substr(1));
}

/// The texts of a list that `isGood`; none when it is not a list of such texts, or too long.
template <class Predicate>
std::optional<std::vector<std::string>> texts(const Value& value, std::size_t maximum, Predicate isGood) {
    const Array* list = value.as<Array>();
    if (!list || list->size() > maximum) return std::nullopt;
    std::vector<std::string> result;
    for (const Value& entry : *list) {
        const auto* text = entry.as<std::string>();
        if (!text || !isGood(*text)) return std::nullopt;
        result.push_back(*text);
    }
    return result;
}

std::optional<ExtensionGrants> grantsFrom(const Value& value) {
    const Dictionary* entries = value.as<Dictionary>();
    if (!entries) return std::nullopt;
    ExtensionGrants grants;
    for (const auto& [key, granted] : entries->entries()) {
        if (key == "network") {
            const bool* network = granted.as<bool>();
            if (!network) return std::nullopt;
            grants.network = *network;
        } else if (key == "directories") {
            auto directories = texts(granted, kMaximumGrants, isGrantableDirectory);
            if (!directories) return std::nullopt;
            grants.directories = std::move(*directories);
        } else if (key == "environment") {
            auto names = texts(granted, kMaximumGrants, isHarmlessVariable);
            if (!names) return std::nullopt;
            grants.environment = std::move(*names);
        } else {
            return std::nullopt;  // what is asked for and not known must not be taken for granted
        }
    }
    return grants;
}

const std::string* textIn(const Dictionary& entries, std::string_view key) {
    const Value* value = entries.find(key);
    return value ? value->as<std::string>() : nullptr;
}

bool isPathInFolder(std::string_view path) {
    return isPlainText(path) && isPathWithin(path);
}

}  // namespace

bool isPathWithin(std::string_view path) {
    if (path.empty() || path.size() > kMaximumPath || path.find('\0') != std::string_view::npos) return false;
    while (!path.empty()) {
        const std::size_t slash = path.find('/');
        const std::string_view component = path.substr(0, slash);
        if (component.empty() || component == "." || component == "..") return false;
        if (slash == std::string_view::npos) return true;
        path.remove_prefix(slash + 1);
    }
    return false;
}

std::variant<ExtensionManifest, std::string> ExtensionManifest::parse(std::string_view text) {
    const auto document = valueFromJson(text, kMaximumDepth);
    const Dictionary* entries = document ? document->as<Dictionary>() : nullptr;
    if (!entries) return "it is not a JSON object";
    ExtensionManifest manifest;
    const std::string* identifier = textIn(*entries, "identifier");
    if (!identifier || !isBundleIdentifier(*identifier)) return "it has no good \"identifier\"";
    manifest.identifier = *identifier;
    const std::string* point = textIn(*entries, "extensionPoint");
    if (!point || !isBundleIdentifier(*point)) return "it has no good \"extensionPoint\"";
    manifest.extensionPoint = *point;
    const std::string* executable = textIn(*entries, "executable");
    if (!executable || !isPathInFolder(*executable)) return "it has no \"executable\" within its folder";
    manifest.executable = *executable;
    if (const std::string* mode = textIn(*entries, "processMode")) manifest.processMode = *mode;
    if (const Value* rule = entries->find("activationRule")) manifest.activationRule = *rule;
    if (const Value* icons = entries->find("icons")) {
        auto paths = texts(*icons, kMaximumIcons, isPathInFolder);
        if (!paths) return "its \"icons\" are not paths within its folder";
        manifest.icons = std::move(*paths);
    }
    if (const Value* grants = entries->find("grants")) {
        auto granted = grantsFrom(*grants);
        if (!granted) return "its \"grants\" are malformed";
        manifest.grants = std::move(*granted);
    }
    if (auto names = Manifest::parse(text)) manifest.names = std::move(*names);
    return manifest;
}

std::string ExtensionManifest::displayName(const std::vector<Locale>& locales) const {
    if (auto localized = names.localizedDisplayName(locales)) return *localized;
    return names.displayName.value_or(identifier);
}

}  // namespace lumacast
