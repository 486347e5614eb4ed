#pragma once
// Values as JSON text and back (RFC 8259).

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "base/Value.h"

namespace lumacast {

/// One line of JSON. Dictionaries keep their order. Dates are seconds since 1970, bytes are written as their count,
/// errors as an object of domain, code and userInfo; numbers that JSON has no form for, endpoints and planes become
/// null; bytes that are not UTF-8 become U+FFFD.
std::string jsonText(const Value& value);

/// Reads one JSON document of at most `maximumDepth` nested arrays and objects. None for anything malformed or deeper;
/// a key given twice keeps its last value. Whole numbers become int64 (or uint64 above its range), others double.
std::optional<Value> valueFromJson(std::string_view text, std::size_t maximumDepth = 16);

}  // namespace lumacast
