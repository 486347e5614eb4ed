#include "linux/apps/StringsTable.h"

#include <cstdint>

#include "base/Utf8.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumEntries = 4096;

class Reader {
public:
    explicit Reader(std::string_view text) : rest_(text) {
        if (rest_.starts_with("\xEF\xBB\xBF")) rest_.remove_prefix(3);
    }

    bool atEnd() const { return rest_.empty(); }

    bool take(char c) {
        if (!rest_.starts_with(c)) return false;
        rest_.remove_prefix(1);
        return true;
    }

    /// Passes over blanks and comments; false for a comment without an end.
    bool skip() {
        while (true) {
            rest_.remove_prefix(std::min(rest_.find_first_not_of(" \t\r\n\f\v"), rest_.size()));
            if (rest_.starts_with("//")) {
                rest_.remove_prefix(std::min(rest_.find('\n'), rest_.size()));
            } else if (rest_.starts_with("/*")) {
                const std::size_t end = rest_.find("*/", 2);
                if (end == std::string_view::npos) return false;
                rest_.remove_prefix(end + 2);
            } else {
                return true;
            }
        }
    }

    std::optional<std::string> word() {
        if (take('"')) return quoted();
        std::size_t length = 0;
        while (length < rest_.size() && isWordCharacter(rest_[length])) ++length;
        if (length == 0) return std::nullopt;
        std::string result(rest_.substr(0, length));
        rest_.remove_prefix(length);
        return result;
    }

private:
    static bool isWordCharacter(char c) {
        return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '_' || c == '.' ||
               c == '-' || c == '$';
    }

    std::optional<std::string> quoted() {
        std::string result;
        while (!rest_.empty()) {
            const char c = rest_.front();
            rest_.remove_prefix(1);
            if (c == '"') return result;
            if (c != '\\') {
                result += c;
                continue;
            }
            if (rest_.empty()) break;
            const char escaped = rest_.front();
            rest_.remove_prefix(1);
            switch (escaped) {
                case 'n': result += '\n'; break;
                case 't': result += '\t'; break;
                case 'r': result += '\r'; break;
                case 'u':
                case 'U':
                    if (!appendCharacter(result)) return std::nullopt;
                    break;
                default: result += escaped;
            }
        }
        return std::nullopt;
    }

    std::optional<std::uint32_t> fourHexDigits() {
        if (rest_.size() < 4) return std::nullopt;
        std::uint32_t value = 0;
        for (const char c : rest_.substr(0, 4)) {
            const int digit = c >= '0' && c <= '9'   ? c - '0'
                              : c >= 'a' && c <= 'f' ? c - 'a' + 10
                              : c >= 'A' && c <= 'F' ? c - 'A' + 10
                                                     : -1;
            if (digit < 0) return std::nullopt;
            value = value * 16 + static_cast<std::uint32_t>(digit);
        }
        rest_.remove_prefix(4);
        return value;
    }

    bool appendCharacter(std::string& result) {
        const auto first = fourHexDigits();
        if (!first || *first == 0) return false;
        std::uint32_t code = *first;
        if (code >= 0xDC00 && code <= 0xDFFF) return false;
        if (code >= 0xD800 && code <= 0xDBFF) {
            if (!take('\\') || !(take('u') || take('U'))) return false;
            const auto second = fourHexDigits();
            if (!second || *second < 0xDC00 || *second > 0xDFFF) return false;
            code = 0x10000 + ((code - 0xD800) << 10) + (*second - 0xDC00);
        }
        const auto byte = [&](std::uint32_t value) { result += static_cast<char>(static_cast<std::uint8_t>(value)); };
        if (code < 0x80) {
            byte(code);
        } else if (code < 0x800) {
            byte(0xC0 | code >> 6);
            byte(0x80 | (code & 0x3F));
        } else if (code < 0x10000) {
            byte(0xE0 | code >> 12);
            byte(0x80 | (code >> 6 & 0x3F));
            byte(0x80 | (code & 0x3F));
        } else {
            byte(0xF0 | code >> 18);
            byte(0x80 | (code >> 12 & 0x3F));
            byte(0x80 | (code >> 6 & 0x3F));
            byte(0x80 | (code & 0x3F));
        }
        return true;
    }

    std::string_view rest_;
};

}  // namespace

StringsTable StringsTable::parse(std::string_view text) {
    StringsTable table;
    if (!isValidUtf8(text)) return table;
    Reader reader(text);
    while (table.texts_.size() < kMaximumEntries) {
        if (!reader.skip()) return table;
        if (reader.atEnd()) {
            table.complete_ = true;
            return table;
        }
        auto key = reader.word();
        if (!key || !reader.skip() || !reader.take('=') || !reader.skip()) return table;
        auto value = reader.word();
        if (!value || !reader.skip() || !reader.take(';')) return table;
        table.texts_.emplace(std::move(*key), std::move(*value));
    }
    return table;
}

const std::string* StringsTable::find(std::string_view key) const {
    const auto found = texts_.find(key);
    return found == texts_.end() ? nullptr : &found->second;
}

}  // namespace lumacast
