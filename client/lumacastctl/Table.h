#pragma once
// Columns of text with a heading, for people.

#include <string>
#include <vector>

namespace lumacast::ctl {

struct Column {
    enum class Side { Left, Right };
    const char* title;
    Side side = Side::Left;
};

/// The heading and a line for each row, two blanks between columns, nothing behind the last word of a line. A row has
/// as many texts as there are columns; they are written as they are.
std::string tableText(const std::vector<Column>& columns, const std::vector<std::vector<std::string>>& rows);

}  // namespace lumacast::ctl
