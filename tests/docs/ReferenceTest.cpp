// The printed pages are as the code has them.

#include <gtest/gtest.h>

#include <algorithm>
#include <sstream>

#include "base/Limits.h"
#include "base/MessageTables.h"
#include "base/RecordingErrorCodes.h"
#include "platform/PreferenceKeys.h"
#include "tests/docs/Markdown.h"
#include "tests/docs/SourceTree.h"
#include "tests/tables/Tables.h"
#include "tests/unit/architecture/SourceText.h"

namespace lumacast::docs {
namespace {

using tables::printedPages;

std::vector<std::string> linesOf(const std::string& text) {
    std::istringstream stream(text);
    std::vector<std::string> lines;
    for (std::string line; std::getline(stream, line);) lines.push_back(line);
    return lines;
}

/// Where two texts part; empty when they are alike.
std::string difference(const std::string& documented, const std::string& printed) {
    if (documented == printed) return {};
    const auto before = linesOf(documented), now = linesOf(printed);
    const auto [old, fresh] = std::mismatch(before.begin(), before.end(), now.begin(), now.end());
    return "says\n  " + (old == before.end() ? "(its end)" : *old) + "\nand the code\n  " +
           (fresh == now.end() ? "(its end)" : *fresh) + "\n`scripts/tables` writes it anew.";
}

TEST(Reference, IsAsTheCodeHasIt) {
    for (const auto& page : printedPages()) EXPECT_EQ(difference(fileText(page.path), page.text), "") << page.path;
}

TEST(Reference, ThatIsStaleIsSeen) {
    const std::string printed = tables::limitsPage();
    EXPECT_EQ(difference(printed, printed), "");
    std::string stale = printed;
    stale.replace(stale.find("1,048,576"), 9, "1,048,575");
    EXPECT_NE(difference(stale, printed), "");
    EXPECT_NE(difference(printed + "| more |\n", printed), "");
    EXPECT_NE(difference("", printed), "");
}

/// The rows of a page's tables, without the heads.
std::size_t rowsIn(const std::string& text) {
    std::size_t rows = 0;
    const auto lines = linesOf(text);
    for (std::size_t i = 0; i < lines.size(); ++i)
        if (lines[i].starts_with("| ") && !(i + 1 < lines.size() && lines[i + 1].starts_with("|---"))) ++rows;
    return rows;
}

TEST(Reference, LeavesNothingOut) {
    std::size_t messages = 0;
    for (const Protocol* protocol :
         {&daemonProtocol(), &clientProtocol(), &broadcastDaemonProtocol(), &broadcastExtensionProtocol(),
          &extensionVendorProtocol(), &extensionHostProtocol()})
        messages += protocol->messages.size();
    EXPECT_EQ(rowsIn(tables::messagesPage()), messages);
    EXPECT_EQ(rowsIn(tables::limitsPage()), kLimits.size() + kPurgeLevels.size());
    EXPECT_EQ(rowsIn(tables::preferencesPage()), kPreferenceTable.size());
    // Every text that the log is called with stands on the page.
    const std::string log = tables::logPage();
    EXPECT_GT(rowsIn(log), 200u);
    EXPECT_NE(log.find("insufficient disk space for recording, calling handler with error"), std::string::npos);
    EXPECT_NE(log.find("the user can't be asked: %s"), std::string::npos);
}

TEST(Reference, OfErrorsHasTheEnumeratorsAtTheirCodes) {
    // The page names the files that raise an error by its enumerator: two of them, known from the code.
    const std::string text = tables::errorsPage();
    for (auto code = static_cast<std::int64_t>(RecordingErrorCode::MixingFailure);
         code <= static_cast<std::int64_t>(RecordingErrorCode::Unknown); ++code)
        EXPECT_NE(text.find("| " + std::to_string(code) + " | `" + std::string(recordingErrorKey(code)) + "`"),
                  std::string::npos)
            << code;
    const auto rowOf = [&](RecordingErrorCode code) {
        const auto begin = text.find("| " + std::to_string(static_cast<std::int64_t>(code)) + " |");
        return text.substr(begin, text.find('\n', begin) - begin);
    };
    EXPECT_NE(rowOf(RecordingErrorCode::InsufficientStorage).find("`ManagerStart.cpp`"), std::string::npos);
    EXPECT_NE(rowOf(RecordingErrorCode::UserDeclined).find("`ManagerAcknowledgement.cpp`"), std::string::npos);
    EXPECT_NE(rowOf(RecordingErrorCode::DashLink).find("nowhere"), std::string::npos);
}

/// The names of the preferences that code asks for other than by the table.
std::vector<std::string> strayKeysIn(const std::string& text) {
    std::vector<std::string> stray;
    const std::string asked = "value(kPreferenceDomain, \"";
    for (auto at = text.find(asked); at != std::string::npos; at = text.find(asked, at + 1))
        stray.push_back(text.substr(at + asked.size(), text.find('"', at + asked.size()) - at - asked.size()));
    return stray;
}

TEST(Reference, HasEveryPreferenceThatIsRead) {
    for (const char* folder : {"src", "linux", "client"})
        for (const auto& file : architecture::sourcesBelow(folder))
            EXPECT_EQ(strayKeysIn(file.text), std::vector<std::string>())
                << file.path << " reads a key that is not in the table";
    EXPECT_EQ(strayKeysIn("preferences.value(kPreferenceDomain, \"LCPlanted\")").size(), 1u);
    for (const PreferenceRow& row : kPreferenceTable) {
        const std::string name = "k" + std::string(row.key.substr(2)) + "Key";
        EXPECT_TRUE(isNameIn("src/daemon", name) || isNameIn("src/session", name) || isNameIn("src/writer", name))
            << row.key << " is read nowhere";
    }
}

}  // namespace
}  // namespace lumacast::docs
