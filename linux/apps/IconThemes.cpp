#include "linux/apps/IconThemes.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdlib>
#include <string_view>

#include "linux/system/SmallFile.h"
#include "linux/system/ThemeFiles.h"

namespace lumacast {

namespace {

constexpr const char* kDefaultTheme = "hicolor";
constexpr std::size_t kMaximumThemes = 16;
constexpr std::size_t kMaximumFolders = 1024;
constexpr std::size_t kMaximumIconBytes = 1024 * 1024;
constexpr std::string_view kPng("\x89PNG\r\n\x1a\n", 8);
constexpr std::string_view kEnding = ".png";

struct Setting {
    const char* file;
    const char* section;
    const char* key;
};
constexpr std::array kThemeSettings{Setting{"kdeglobals", "Icons", "Theme"},
                                    Setting{"gtk-4.0/settings.ini", "Settings", "gtk-icon-theme-name"},
                                    Setting{"gtk-3.0/settings.ini", "Settings", "gtk-icon-theme-name"}};

int numberIn(const IniFile& index, const std::string& section, const char* key, int otherwise) {
    const std::string* text = index.find(section, key);
    const auto number = text ? wholeNumber(*text) : std::nullopt;
    return number && *number > 0 && *number <= 4096 ? static_cast<int>(*number) : otherwise;
}

}  // namespace

struct IconThemes::Folder {
    std::string path;
    int smallest = 0, largest = 0;  ///< the sizes its icons are for

    int distance(int size) const { return size < smallest ? smallest - size : size > largest ? size - largest : 0; }
};

struct IconThemes::Theme {
    std::string name;
    std::vector<Folder> folders;
    std::vector<std::string> parents;
};

std::string IconThemes::currentTheme() const {
    for (const Setting& setting : kThemeSettings)
        for (const std::string& directory : configDirectories) {
            const auto settings = settingsAt(directory + "/" + setting.file);
            const std::string* const theme = settings ? settings->find(setting.section, setting.key) : nullptr;
            if (theme && isPlainName(*theme)) return *theme;
        }
    return kDefaultTheme;
}

std::vector<std::string> IconThemes::places() const {
    std::vector<std::string> places;
    if (!home.empty()) places.push_back(home + "/.icons");
    for (const std::string& directory : dataDirectories) places.push_back(directory + "/icons");
    return places;
}

IconThemes::Theme IconThemes::read(const std::string& name) const {
    Theme theme{name, {}, {}};
    for (const std::string& place : places()) {
        const auto index = settingsAt(place + "/" + name + "/index.theme");
        if (!index) continue;
        // The first description counts; the icons themselves may lie in any of the places.
        if (const std::string* parents = index->find("Icon Theme", "Inherits"))
            theme.parents = listedIn(*parents, kMaximumFolders);
        const std::string* const folders = index->find("Icon Theme", "Directories");
        for (const std::string& path : folders ? listedIn(*folders, kMaximumFolders) : std::vector<std::string>{}) {
            const int size = numberIn(*index, path, "Size", 0);
            if (!isPlainPath(path) || size == 0 || numberIn(*index, path, "Scale", 1) != 1) continue;
            const std::string* const type = index->find(path, "Type");
            Folder folder{path, size, size};
            if (type && *type == "Scalable") {
                folder.smallest = numberIn(*index, path, "MinSize", size);
                folder.largest = numberIn(*index, path, "MaxSize", size);
            } else if (!type || *type == "Threshold") {
                const int threshold = numberIn(*index, path, "Threshold", 2);
                folder.smallest = size - threshold;
                folder.largest = size + threshold;
            }
            theme.folders.push_back(std::move(folder));
        }
        break;
    }
    // Many systems have icons there and no description.
    if (theme.folders.empty() && name == kDefaultTheme)
        for (const int size : {16, 22, 24, 32, 36, 48, 64, 72, 96, 128, 192, 256, 512})
            theme.folders.push_back({std::to_string(size) + "x" + std::to_string(size) + "/apps", size, size});
    return theme;
}

std::vector<IconThemes::Theme> IconThemes::chain() const {
    std::vector<Theme> themes;
    // Depth first, as it is prescribed: a theme, then its first parent with all of that one's.
    std::vector<std::string> waiting{currentTheme()};
    while (!waiting.empty() && themes.size() < kMaximumThemes) {
        const std::string name = waiting.back();
        waiting.pop_back();
        const bool known =
            std::any_of(themes.begin(), themes.end(), [&](const Theme& theme) { return theme.name == name; });
        if (known || !isPlainName(name) || name == kDefaultTheme) continue;
        themes.push_back(read(name));
        const auto& parents = themes.back().parents;
        waiting.insert(waiting.end(), parents.rbegin(), parents.rend());
    }
    themes.push_back(read(kDefaultTheme));
    return themes;
}

std::optional<Data> IconThemes::pngAt(const std::string& path) {
    const auto file = readSmallFile(path, kMaximumIconBytes);
    if (!file || !file->text.starts_with(kPng) || (file->status.st_mode & S_IWOTH) != 0) return std::nullopt;
    if (file->status.st_uid != 0 && file->status.st_uid != ::geteuid()) return std::nullopt;
    return Data(file->text.begin(), file->text.end());
}

std::optional<Data> IconThemes::png(const std::string& icon, int size) const {
    if (icon.starts_with('/')) return icon.find('\0') == std::string::npos ? pngAt(icon) : std::nullopt;
    const std::string name = icon.ends_with(kEnding) ? icon : icon + std::string(kEnding);
    if (!isPlainName(name)) return std::nullopt;
    for (Theme& theme : chain()) {
        // Of two that are equally far, the larger one: it can be made smaller.
        std::stable_sort(theme.folders.begin(), theme.folders.end(), [size](const Folder& a, const Folder& b) {
            return a.distance(size) != b.distance(size) ? a.distance(size) < b.distance(size) : a.largest > b.largest;
        });
        for (const Folder& folder : theme.folders)
            for (const std::string& place : places())
                if (auto png = pngAt(place + "/" + theme.name + "/" + folder.path + "/" + name)) return png;
    }
    for (const std::string& place : places())
        if (auto png = pngAt(place + "/" + name)) return png;
    for (const std::string& directory : dataDirectories)
        if (auto png = pngAt(directory + "/pixmaps/" + name)) return png;
    return std::nullopt;
}

}  // namespace lumacast
