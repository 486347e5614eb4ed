#pragma once
#include <chrono>
#include <string>

namespace lumacast {

/// Whether the session bus at `address` (as in $DBUS_SESSION_BUS_ADDRESS) lets somebody in, and whoever is its
/// accessibility service, if anybody is, answers. Waits for both together at most `patience`. Any lane.
[[nodiscard]] bool busAnswers(const std::string& address, std::chrono::milliseconds patience);

}  // namespace lumacast
