#pragma once
#include <optional>
#include <string_view>

#include "base/Value.h"

namespace lumacast {

/// The user's preferences. Read at each use; never blocks for long; callable from any lane.
class Preferences {
public:
    virtual ~Preferences() = default;
    /// The value of `key` in `domain`, or none. Kinds: bool, int64, double, text.
    virtual std::optional<Value> value(std::string_view domain, std::string_view key) const = 0;
};

/// The domain of all preferences of this daemon.
inline constexpr std::string_view kPreferenceDomain = "com.orvane.lumacastd";

}  // namespace lumacast
