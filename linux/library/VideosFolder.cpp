#include "linux/library/VideosFolder.h"

#include "linux/system/SmallFile.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumBytes = 64 * 1024;
constexpr std::string_view kVariable = "XDG_VIDEOS_DIR";

std::string_view withoutBlanks(std::string_view text) {
    while (!text.empty() && (text.front() == ' ' || text.front() == '\t')) text.remove_prefix(1);
    return text;
}

std::string withoutSlashes(std::string path) {
    while (path.size() > 1 && path.ends_with('/')) path.pop_back();
    return path;
}

std::optional<std::string> folderIn(std::string_view line, std::string_view name, const std::string& home) {
    line = withoutBlanks(line);
    if (!line.starts_with(name)) return std::nullopt;
    line = withoutBlanks(line.substr(name.size()));
    if (!line.starts_with('=')) return std::nullopt;
    line = withoutBlanks(line.substr(1));
    if (!line.starts_with('"')) return std::nullopt;
    line.remove_prefix(1);

    std::string path;
    if (line.starts_with("$HOME")) {
        line.remove_prefix(5);
        if (!line.starts_with('/') && !line.starts_with('"')) return std::nullopt;
        path = home;
    } else if (!line.starts_with('/')) {
        return std::nullopt;
    }
    for (std::size_t i = 0; i < line.size(); ++i) {
        if (line[i] == '"') return withoutSlashes(std::move(path));
        if (line[i] == '\\' && i + 1 < line.size()) ++i;
        path += line[i];
    }
    return std::nullopt;  // the quotation does not end
}

}  // namespace

std::optional<std::string> userDirectory(std::string_view text, std::string_view name, const std::string& home) {
    std::optional<std::string> found;
    while (!text.empty()) {
        const std::size_t end = text.find('\n');
        if (auto folder = folderIn(text.substr(0, end), name, home)) found = std::move(folder);
        text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
    }
    return found;
}

std::string videosFolder(const std::string& home, const std::string& configHome, const std::string& environment) {
    if (const auto file = readSmallFile(configHome + "/user-dirs.dirs", kMaximumBytes))
        if (auto folder = userDirectory(file->text, kVariable, home)) return *folder;
    if (environment.starts_with('/')) return withoutSlashes(environment);
    return home + "/Videos";
}

}  // namespace lumacast
