#include "tests/docs/Markdown.h"

#include <algorithm>
#include <cctype>
#include <sstream>
#include <utility>

#include "tests/docs/SourceTree.h"

namespace lumacast::docs {

namespace {

std::vector<std::string> linesOf(const std::string& text) {
    std::istringstream stream(text);
    std::vector<std::string> lines;
    for (std::string line; std::getline(stream, line);) lines.push_back(line);
    return lines;
}

std::string trimmed(std::string_view text) {
    const auto first = text.find_first_not_of(' ');
    if (first == std::string_view::npos) return {};
    return std::string(text.substr(first, text.find_last_not_of(' ') - first + 1));
}

bool isFence(const std::string& line) {
    return line.starts_with("```");
}

/// Moves the code blocks out of the lines; what they held is empty afterwards.
std::vector<CodeBlock> takeBlocks(std::vector<std::string>& lines) {
    std::vector<CodeBlock> blocks;
    bool isFenced = false, wasEmpty = true, isIndented = false;
    for (std::size_t i = 0; i < lines.size(); ++i) {
        std::string& line = lines[i];
        if (isFence(line)) {
            isFenced = !isFenced;
            if (isFenced) blocks.push_back({line.substr(3), static_cast<int>(i) + 2, {}});
            line.clear();
            wasEmpty = true;
            continue;
        }
        const bool isCode = line.starts_with("    ") && (wasEmpty || isIndented);
        wasEmpty = line.empty();
        if (!isFenced && !isCode) {
            isIndented = isIndented && wasEmpty;
            continue;
        }
        if (!isFenced && !isIndented) blocks.push_back({"", static_cast<int>(i) + 1, {}});
        isIndented = !isFenced;
        blocks.back().lines.push_back(isFenced ? line : line.substr(4));
        line.clear();
        wasEmpty = true;
    }
    return blocks;
}

std::string joined(const std::vector<std::string>& lines) {
    std::string text;
    for (const std::string& line : lines) text += line + "\n";
    return text;
}

int lineAt(const std::string& text, std::size_t place) {
    return 1 + static_cast<int>(std::count(text.begin(), text.begin() + static_cast<std::ptrdiff_t>(place), '\n'));
}

std::vector<Span> spansOf(const std::string& prose) {
    std::vector<Span> spans;
    for (auto open = prose.find('`'); open != std::string::npos; open = prose.find('`', open + 1)) {
        const auto close = prose.find('`', open + 1);
        if (close == std::string::npos) break;
        std::string text = prose.substr(open + 1, close - open - 1);
        std::replace(text.begin(), text.end(), '\n', ' ');
        const bool isBold =
            open >= 2 && prose.compare(open - 2, 2, "**") == 0 && prose.compare(close + 1, 2, "**") == 0;
        spans.push_back({text, lineAt(prose, open), isBold});
        open = close;
    }
    return spans;
}

std::vector<Link> linksOf(const std::string& prose) {
    std::vector<Link> links;
    for (auto middle = prose.find("]("); middle != std::string::npos; middle = prose.find("](", middle + 1)) {
        const auto end = prose.find(')', middle);
        // The text of a link may hold brackets of its own, in pairs.
        std::size_t open = middle;
        for (int depth = 1; open > 0 && depth > 0;) {
            --open;
            depth += prose[open] == ']' ? 1 : prose[open] == '[' ? -1 : 0;
        }
        if (end == std::string::npos || prose[open] != '[') continue;
        links.push_back(
            {prose.substr(middle + 2, end - middle - 2), lineAt(prose, middle), open > 0 && prose[open - 1] == '!'});
    }
    return links;
}

std::string anchorOf(const std::string& heading) {
    std::string anchor;
    for (const char c : heading) {
        if (std::isalnum(static_cast<unsigned char>(c)) || c == '-' || c == '_' || (c & 0x80))
            anchor += static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
        else if (c == ' ')
            anchor += '-';
    }
    return anchor;
}

std::size_t levelOf(std::string_view line) {
    const auto level = line.find_first_not_of('#');
    return level != std::string_view::npos && level > 0 && line[level] == ' ' ? level : 0;
}

}  // namespace

Page pageOf(std::string path, std::string text) {
    Page page{std::move(path), std::move(text), {}, {}, {}, {}, {}};
    std::vector<std::string> lines = linesOf(page.text);
    page.blocks = takeBlocks(lines);
    page.prose = joined(lines);
    page.spans = spansOf(page.prose);
    page.links = linksOf(page.prose);
    for (const std::string& line : lines)
        if (const std::size_t level = levelOf(line)) page.anchors.insert(anchorOf(line.substr(level + 1)));
    return page;
}

const std::vector<Page>& allPages() {
    static const std::vector<Page> pages = [] {
        std::vector<Page> read;
        for (const std::string& path : treeFiles())
            if (path.ends_with(".md")) read.push_back(pageOf(path, fileText(path)));
        return read;
    }();
    return pages;
}

const Page& page(std::string_view path) {
    static const Page none;
    for (const Page& page : allPages())
        if (page.path == path) return page;
    return none;
}

std::string at(const Page& page, int line) {
    return page.path + ":" + std::to_string(line) + ": ";
}

std::vector<std::string> cellsOf(std::string_view line) {
    std::vector<std::string> cells;
    if (!line.starts_with('|') || line.starts_with("|---") || line.starts_with("| ---")) return cells;
    std::string cell;
    bool isCode = false;
    for (std::size_t i = 1; i < line.size(); ++i) {
        if (line[i] == '\\' && i + 1 < line.size() && line[i + 1] == '|')
            cell += line[++i];
        else if (line[i] == '|' && !isCode)
            cells.push_back(trimmed(std::exchange(cell, {})));
        else
            cell += line[i];
        if (line[i] == '`') isCode = !isCode;
    }
    return cells;
}

std::vector<std::string> sectionOf(const Page& page, std::string_view heading) {
    std::vector<std::string> section;
    bool isIn = false;
    for (const std::string& line : linesOf(page.prose)) {
        const std::size_t level = levelOf(line);
        if (isIn && level > 0 && level <= levelOf(heading)) break;
        if (isIn) section.push_back(line);
        if (line == heading) isIn = true;
    }
    return section;
}

}  // namespace lumacast::docs
