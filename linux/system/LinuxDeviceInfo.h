#pragma once
#include <string>
#include <string_view>
#include <vector>

#include "linux/system/DiskLane.h"
#include "platform/DeviceInfo.h"

namespace lumacast {

/// The device as the administrator or the user describes it in `device.conf`: `Idiom=`, `ChipID=` and
/// `ReducedCaptureChipID=`, whole numbers, before any section, and the region's rules by their names, yes or no, in the
/// section [Region]. The first file that has a key decides. Read at each use; a disk that does not answer
/// within 40 ms counts as a device that does not.
class LinuxDeviceInfo final : public DeviceInfo {
public:
    /// `directories` hold the files device.conf, most important first.
    explicit LinuxDeviceInfo(std::vector<std::string> directories,
                             std::chrono::milliseconds patience = std::chrono::milliseconds(40));

    std::optional<std::int64_t> userInterfaceIdiom() const override;
    std::optional<std::int64_t> chipID() const override;
    std::optional<std::int64_t> reducedCaptureChipID() const override;
    std::optional<bool> regionalRule(std::string_view name) const override;

private:
    std::optional<std::string> text(std::string_view section, std::string_view key) const;
    std::optional<std::int64_t> number(std::string_view key) const;

    const std::vector<std::string> directories_;
    const std::chrono::milliseconds patience_;
    mutable DiskLane disk_{2};
};

}  // namespace lumacast
