#include "tests/unit/architecture/SourceText.h"

#include <algorithm>
#include <cctype>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <optional>
#include <sstream>

namespace lumacast::architecture {

std::vector<SourceFile> sourcesBelow(const std::string& folder) {
    const std::filesystem::path top(LC_SOURCE_DIR);
    std::vector<SourceFile> files;
    std::error_code error;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(top / folder, error)) {
        const std::string extension = entry.path().extension().string();
        if (!entry.is_regular_file() || (extension != ".h" && extension != ".cpp")) continue;
        std::ifstream stream(entry.path(), std::ios::binary);
        files.push_back({std::filesystem::relative(entry.path(), top).string(),
                         std::string(std::istreambuf_iterator<char>(stream), {})});
    }
    return files;
}

std::vector<Include> includesOf(std::string_view text) {
    std::vector<Include> includes;
    std::istringstream lines{std::string(text)};
    std::string line;
    for (int number = 1; std::getline(lines, line); ++number) {
        std::size_t at = line.find_first_not_of(" \t");
        if (at == std::string::npos || line[at] != '#') continue;
        at = line.find_first_not_of(" \t", at + 1);
        if (at == std::string::npos || line.compare(at, 7, "include") != 0) continue;
        const std::size_t open = line.find_first_of("<\"", at);
        if (open == std::string::npos) continue;
        const std::size_t close = line.find(line[open] == '<' ? '>' : '"', open + 1);
        if (close == std::string::npos) continue;
        includes.push_back({line.substr(open + 1, close - open - 1), line[open] == '"', number});
    }
    return includes;
}

std::string codeOf(std::string_view text) {
    std::string code(text);
    enum class In { Code, LineComment, BlockComment, Text, Character } in = In::Code;
    for (std::size_t at = 0; at < code.size(); ++at) {
        const char c = code[at];
        const char next = at + 1 < code.size() ? code[at + 1] : '\0';
        switch (in) {
            case In::Code:
                if (c == '/' && next == '/') in = In::LineComment;
                if (c == '/' && next == '*') in = In::BlockComment;
                if (c == '"') in = In::Text;
                // A quote between digits separates them.
                if (c == '\'' && (at == 0 || !std::isalnum(static_cast<unsigned char>(code[at - 1]))))
                    in = In::Character;
                continue;
            case In::LineComment:
                if (c == '\n') in = In::Code;
                break;
            case In::BlockComment:
                if (c == '*' && next == '/') in = In::Code;
                break;
            case In::Text:
            case In::Character:
                if (c == '\\') code[++at < code.size() ? at : code.size() - 1] = ' ';
                if (c == (in == In::Text ? '"' : '\'')) in = In::Code;
                break;
        }
        if (c != '\n' && in != In::Code) code[at] = ' ';
    }
    return code;
}

std::vector<std::string> textsOf(std::string_view text) {
    // Blanks stand for a comment and for what a literal holds; its quotes stay, so that both can be told apart.
    const std::string code = codeOf(text);
    std::vector<std::string> texts;
    std::optional<std::string> joined;
    const auto finish = [&] {
        if (joined && !joined->empty() && std::find(texts.begin(), texts.end(), *joined) == texts.end())
            texts.push_back(*joined);
        joined.reset();
    };
    std::size_t lineStart = 0;
    for (std::size_t at = 0; at < code.size(); ++at) {
        if (code[at] == '\n') lineStart = at + 1;
        const bool isDirective = code.find_first_not_of(" \t", lineStart) < at &&
                                 code[code.find_first_not_of(" \t", lineStart)] == '#';
        if (code[at] != '"' || isDirective) {
            if (!std::isspace(static_cast<unsigned char>(code[at]))) finish();
            continue;
        }
        std::size_t end = at + 1;
        while (end < text.size() && text[end] != '"') end += text[end] == '\\' ? 2 : 1;
        joined = joined.value_or("") + std::string(text.substr(at + 1, end - at - 1));
        at = end;
    }
    finish();
    return texts;
}

bool usesName(std::string_view code, std::string_view word) {
    const auto isNamePart = [](char c) { return std::isalnum(static_cast<unsigned char>(c)) || c == '_'; };
    for (std::size_t at = code.find(word); at != std::string_view::npos; at = code.find(word, at + 1)) {
        const bool begins = at == 0 || !isNamePart(code[at - 1]);
        const std::size_t end = at + word.size();
        if (begins && (end == code.size() || !isNamePart(code[end]))) return true;
    }
    return false;
}

}  // namespace lumacast::architecture
