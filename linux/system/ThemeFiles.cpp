#include "linux/system/ThemeFiles.h"

#include "linux/system/SmallFile.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumSettingsBytes = 256 * 1024;

}  // namespace

bool isPlainName(std::string_view name) {
    return !name.empty() && name.size() <= kMaximumThemeName && name.front() != '.' &&
           name.find('/') == std::string_view::npos && name.find('\0') == std::string_view::npos;
}

bool isPlainPath(std::string_view path) {
    if (path.size() > kMaximumThemePath) return false;
    while (true) {
        const std::size_t slash = path.find('/');
        if (!isPlainName(path.substr(0, slash))) return false;
        if (slash == std::string_view::npos) return true;
        path.remove_prefix(slash + 1);
    }
}

std::vector<std::string> listedIn(std::string_view text, std::size_t most) {
    std::vector<std::string> items;
    while (!text.empty() && items.size() < most) {
        const std::size_t end = text.find_first_of(",;");
        std::string_view item = text.substr(0, end);
        while (item.starts_with(' ')) item.remove_prefix(1);
        while (item.ends_with(' ')) item.remove_suffix(1);
        if (!item.empty()) items.emplace_back(item);
        text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
    }
    return items;
}

std::optional<IniFile> settingsAt(const std::string& path) {
    const auto file = readSmallFile(path, kMaximumSettingsBytes);
    return file ? std::optional(IniFile::parse(file->text)) : std::nullopt;
}

}  // namespace lumacast
