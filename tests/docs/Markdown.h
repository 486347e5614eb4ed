#pragma once
// A page of the documentation, taken apart.

#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace lumacast::docs {

/// Lines that are shown as they are: between fences, or indented by four columns behind an empty line.
struct CodeBlock {
    std::string language;  ///< the word behind the fence; empty where there is none
    int line = 0;          ///< of the page, of its first line; from 1
    std::vector<std::string> lines;
};

/// What stands between backticks, in one line.
struct Span {
    std::string text;
    int line = 0;
    bool isBold = false;  ///< between two stars on each side
};

struct Link {
    std::string target;
    int line = 0;
    bool isPicture = false;
};

struct Page {
    std::string path;  ///< below the top of the tree
    std::string text;
    std::string prose;  ///< the text with blanks for the code blocks
    std::vector<CodeBlock> blocks;
    std::vector<Span> spans;
    std::vector<Link> links;
    std::set<std::string> anchors;  ///< what "#..." may name: the headings, as web front ends make anchors of them
};

Page pageOf(std::string path, std::string text);

/// Every page (*.md) of the tree, sorted; build folders are left out. Read once.
const std::vector<Page>& allPages();
/// One of them; a page without text when it is not there.
const Page& page(std::string_view path);

/// "docs/tour.md:12: "
std::string at(const Page& page, int line);

/// The cells of a table's row, without the bars and the blanks around them; none for another line, or the row below the
/// head.
std::vector<std::string> cellsOf(std::string_view line);

/// The lines of the section that begins with this heading ("## Limits"), up to the next heading of its level or above.
std::vector<std::string> sectionOf(const Page& page, std::string_view heading);

}  // namespace lumacast::docs
