#pragma once
// Quantities and foreign texts, written for people.

#include <cstdint>
#include <string>
#include <string_view>

#include "base/Value.h"

namespace lumacast::ctl {

/// "512 bytes", "1.2 MB", "34.0 GB": decimal units (1 MB is 1,000,000 bytes), one digit behind the point, rounded.
std::string bytesText(std::uint64_t bytes);

/// "0:02.5", "12:34.0", "1:02:03.4": minutes (and hours where there are any), seconds and tenths, cut off, not rounded.
/// Anything below zero, and what is no number, is "0:00.0".
std::string durationText(double seconds);

/// How a moment is written: local time, to the second.
std::string momentText(double secondsSince1970);

/// The text with every control character replaced by '?': names and paths come from other programs, and a terminal
/// obeys what it is sent.
std::string printable(std::string_view text);

/// A value as it would be written in a configuration file: flags are true and false, texts in quotes.
std::string settingText(const Value& value);

}  // namespace lumacast::ctl
