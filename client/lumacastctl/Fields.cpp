#include "client/lumacastctl/Fields.h"

namespace lumacast::ctl {

std::optional<double> numberIn(const Dictionary& dictionary, std::string_view key) {
    const Value* value = dictionary.find(key);
    if (!value) return std::nullopt;
    if (const auto* whole = value->as<std::int64_t>()) return static_cast<double>(*whole);
    if (const auto* whole = value->as<std::uint64_t>()) return static_cast<double>(*whole);
    if (const auto* number = value->as<double>()) return *number;
    return std::nullopt;
}

std::optional<std::uint64_t> countIn(const Dictionary& dictionary, std::string_view key) {
    const Value* value = dictionary.find(key);
    if (!value) return std::nullopt;
    if (const auto* whole = value->as<std::uint64_t>()) return *whole;
    if (const auto* whole = value->as<std::int64_t>(); whole && *whole >= 0) return static_cast<std::uint64_t>(*whole);
    return std::nullopt;
}

std::optional<std::string> textIn(const Dictionary& dictionary, std::string_view key) {
    const Value* value = dictionary.find(key);
    const auto* text = value ? value->as<std::string>() : nullptr;
    return text ? std::optional(*text) : std::nullopt;
}

bool flagIn(const Dictionary& dictionary, std::string_view key) {
    const Value* value = dictionary.find(key);
    const bool* flag = value ? value->as<bool>() : nullptr;
    return flag && *flag;
}

}  // namespace lumacast::ctl
