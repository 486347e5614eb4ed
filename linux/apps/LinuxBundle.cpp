#include "linux/apps/LinuxBundle.h"

#include <algorithm>

#include "linux/apps/ApplicationFiles.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumLocalizations = 64;
constexpr std::size_t kMaximumFiles = 256;
constexpr std::size_t kMaximumTableBytes = 256 * 1024;
constexpr std::string_view kLanguageFolder = ".lproj";
constexpr std::string_view kTable = ".strings";

std::optional<std::string> find(const Information& information, std::string_view key) {
    const auto found = information.find(key);
    return found == information.end() ? std::nullopt : std::optional(found->second);
}

void set(Information& information, std::string_view key, const std::optional<std::string>& text) {
    if (text) information.emplace(key, *text);
}

void readTables(BundleContents& contents, std::vector<std::string>& sources, const std::string& folder,
                const std::vector<std::string>& names) {
    for (const std::string& name : names) {
        if (!name.ends_with(kTable)) continue;
        sources.push_back(folder + "/" + name);
        if (const auto file = readSmallFile(sources.back(), kMaximumTableBytes))
            contents.tables.emplace(name.substr(0, name.size() - kTable.size()), StringsTable::parse(file->text));
    }
}

}  // namespace

std::optional<std::string> LinuxBundle::localizedInfo(std::string_view key) const {
    return find(contents_.localizedInfo, key);
}

std::optional<std::string> LinuxBundle::info(std::string_view key) const { return find(contents_.info, key); }

std::optional<std::string> LinuxBundle::resource(std::string_view name, std::string_view type,
                                                 std::string_view localization) const {
    const auto folder = contents_.files.find(localization);
    if (folder == contents_.files.end()) return std::nullopt;
    const std::string file = std::string(name) + "." + std::string(type);
    if (std::find(folder->second.begin(), folder->second.end(), file) == folder->second.end()) return std::nullopt;
    return contents_.resourcePath + "/" + folder->first + std::string(kLanguageFolder) + "/" + file;
}

std::optional<std::string> LinuxBundle::string(std::string_view key, std::string_view table) const {
    const auto found = contents_.tables.find(table);
    const std::string* text = found == contents_.tables.end() ? nullptr : found->second.find(key);
    return text ? std::optional(*text) : std::nullopt;
}

OpenedBundle openDesktopEntry(const std::string& path, const std::string& identifier,
                              const std::vector<Locale>& locales) {
    const auto entry = readDesktopEntry(path);
    if (!entry || !entry->isApplication || entry->hidden || !isBundleIdentifier(identifier)) return {};
    BundleContents contents;
    contents.identifier = BundleIdentifier(identifier);
    contents.resourcePath = path.substr(0, path.rfind('/'));
    for (const std::string_view key : {kInfoDisplayName, kInfoName}) {
        set(contents.localizedInfo, key, entry->localizedName(locales));
        if (!entry->name.empty()) set(contents.info, key, entry->name);
    }
    if (!entry->icon.empty()) contents.info.emplace(kInfoIcon, entry->icon);
    return {std::make_shared<const LinuxBundle>(std::move(contents)), {path}};
}

OpenedBundle openFolder(const std::string& path, const std::vector<Locale>& locales) {
    const auto names = namesIn(path, kMaximumFiles);
    if (!names) return {};
    std::vector<std::string> sources{path};
    BundleContents contents;
    contents.resourcePath = path;
    if (path.ends_with(kLanguageFolder)) {
        readTables(contents, sources, path, *names);
        return {std::make_shared<const LinuxBundle>(std::move(contents)), std::move(sources)};
    }
    sources.push_back(path + "/" + std::string(kManifestName));
    const Manifest manifest = readManifest(path).value_or(Manifest());
    if (!manifest.identifier.empty()) contents.identifier = BundleIdentifier(manifest.identifier);
    set(contents.info, kInfoName, manifest.name);
    set(contents.info, kInfoDisplayName, manifest.displayName);
    set(contents.info, kInfoIcon, manifest.icon);
    set(contents.localizedInfo, kInfoName, manifest.localizedName(locales));
    // A translated name is worth more to a user than a display name in another language.
    const auto localized = manifest.localizedDisplayName(locales);
    set(contents.localizedInfo, kInfoDisplayName, localized ? localized : manifest.localizedName(locales));
    for (const std::string& name : *names) {
        if (!name.ends_with(kLanguageFolder) || contents.localizations.size() == kMaximumLocalizations) continue;
        const std::string folder = path + "/" + name;
        auto files = namesIn(folder, kMaximumFiles);
        if (!files) continue;
        sources.push_back(folder);
        const std::string localization = name.substr(0, name.size() - kLanguageFolder.size());
        if (localization == manifest.developmentLanguage) readTables(contents, sources, folder, *files);
        contents.localizations.push_back(localization);
        contents.files.emplace(localization, std::move(*files));
    }
    return {std::make_shared<const LinuxBundle>(std::move(contents)), std::move(sources)};
}

}  // namespace lumacast
