#pragma once
#include <map>
#include <optional>
#include <string>
#include <string_view>

namespace lumacast {

/// The texts of one language by their keys. Files hold `"KEY" = "text";` with comments of both kinds between, in UTF-8;
/// within quotes \" \\ \n \t \r and \uXXXX (also \UXXXX; surrogate pairs make one character) are escapes, a backslash
/// before anything else stands for that alone. A key may be written without quotes.
class StringsTable {
public:
    /// A pure parser. Reads as far as the text makes sense: what stands before a mistake is kept, what follows is not.
    /// At most 4096 entries. A key given twice keeps its first text. Text that is not UTF-8 gives an empty table.
    static StringsTable parse(std::string_view text);

    /// The text of `key`, or null.
    const std::string* find(std::string_view key) const;
    std::size_t size() const { return texts_.size(); }
    const std::map<std::string, std::string, std::less<>>& texts() const { return texts_; }
    /// Whether the whole file made sense.
    bool isComplete() const { return complete_; }

private:
    std::map<std::string, std::string, std::less<>> texts_;
    bool complete_ = false;
};

}  // namespace lumacast
