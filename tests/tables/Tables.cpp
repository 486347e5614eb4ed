#include "tests/tables/Tables.h"

namespace lumacast::tables {

std::string row(const std::vector<std::string>& cells) {
    std::string line = "|";
    for (const std::string& cell : cells) {
        line += ' ';
        for (const char c : cell) line += c == '|' ? std::string("\\|") : std::string(1, c);
        line += cell.empty() ? "|" : " |";
    }
    return line + "\n";
}

std::string head(const std::vector<std::string>& cells) {
    std::string line = "|";
    for (std::size_t i = 0; i < cells.size(); ++i) line += "---|";
    return row(cells) + line + "\n";
}

std::string code(std::string_view text) {
    return "`" + std::string(text) + "`";
}

std::string grouped(std::uint64_t number) {
    std::string text = std::to_string(number);
    for (std::size_t at = text.size(); at > 3;) text.insert(at -= 3, ",");
    return text;
}

std::vector<PrintedPage> printedPages() {
    return {{"docs/reference/messages.md", messagesPage()},       {"docs/reference/errors.md", errorsPage()},
            {"docs/reference/limits.md", limitsPage()},           {"docs/reference/log.md", logPage()},
            {"docs/reference/preferences.md", preferencesPage()}, {"docs/texts.md", textsPage()}};
}

}  // namespace lumacast::tables
