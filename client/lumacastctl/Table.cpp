#include "client/lumacastctl/Table.h"

#include <algorithm>
#include <cstddef>

namespace lumacast::ctl {

std::string tableText(const std::vector<Column>& columns, const std::vector<std::vector<std::string>>& rows) {
    std::vector<std::string> titles;
    std::vector<std::size_t> widths;
    for (const Column& column : columns) {
        titles.emplace_back(column.title);
        widths.push_back(titles.back().size());
    }
    for (const auto& row : rows)
        for (std::size_t i = 0; i < columns.size(); ++i) widths[i] = std::max(widths[i], row[i].size());
    std::string text;
    const auto write = [&](const std::vector<std::string>& row) {
        std::string line;
        for (std::size_t i = 0; i < columns.size(); ++i) {
            const std::string filling(widths[i] - row[i].size(), ' ');
            if (i > 0) line += "  ";
            line += columns[i].side == Column::Side::Left ? row[i] + filling : filling + row[i];
        }
        text += line.erase(line.find_last_not_of(' ') + 1) + "\n";
    };
    write(titles);
    for (const auto& row : rows) write(row);
    return text;
}

}  // namespace lumacast::ctl
