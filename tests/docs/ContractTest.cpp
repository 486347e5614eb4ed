// docs/media-contract.md: each promise names the tests that hold it.

#include <gtest/gtest.h>

#include <regex>
#include <sstream>

#include "tests/docs/Markdown.h"
#include "tests/docs/SourceTree.h"

namespace lumacast::docs {
namespace {

/// The promises of a page's tables, the rows below a head whose last column is "held by", that name no test, or one
/// that isn't there.
std::vector<std::string> emptyPromisesIn(const std::string& text, std::size_t& promises) {
    static const std::regex kTest("`([A-Z]\\w+\\.[A-Z]\\w+)`");
    std::vector<std::string> empty;
    std::istringstream lines(text);
    bool isTable = false;
    for (std::string line; std::getline(lines, line);) {
        const auto cells = cellsOf(line);
        if (cells.empty()) {
            isTable = isTable && line.starts_with('|');
            continue;
        }
        if (cells.back() == "held by")
            isTable = true;
        else if (isTable) {
            ++promises;
            std::size_t named = 0;
            for (std::sregex_iterator name(cells.back().begin(), cells.back().end(), kTest), end; name != end; ++name)
                named += testNames().contains((*name)[1].str()) ? 1 : 1000;
            if (named == 0 || named >= 1000) empty.push_back(line);
        }
    }
    return empty;
}

TEST(MediaContract, NamesATestForEachPromise) {
    std::size_t promises = 0;
    for (const std::string& line : emptyPromisesIn(docs::page("docs/media-contract.md").text, promises))
        ADD_FAILURE() << "held by no test: " << line;
    EXPECT_GT(promises, 30u);
}

TEST(MediaContract, APromiseThatNothingHoldsIsSeen) {
    const std::string head = "| promise | held by |\n|---|---|\n";
    const auto empty = [&](const std::string& row) {
        std::size_t promises = 0;
        return emptyPromisesIn(head + row + "\n", promises).size();
    };
    EXPECT_EQ(empty("| it plays | `MediaContract.NamesATestForEachPromise` |"), 0u);
    EXPECT_EQ(empty("| it plays | nothing |"), 1u);
    EXPECT_EQ(empty("| it plays | `MediaContract.NamesNoTestThatIsThere` |"), 1u);
    EXPECT_EQ(empty("| it plays | `MediaContract.NamesATestForEachPromise`, `Golden.IsNone` |"), 1u);
}

}  // namespace
}  // namespace lumacast::docs
