#pragma once
// Looking at the source tree.

#include <string>
#include <string_view>
#include <vector>

namespace lumacast::architecture {

/// One source file: its path below the top of the tree, and its text.
struct SourceFile {
    std::string path;
    std::string text;
};

/// An #include of a file: what stands between the quotes or brackets.
struct Include {
    std::string name;
    bool isQuoted = false;
    int line = 0;
};

/// All .h and .cpp files below a folder of the tree; none when the folder is not there.
std::vector<SourceFile> sourcesBelow(const std::string& folder);

std::vector<Include> includesOf(std::string_view text);

/// The text with comments and string literals as blanks, so that a word in them is not taken for code.
std::string codeOf(std::string_view text);

/// The string literals of the code, as they stand in the source, neighbours joined; no names of #includes, each text
/// once, in the order of its first use.
std::vector<std::string> textsOf(std::string_view text);

/// Whether `word` stands in `code` as a name of its own ("std::thread" is not in "std::thread_id").
bool usesName(std::string_view code, std::string_view word);

}  // namespace lumacast::architecture
