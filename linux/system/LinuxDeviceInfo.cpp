#include "linux/system/LinuxDeviceInfo.h"

#include "linux/system/IniFile.h"
#include "linux/system/SmallFile.h"

namespace lumacast {

namespace {
constexpr std::size_t kMaximumBytes = 64 * 1024;
}

LinuxDeviceInfo::LinuxDeviceInfo(std::vector<std::string> directories, std::chrono::milliseconds patience)
    : directories_(std::move(directories)), patience_(patience) {}

std::optional<std::int64_t> LinuxDeviceInfo::userInterfaceIdiom() const { return number("Idiom"); }
std::optional<std::int64_t> LinuxDeviceInfo::chipID() const { return number("ChipID"); }
std::optional<std::int64_t> LinuxDeviceInfo::reducedCaptureChipID() const { return number("ReducedCaptureChipID"); }

std::optional<std::int64_t> LinuxDeviceInfo::number(std::string_view key) const {
    const auto read = [directories = directories_, wanted = std::string(key)]() -> std::optional<std::int64_t> {
        for (const std::string& directory : directories) {
            const auto file = readSmallFile(directory + "/device.conf", kMaximumBytes);
            if (!file) continue;
            const IniFile settings = IniFile::parse(file->text);
            const std::string* text = settings.find("", wanted);
            if (text) return wholeNumber(*text);
        }
        return std::nullopt;
    };
    return disk_.ask<std::optional<std::int64_t>>(patience_, read).value_or(std::nullopt);
}

}  // namespace lumacast
