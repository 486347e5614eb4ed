#pragma once
#include <string>
#include <string_view>

namespace lumacast {

/// Whether `name` begins with `prefix`, case and diacritics aside: the letters of Latin-1 and Latin Extended-A are
/// taken apart and combining marks dropped, then Latin, Greek and Cyrillic letters are folded by their simple case
/// folding. UTF-8; a byte that is no part of a character counts as itself.
bool beginsWithCaseAndDiacriticInsensitive(std::string_view name, std::string_view prefix);

/// What is compared: code points.
std::u32string foldedForComparison(std::string_view text);

}  // namespace lumacast
