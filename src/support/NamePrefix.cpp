#include "support/NamePrefix.h"

#include <cstdint>

namespace lumacast {

namespace {

/// Above every character: a byte that is no part of one.
constexpr char32_t kLooseByte = 0x110000;

/// The base letters of U+00C0 to U+017F by their canonical decomposition (Unicode, UnicodeData.txt, field 5); a dot
/// where a character has none.
constexpr std::string_view kBaseLetters =
    "AAAAAA.CEEEEIIII"   // U+00C0
    ".NOOOOO..UUUUY.."   // U+00D0
    "aaaaaa.ceeeeiiii"   // U+00E0
    ".nooooo..uuuuy.y"   // U+00F0
    "AaAaAaCcCcCcCcDd"   // U+0100
    "..EeEeEeEeEeGgGg"   // U+0110
    "GgGgHh..IiIiIiIi"   // U+0120
    "I...JjKk.LlLlLl."   // U+0130
    "...NnNnNn...OoOo"   // U+0140
    "Oo..RrRrRrSsSsSs"   // U+0150
    "SsTtTt..UuUuUuUu"   // U+0160
    "UuUuWwYyYZzZzZz.";  // U+0170
static_assert(kBaseLetters.size() == 0x180 - 0xC0);

bool isCombiningMark(char32_t c) {
    return (c >= 0x300 && c <= 0x36F) || (c >= 0x1AB0 && c <= 0x1AFF) || (c >= 0x1DC0 && c <= 0x1DFF) ||
           (c >= 0x20D0 && c <= 0x20FF) || (c >= 0xFE20 && c <= 0xFE2F);
}

char32_t withoutDiacritic(char32_t c) {
    if (c < 0xC0 || c >= 0x180) return c;
    const char base = kBaseLetters[c - 0xC0];
    return base == '.' ? c : static_cast<char32_t>(base);
}

/// Simple case folding (Unicode, CaseFolding.txt, status C and S) of what is left after the decomposition.
char32_t folded(char32_t c) {
    if (c >= 'A' && c <= 'Z') return c + 32;
    if (c == 0xB5) return 0x3BC;
    if (c >= 0xC0 && c <= 0xDE && c != 0xD7) return c + 32;
    if (c == 0x17F) return 's';
    // The pairs of Latin Extended-A: the capital is even up to U+0137, odd from U+0139 to U+0148, even again to U+0177.
    if (c >= 0x100 && c < 0x138 && c != 0x130 && c != 0x131) return c | 1;
    if (c >= 0x139 && c <= 0x148) return c % 2 == 1 ? c + 1 : c;
    if (c >= 0x14A && c < 0x178) return c | 1;
    if (c >= 0x391 && c <= 0x3A9 && c != 0x3A2) return c + 32;
    if (c == 0x3C2) return 0x3C3;
    if (c >= 0x400 && c <= 0x40F) return c + 80;
    if (c >= 0x410 && c <= 0x42F) return c + 32;
    return c;
}

/// The character at `at`, which is moved behind it.
char32_t decode(std::string_view text, std::size_t& at) {
    const auto byte = [&](std::size_t index) { return static_cast<std::uint8_t>(text[index]); };
    const std::uint8_t first = byte(at);
    const std::size_t length = first < 0x80                    ? 1
                               : first >= 0xC2 && first < 0xE0 ? 2
                               : first >= 0xE0 && first < 0xF0 ? 3
                               : first >= 0xF0 && first < 0xF5 ? 4
                                                               : 0;
    char32_t character = length == 1   ? first
                         : length == 2 ? first & 0x1Fu
                         : length == 3 ? first & 0x0Fu
                                       : first & 0x07u;
    bool isWhole = length > 0 && at + length <= text.size();
    for (std::size_t i = 1; isWhole && i < length; ++i) {
        isWhole = (byte(at + i) & 0xC0) == 0x80;
        character = character << 6 | (byte(at + i) & 0x3Fu);
    }
    at += isWhole ? length : 1;
    return isWhole ? character : kLooseByte + first;
}

}  // namespace

std::u32string foldedForComparison(std::string_view text) {
    std::u32string result;
    for (std::size_t at = 0; at < text.size();) {
        const char32_t character = decode(text, at);
        if (!isCombiningMark(character)) result += folded(withoutDiacritic(character));
    }
    return result;
}

bool beginsWithCaseAndDiacriticInsensitive(std::string_view name, std::string_view prefix) {
    return foldedForComparison(name).starts_with(foldedForComparison(prefix));
}

}  // namespace lumacast
