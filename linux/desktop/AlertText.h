#pragma once
// Texts that applications had a say in, made fit to be shown in a question. All pure.

#include <cstddef>
#include <string>
#include <string_view>

namespace lumacast {

/// One line without anything that a reader doesn't see or that changes how the rest is read: line breaks, control and
/// other blank characters become single blanks; marks of writing direction and invisible characters go; at most four
/// combining marks follow each other; what is not UTF-8 becomes U+FFFD. Of a text with more than `maximum` (at least 8)
/// characters the middle is left out, so that what a sentence says after a name that is too long can still be read.
std::string plainAlertText(std::string_view text, std::size_t maximum);

/// A plain text in lines of at most `columns` (wide characters take two), broken between words where it can be. A
/// window is as wide as its longest line, so no name makes one as wide as it likes.
std::string inLines(std::string_view text, int columns);

/// The text as Pango markup and both dialog programs read it literally. They undo backslashes before they read markup:
/// so a backslash is written as a character reference, like everything that means something in markup.
std::string asMarkup(std::string_view text);

}  // namespace lumacast
