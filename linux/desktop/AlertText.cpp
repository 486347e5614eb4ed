#include "linux/desktop/AlertText.h"

#include <vector>

namespace lumacast {
namespace {

constexpr char32_t kReplacement = 0xFFFD;
constexpr char32_t kEllipsis = 0x2026;
constexpr int kMostCombining = 4;

bool isContinuation(unsigned char byte) {
    return (byte & 0xC0) == 0x80;
}

/// The character at `at`, which moves on behind it (RFC 3629: no surrogates, no overlong forms).
char32_t next(std::string_view text, std::size_t& at) {
    const auto byte = [&](std::size_t i) { return static_cast<unsigned char>(text[i]); };
    const unsigned char first = byte(at++);
    if (first < 0x80) return first;
    const std::size_t length = first >= 0xF0 && first < 0xF5   ? 3
                               : first >= 0xE0 && first < 0xF0 ? 2
                               : first >= 0xC2 && first < 0xE0 ? 1
                                                               : 0;
    if (length == 0) return kReplacement;
    char32_t character = first & (0x3Fu >> length);
    std::size_t end = at;
    for (std::size_t i = 0; i < length; ++i, ++end) {
        if (end >= text.size() || !isContinuation(byte(end))) return kReplacement;
        character = (character << 6) | (byte(end) & 0x3Fu);
    }
    constexpr char32_t kLeast[] = {0x80, 0x800, 0x10000};
    if (character < kLeast[length - 1] || character > 0x10FFFF || (character >= 0xD800 && character < 0xE000))
        return kReplacement;
    at = end;
    return character;
}

void append(std::string& text, char32_t c) {
    const auto put = [&](char32_t byte) { text += static_cast<char>(byte); };
    if (c < 0x80) return put(c);
    if (c < 0x800) return put(0xC0 | c >> 6), put(0x80 | (c & 0x3F));
    if (c < 0x10000) return put(0xE0 | c >> 12), put(0x80 | (c >> 6 & 0x3F)), put(0x80 | (c & 0x3F));
    put(0xF0 | c >> 18), put(0x80 | (c >> 12 & 0x3F)), put(0x80 | (c >> 6 & 0x3F)), put(0x80 | (c & 0x3F));
}

bool in(char32_t c, char32_t first, char32_t last) {
    return c >= first && c <= last;
}

bool isBlank(char32_t c) {
    return c <= 0x20 || in(c, 0x7F, 0xA0) || c == 0x1680 || in(c, 0x2000, 0x200A) || in(c, 0x2028, 0x2029) ||
           c == 0x202F || c == 0x205F || c == 0x3000 || c == 0x2800;
}

/// Marks of writing direction, and what takes no place (joiners are kept: scripts and pictures need them).
bool isInvisible(char32_t c) {
    return c == 0xAD || c == 0x34F || c == 0x61C || in(c, 0x115F, 0x1160) || in(c, 0x17B4, 0x17B5) ||
           in(c, 0x180B, 0x180F) || c == 0x200B || in(c, 0x200E, 0x200F) || in(c, 0x202A, 0x202E) ||
           in(c, 0x2060, 0x206F) || c == 0x3164 || c == 0xFEFF || c == 0xFFA0 || in(c, 0xFFF0, 0xFFFB) ||
           in(c, 0xFFFE, 0xFFFF) || in(c, 0x1D173, 0x1D17A) || in(c, 0xE0000, 0xE0FFF);
}

bool isCombining(char32_t c) {
    return in(c, 0x300, 0x36F) || in(c, 0x483, 0x489) || in(c, 0x1AB0, 0x1AFF) || in(c, 0x1DC0, 0x1DFF) ||
           in(c, 0x20D0, 0x20FF) || in(c, 0xFE00, 0xFE0F) || in(c, 0xFE20, 0xFE2F) || in(c, 0x200C, 0x200D);
}

int columnsOf(char32_t c) {
    if (isCombining(c)) return 0;
    const bool wide = in(c, 0x1100, 0x11FF) || in(c, 0x2E80, 0xA4CF) || in(c, 0xAC00, 0xD7A3) ||
                      in(c, 0xF900, 0xFAFF) || in(c, 0xFE30, 0xFE4F) || in(c, 0xFF00, 0xFF60) || c >= 0x1F000;
    return wide ? 2 : 1;
}

}  // namespace

std::string plainAlertText(std::string_view text, std::size_t maximum) {
    std::vector<char32_t> characters;
    int combining = 0;
    for (std::size_t at = 0; at < text.size();) {
        char32_t c = next(text, at);
        if (isInvisible(c)) continue;
        if (isBlank(c)) c = ' ';
        if (c == ' ' && (characters.empty() || characters.back() == ' ')) continue;
        combining = isCombining(c) ? combining + 1 : 0;
        if (combining <= kMostCombining) characters.push_back(c);
    }
    if (!characters.empty() && characters.back() == ' ') characters.pop_back();
    if (characters.size() > maximum) {
        const std::size_t behind = maximum * 2 / 5, before = maximum - behind - 1;
        characters.erase(characters.begin() + static_cast<std::ptrdiff_t>(before),
                         characters.end() - static_cast<std::ptrdiff_t>(behind));
        characters.insert(characters.begin() + static_cast<std::ptrdiff_t>(before), kEllipsis);
    }
    std::string plain;
    for (const char32_t c : characters) append(plain, c);
    return plain;
}

std::string inLines(std::string_view text, int columns) {
    std::string lines, word;
    int lineColumns = 0, wordColumns = 0;
    const auto endWord = [&] {
        if (lineColumns > 0 && lineColumns + 1 + wordColumns > columns) {
            lines += '\n';
            lineColumns = 0;
        } else if (lineColumns > 0 && wordColumns > 0) {
            lines += ' ';
            ++lineColumns;
        }
        lines += word;
        lineColumns += wordColumns;
        word.clear();
        wordColumns = 0;
    };
    for (std::size_t at = 0; at < text.size();) {
        const char32_t c = next(text, at);
        if (c == ' ') {
            endWord();
            continue;
        }
        if (wordColumns + columnsOf(c) > columns) {  // a word longer than a line
            if (lineColumns > 0) lines += '\n';
            lines += word;
            lineColumns = columns;
            word.clear();
            wordColumns = 0;
        }
        append(word, c);
        wordColumns += columnsOf(c);
    }
    endWord();
    return lines;
}

std::string asMarkup(std::string_view text) {
    std::string markup;
    for (const char c : text) switch (c) {
            case '&': markup += "&amp;"; break;
            case '<': markup += "&lt;"; break;
            case '>': markup += "&gt;"; break;
            case '"': markup += "&quot;"; break;
            case '\'': markup += "&#39;"; break;
            case '\\': markup += "&#92;"; break;
            default: markup += c;
        }
    return markup;
}

}  // namespace lumacast
