#include "linux/system/LinuxPreferences.h"

#include "linux/system/IniFile.h"
#include "linux/system/SmallFile.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumBytes = 64 * 1024;

bool isFileName(std::string_view name) {
    return !name.empty() && name.size() <= 200 && name != "." && name != ".." &&
           name.find('/') == std::string_view::npos && name.find('\0') == std::string_view::npos;
}

}  // namespace

LinuxPreferences::LinuxPreferences(std::vector<std::string> configDirectories, std::chrono::milliseconds patience)
    : directories_(std::move(configDirectories)), patience_(patience) {}

std::optional<Value> LinuxPreferences::value(std::string_view domain, std::string_view key) const {
    if (!isFileName(domain)) return std::nullopt;
    const auto read = [directories = directories_, name = "/lumacast/" + std::string(domain) + ".conf",
                       wanted = std::string(key)]() -> std::optional<Value> {
        for (const std::string& directory : directories) {
            const auto file = readSmallFile(directory + name, kMaximumBytes);
            if (!file) continue;
            const IniFile settings = IniFile::parse(file->text);
            if (const std::string* text = settings.find("", wanted)) return iniValue(*text);
        }
        return std::nullopt;
    };
    return disk_.ask<std::optional<Value>>(patience_, read).value_or(std::nullopt);
}

}  // namespace lumacast
