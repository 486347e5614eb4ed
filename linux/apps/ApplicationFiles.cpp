#include "linux/apps/ApplicationFiles.h"

#include <dirent.h>
#include <stdlib.h>
#include <unistd.h>

#include <algorithm>
#include <memory>

namespace lumacast {

namespace {

constexpr std::size_t kMaximumBytes = 256 * 1024;
constexpr int kFoldersAbove = 3;

bool everybodyMayWrite(const SmallFile& file) { return (file.status.st_mode & S_IWOTH) != 0; }

}  // namespace

std::optional<DesktopEntry> readDesktopEntry(const std::string& path) {
    const auto file = readSmallFile(path, kMaximumBytes);
    if (!file || everybodyMayWrite(*file)) return std::nullopt;
    return DesktopEntry::parse(file->text);
}

std::optional<Manifest> readManifest(const std::string& folder) {
    const auto file = readSmallFile(folder + "/" + std::string(kManifestName), kMaximumBytes);
    if (!file || everybodyMayWrite(*file)) return std::nullopt;
    if (file->status.st_uid != ::geteuid() && file->status.st_uid != 0) return std::nullopt;
    return Manifest::parse(file->text);
}

std::optional<std::vector<std::string>> namesIn(const std::string& directory, std::size_t maximum) {
    const std::unique_ptr<DIR, int (*)(DIR*)> entries(::opendir(directory.c_str()), &::closedir);
    if (!entries) return std::nullopt;
    std::vector<std::string> names;
    while (const dirent* entry = ::readdir(entries.get()))
        if (entry->d_name[0] != '.' && names.size() < maximum) names.emplace_back(entry->d_name);
    std::sort(names.begin(), names.end());
    return names;
}

std::optional<std::string> applicationFolder(const std::string& executable) {
    std::string folder = executable;
    for (int level = 0; level <= kFoldersAbove; ++level) {
        folder.resize(std::min(folder.rfind('/'), folder.size()));
        if (folder.empty()) return std::nullopt;
        const auto manifest = readManifest(folder);
        if (manifest && !manifest->identifier.empty()) return folder;
    }
    return std::nullopt;
}

std::optional<std::string> resolvedProgram(const std::string& command, const std::vector<std::string>& searchPath) {
    const auto resolved = [](const std::string& path) -> std::optional<std::string> {
        const std::unique_ptr<char, void (*)(void*)> real(::realpath(path.c_str(), nullptr), &::free);
        return real && ::access(real.get(), X_OK) == 0 ? std::optional<std::string>(real.get()) : std::nullopt;
    };
    if (command.starts_with('/')) return resolved(command);
    if (command.empty() || command.find('/') != std::string::npos) return std::nullopt;
    for (const std::string& directory : searchPath)
        if (auto path = resolved(directory + "/" + command)) return path;
    return std::nullopt;
}

}  // namespace lumacast
