#include "linux/sounds/SoundThemes.h"

#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <optional>

#include "linux/system/ThemeFiles.h"

namespace lumacast::sound {

namespace {

constexpr const char* kDefaultTheme = "freedesktop";
constexpr std::size_t kMaximumThemes = 16;
constexpr std::size_t kMaximumFolders = 64;
constexpr std::size_t kMaximumFiles = 16;
constexpr std::array kExtensions{".oga", ".ogg", ".wav"};

struct Setting {
    const char* file;
    const char* section;
    const char* key;
};
constexpr std::array kThemeSettings{Setting{"kdeglobals", "Sounds", "Theme"},
                                    Setting{"gtk-4.0/settings.ini", "Settings", "gtk-sound-theme-name"},
                                    Setting{"gtk-3.0/settings.ini", "Settings", "gtk-sound-theme-name"}};

bool isFile(const std::string& path) {
    struct stat status {};
    return ::stat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode);
}

}  // namespace

struct SoundThemes::Theme {
    std::string name;  ///< empty for the sounds outside themes
    std::vector<std::string> folders, parents;
};

std::string SoundThemes::currentTheme() const {
    for (const Setting& setting : kThemeSettings)
        for (const std::string& directory : configDirectories) {
            const auto settings = settingsAt(directory + "/" + setting.file);
            const std::string* const theme = settings ? settings->find(setting.section, setting.key) : nullptr;
            if (theme && isPlainName(*theme)) return *theme;
        }
    return kDefaultTheme;
}

SoundThemes::Theme SoundThemes::read(const std::string& name) const {
    Theme theme{name, {}, {}};
    for (const std::string& directory : dataDirectories) {
        const auto index = settingsAt(directory + "/sounds/" + name + "/index.theme");
        if (!index) continue;
        // The first description counts; the sounds themselves may lie in any of the data directories.
        if (const std::string* parents = index->find("Sound Theme", "Inherits"))
            theme.parents = listedIn(*parents, kMaximumFolders);
        const std::string* const folders = index->find("Sound Theme", "Directories");
        for (const std::string& folder : folders ? listedIn(*folders, kMaximumFolders) : std::vector<std::string>{}) {
            const std::string* const profile = index->find(folder, "OutputProfile");
            if (isPlainPath(folder) && (!profile || *profile == "stereo")) theme.folders.push_back(folder);
        }
        break;
    }
    return theme;
}

std::vector<SoundThemes::Theme> SoundThemes::chain() const {
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
    themes.push_back({"", {""}, {}});
    return themes;
}

std::vector<std::string> SoundThemes::files(const std::vector<std::string>& names) const {
    std::vector<std::string> found;
    const auto themes = chain();
    for (const std::string& name : names) {
        if (!isPlainName(name)) continue;
        for (const Theme& theme : themes)
            for (const std::string& folder : theme.folders)
                for (const std::string& directory : dataDirectories)
                    for (const char* extension : kExtensions) {
                        std::string path = directory + "/sounds/";
                        if (!theme.name.empty()) path += theme.name + "/" + folder + "/";
                        path += name + extension;
                        if (found.size() < kMaximumFiles && isFile(path)) found.push_back(std::move(path));
                    }
    }
    return found;
}

}  // namespace lumacast::sound
