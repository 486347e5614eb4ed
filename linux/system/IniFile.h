#pragma once
// Configuration files: sections of `key=value` lines.

#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "base/Value.h"

namespace lumacast {

struct IniSection {
    std::string name;  ///< empty for what stands before the first section
    std::vector<std::pair<std::string, std::string>> entries;

    /// The last value given for `key`, or null.
    const std::string* find(std::string_view key) const;
};

/// The sections of a configuration file in their order; sections of the same name are one. A pure parser: every text is
/// accepted, lines that are neither a section, an entry nor a comment ('#' or ';') are passed over, so that one bad
/// line does not take the others with it. At most 4096 entries are kept.
struct IniFile {
    std::vector<IniSection> sections;

    static IniFile parse(std::string_view text);

    /// The section of that name, or null.
    const IniSection* section(std::string_view name) const;
    /// The value of `key` in `section`, or null.
    const std::string* find(std::string_view section, std::string_view key) const;
};

/// What a written value means: true, false, yes, no (any case) are bools, whole numbers int64, numbers with a point or
/// an exponent double, all else text. A text in double quotes is always text, without the quotes.
Value iniValue(std::string_view text);

/// A whole decimal number as int64; none when `text` is anything else or out of range.
std::optional<std::int64_t> wholeNumber(std::string_view text);

}  // namespace lumacast
