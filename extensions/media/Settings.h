#pragma once
// What an application may say in a broadcast's user info, read leniently: numbers of any kind, also as text.

#include <charconv>
#include <cmath>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/Value.h"

namespace lumacast::extensions {

inline std::optional<std::string> textIn(const Dictionary& info, std::string_view key) {
    const Value* value = info.find(key);
    if (!value) return std::nullopt;
    if (const auto* text = value->as<std::string>(); text && !text->empty()) return *text;
    if (const auto* url = value->as<URL>(); url && !url->text().empty()) return url->text();
    return std::nullopt;
}

/// None for what is no finite number.
inline std::optional<double> numberIn(const Dictionary& info, std::string_view key) {
    const Value* value = info.find(key);
    if (!value) return std::nullopt;
    double number = 0;
    if (const auto* whole = value->as<std::int64_t>())
        number = static_cast<double>(*whole);
    else if (const auto* unsignedWhole = value->as<std::uint64_t>())
        number = static_cast<double>(*unsignedWhole);
    else if (const auto* real = value->as<double>())
        number = *real;
    else if (const auto* text = value->as<std::string>()) {
        const auto read = std::from_chars(text->data(), text->data() + text->size(), number);
        if (read.ec != std::errc() || read.ptr != text->data() + text->size()) return std::nullopt;
    } else
        return std::nullopt;
    return std::isfinite(number) ? std::optional(number) : std::nullopt;
}

}  // namespace lumacast::extensions
