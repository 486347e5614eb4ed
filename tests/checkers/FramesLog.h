#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <string>

namespace lumacast::checkers {

/// When a frame came to the display, in host time: at some moment between the two.
struct DrawnStamp {
    std::chrono::nanoseconds sent{};   ///< the application handed it over
    std::chrono::nanoseconds shown{};  ///< the application learned that it was on the window
    bool isMarked = false;             ///< the first frame with the mark
};

/// Every frame an application drew, by number.
using FramesLog = std::map<std::uint32_t, DrawnStamp>;

/// Reads lines "number shown_ns sent_ns [mark]"; without a third word both stamps are the second. None, with the reason, when
/// the file can't be read or a complete line has another form. A last line without its end was still being written and
/// is left out.
[[nodiscard]] std::optional<FramesLog> readFramesLog(const std::string& path, std::string& error);

}  // namespace lumacast::checkers
