#pragma once
#include <cstdint>
#include <optional>
#include <string>
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

/// Whether a preference switches something on: true, a number that is not 0, or a text that begins with Y, y, T, t or a
/// digit from 1 to 9.
inline bool isTrue(const std::optional<Value>& preference) {
    if (!preference) return false;
    if (const bool* truth = preference->as<bool>()) return *truth;
    if (const std::int64_t* number = preference->as<std::int64_t>()) return *number != 0;
    if (const double* number = preference->as<double>()) return *number != 0;
    const std::string* text = preference->as<std::string>();
    return text && !text->empty() && std::string_view("YyTt123456789").find(text->front()) != std::string_view::npos;
}

}  // namespace lumacast
