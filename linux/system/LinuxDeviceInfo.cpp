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

std::optional<bool> LinuxDeviceInfo::regionalRule(std::string_view name) const {
    const auto written = text("Region", name);
    if (!written) return std::nullopt;
    const Value value = iniValue(*written);
    const bool* rule = value.as<bool>();
    return rule ? std::optional(*rule) : std::nullopt;
}

std::optional<std::int64_t> LinuxDeviceInfo::number(std::string_view key) const {
    const auto value = text("", key);
    return value ? wholeNumber(*value) : std::nullopt;
}

std::optional<std::string> LinuxDeviceInfo::text(std::string_view section, std::string_view key) const {
    using Text = std::optional<std::string>;
    const auto read = [directories = directories_, section = std::string(section), key = std::string(key)]() -> Text {
        for (const std::string& directory : directories) {
            const auto file = readSmallFile(directory + "/device.conf", kMaximumBytes);
            if (!file) continue;
            const IniFile settings = IniFile::parse(file->text);
            if (const std::string* value = settings.find(section, key)) return *value;
        }
        return std::nullopt;
    };
    return disk_.ask<Text>(patience_, read).value_or(std::nullopt);
}

}  // namespace lumacast
