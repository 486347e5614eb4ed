#pragma once
// The entries of a daemon's answer, by key and kind. None where an entry is missing or of another kind.

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/Value.h"

namespace lumacast::ctl {

inline constexpr char kNotUnderstood[] =
    "its answer can't be understood; is this tool of another version than the daemon?";

std::optional<double> numberIn(const Dictionary& dictionary, std::string_view key);
/// A whole number that is not below zero.
std::optional<std::uint64_t> countIn(const Dictionary& dictionary, std::string_view key);
std::optional<std::string> textIn(const Dictionary& dictionary, std::string_view key);
/// False too where there is none.
bool flagIn(const Dictionary& dictionary, std::string_view key);

}  // namespace lumacast::ctl
