#pragma once
#include <string>
#include <vector>

#include "linux/system/DiskLane.h"
#include "platform/Preferences.h"

namespace lumacast {

/// Preferences in INI files: `<directory>/lumacast/<domain>.conf`, `key=value` lines before any section. The first
/// directory whose file has the key decides, so the user's own file goes before the administrator's. Read at each use;
/// a file larger than 64 KiB, or one the disk does not answer for within 40 ms, counts as missing.
class LinuxPreferences final : public Preferences {
public:
    /// `configDirectories`, most important first (see LinuxEnvironment). `patience` is how long a question may take.
    explicit LinuxPreferences(std::vector<std::string> configDirectories,
                              std::chrono::milliseconds patience = std::chrono::milliseconds(40));

    std::optional<Value> value(std::string_view domain, std::string_view key) const override;

private:
    const std::vector<std::string> directories_;
    const std::chrono::milliseconds patience_;
    mutable DiskLane disk_{2};
};

}  // namespace lumacast
