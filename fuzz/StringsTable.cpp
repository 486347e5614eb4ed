// Tables of texts (`*.strings`): the whole input is one file.

#include "linux/apps/StringsTable.h"

#include "base/Utf8.h"
#include "fuzz/Input.h"
#include "fuzz/Property.h"

namespace lumacast::fuzz {

namespace {

std::string inQuotes(std::string_view text) {
    std::string result = "\"";
    for (const char c : text) {
        switch (c) {
            case '"': result += "\\\""; break;
            case '\\': result += "\\\\"; break;
            case '\n': result += "\\n"; break;
            case '\t': result += "\\t"; break;
            case '\r': result += "\\r"; break;
            default: result += c;
        }
    }
    return result + '"';
}

std::string printed(const StringsTable& table) {
    std::string result = "/* printed */\n";
    for (const auto& [key, text] : table.texts()) result += inQuotes(key) + " = " + inQuotes(text) + ";  // one\n";
    return result;
}

}  // namespace

void stringsTable(Bytes input) {
    const std::string_view text = textOf(input);
    const StringsTable table = StringsTable::parse(text);
    require(table.size() <= 4096, "a table has at most 4096 entries");
    std::size_t bytes = 0;
    for (const auto& [key, value] : table.texts()) {
        require(isValidUtf8(key) && isValidUtf8(value), "keys and texts are UTF-8");
        require(table.find(key) && *table.find(key) == value, "a key finds its text");
        bytes += key.size() + value.size();
    }
    require(bytes <= text.size(), "escapes never grow");
    require(isValidUtf8(text) || (table.size() == 0 && !table.isComplete()), "text that is not UTF-8 is no table");

    const StringsTable again = StringsTable::parse(printed(table));
    require(again.isComplete() || table.size() == 4096, "a printed table makes sense as a whole");
    require(again.texts() == table.texts(), "a printed table reads as the same table");

    // What stands before a mistake is kept: the first texts stay when more follows, whatever it is.
    if (!table.isComplete()) return;
    const StringsTable longer = StringsTable::parse(std::string(text) + "\n\"open");
    require(!longer.isComplete(), "a table with an open quote is not complete");
    require(longer.texts() == table.texts() || table.size() == 4096, "what stands before a mistake is kept");
}

}  // namespace lumacast::fuzz
