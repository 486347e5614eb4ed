#include "linux/system/IniFile.h"

#include <algorithm>
#include <charconv>
#include <cmath>

namespace lumacast {

namespace {

constexpr std::size_t kMaximumEntries = 4096;
constexpr std::string_view kBlanks = " \t\r\f\v";

std::string_view trimmed(std::string_view text) {
    const std::size_t first = text.find_first_not_of(kBlanks);
    if (first == std::string_view::npos) return {};
    return text.substr(first, text.find_last_not_of(kBlanks) - first + 1);
}

bool equalsIgnoringCase(std::string_view a, std::string_view b) {
    const auto lower = [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; };
    return std::equal(a.begin(), a.end(), b.begin(), b.end(), [&](char x, char y) { return lower(x) == lower(y); });
}

std::optional<double> decimal(std::string_view text) {
    if (text.find_first_not_of("0123456789+-.eE") != std::string_view::npos) return std::nullopt;  // no "inf", no hex
    if (text.starts_with('+') && !text.starts_with("+-")) text.remove_prefix(1);
    double value = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
    if (error != std::errc() || end != text.data() + text.size() || !std::isfinite(value)) return std::nullopt;
    return value;
}

}  // namespace

const std::string* IniSection::find(std::string_view key) const {
    const auto found = std::find_if(entries.rbegin(), entries.rend(), [&](const auto& e) { return e.first == key; });
    return found == entries.rend() ? nullptr : &found->second;
}

IniFile IniFile::parse(std::string_view text) {
    IniFile file;
    file.sections.push_back({});
    std::size_t current = 0;
    std::size_t kept = 0;
    if (text.starts_with("\xEF\xBB\xBF")) text.remove_prefix(3);
    while (!text.empty()) {
        const std::size_t newline = text.find('\n');
        const std::string_view line = trimmed(text.substr(0, newline));
        text.remove_prefix(newline == std::string_view::npos ? text.size() : newline + 1);
        if (line.empty() || line.front() == '#' || line.front() == ';') continue;
        if (kept++ == kMaximumEntries) break;
        if (line.front() == '[') {
            if (line.back() != ']') continue;
            const std::string_view name = trimmed(line.substr(1, line.size() - 2));
            const auto found = std::find_if(file.sections.begin(), file.sections.end(),
                                            [&](const IniSection& section) { return section.name == name; });
            current = static_cast<std::size_t>(found - file.sections.begin());
            if (found == file.sections.end()) file.sections.push_back({std::string(name), {}});
            continue;
        }
        const std::size_t equals = line.find('=');
        if (equals == std::string_view::npos) continue;
        const std::string_view key = trimmed(line.substr(0, equals));
        if (key.empty()) continue;
        file.sections[current].entries.emplace_back(key, trimmed(line.substr(equals + 1)));
    }
    return file;
}

const IniSection* IniFile::section(std::string_view name) const {
    const auto found = std::find_if(sections.begin(), sections.end(),
                                    [&](const IniSection& candidate) { return candidate.name == name; });
    return found == sections.end() ? nullptr : &*found;
}

const std::string* IniFile::find(std::string_view sectionName, std::string_view key) const {
    const IniSection* found = section(sectionName);
    return found ? found->find(key) : nullptr;
}

std::optional<std::int64_t> wholeNumber(std::string_view text) {
    if (text.starts_with('+') && !text.starts_with("+-")) text.remove_prefix(1);
    std::int64_t value = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
    if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
    return value;
}

Value iniValue(std::string_view text) {
    text = trimmed(text);
    if (text.size() >= 2 && text.front() == '"' && text.back() == '"') return Value(text.substr(1, text.size() - 2));
    if (equalsIgnoringCase(text, "true") || equalsIgnoringCase(text, "yes")) return Value(true);
    if (equalsIgnoringCase(text, "false") || equalsIgnoringCase(text, "no")) return Value(false);
    if (const auto number = wholeNumber(text)) return Value(*number);
    if (const auto number = decimal(text)) return Value(*number);
    return Value(text);
}

}  // namespace lumacast
