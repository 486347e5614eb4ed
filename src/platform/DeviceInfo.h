#pragma once
#include <cstdint>
#include <optional>
#include <string_view>

namespace lumacast {

/// What kind of device this is. Callable from any lane; never blocks.
class DeviceInfo {
public:
    virtual ~DeviceInfo() = default;
    /// The user-interface class: 1 tablet, other numbers other classes; none when the device does not answer.
    virtual std::optional<std::int64_t> userInterfaceIdiom() const = 0;
    /// The device information "ChipID"; none when the device does not answer.
    virtual std::optional<std::int64_t> chipID() const = 0;
    /// The chip identifier of the one tablet generation whose capture is capped at 1600 pixels; none when not
    /// configured.
    virtual std::optional<std::int64_t> reducedCaptureChipID() const = 0;
    /// A rule of the region the device is sold in, "RegionalBehaviorShutterClick" for one; none when it has no such rule.
    virtual std::optional<bool> regionalRule(std::string_view name) const = 0;
};

}  // namespace lumacast
