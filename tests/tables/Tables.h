#pragma once
// The tables of docs/reference/, as the code has them: `print_tables` writes them, and a test compares the pages with
// them.

#include <string>
#include <vector>

namespace lumacast::tables {

struct PrintedPage {
    std::string path;  ///< below the top of the tree
    std::string text;
};

/// Every printed page. Reads the source tree; blocks for the disk.
std::vector<PrintedPage> printedPages();

std::string messagesPage();
std::string errorsPage();
std::string limitsPage();
std::string logPage();
std::string preferencesPage();
std::string textsPage();

/// "| a | b |", bars in the cells escaped.
std::string row(const std::vector<std::string>& cells);
/// The row and the line below a table's head.
std::string head(const std::vector<std::string>& cells);
/// The text between backticks.
std::string code(std::string_view text);
/// 1,048,576
std::string grouped(std::uint64_t number);

}  // namespace lumacast::tables
