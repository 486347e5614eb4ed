// Every text of the system stands in docs/texts.md: log lines, keys, names that travel. Other programs read them, so none
// changes unnoticed.

#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <iterator>
#include <sstream>
#include <string>
#include <vector>

#include "tests/unit/architecture/SourceText.h"

namespace lumacast::architecture {
namespace {

constexpr char kHead[] =
    "# The texts of the system\n\n"
    "Every text in `src/`, file by file, as it stands in the code: log lines, keys, names that travel, texts that are\n"
    "printed. Other programs and people's searches rely on them, spelling and spacing included. Printed from the code and\n"
    "compared with it by a test, which leaves the new page in the build folder when they differ.\n";

std::string page() {
    auto files = sourcesBelow("src");
    std::sort(files.begin(), files.end(), [](const auto& a, const auto& b) { return a.path < b.path; });
    std::string page = kHead;
    for (const SourceFile& file : files) {
        const auto texts = textsOf(file.text);
        if (texts.empty()) continue;
        page += "\n## " + file.path + "\n\n";
        for (const std::string& text : texts) page += "- `" + text + "`\n";
    }
    return page;
}

std::vector<std::string> linesOf(const std::string& text) {
    std::istringstream stream(text);
    std::vector<std::string> lines;
    for (std::string line; std::getline(stream, line);) lines.push_back(line);
    return lines;
}

TEST(Texts, AreThoseOfTheirPage) {
    std::ifstream stream(LC_SOURCE_DIR "/docs/texts.md", std::ios::binary);
    const std::string documented(std::istreambuf_iterator<char>(stream), {});
    const std::string printed = page();
    if (documented == printed) return;
    std::ofstream(LC_BINARY_DIR "/texts.md", std::ios::binary) << printed;
    const auto before = linesOf(documented), now = linesOf(printed);
    const auto [old, fresh] = std::mismatch(before.begin(), before.end(), now.begin(), now.end());
    ADD_FAILURE() << "docs/texts.md says\n  " << (old == before.end() ? "(its end)" : *old) << "\nand the code\n  "
                  << (fresh == now.end() ? "(its end)" : *fresh)
                  << "\nThe page as the code has it is texts.md in the build folder.";
}

TEST(Texts, AreFoundOutsideOfCommentsAndIncludesAndJoined) {
    EXPECT_EQ(textsOf("#include \"a.h\"\n"
                      "// \"comment\"\n"
                      "f(\"one \"\n  \"line\", \"two\\\" quoted\"); /* \"x\" */ g(\"two\\\" quoted\", \"\", '\"', \"last\")"),
              (std::vector<std::string>{"one line", "two\\\" quoted", "last"}));
    EXPECT_TRUE(textsOf("int x = 1;").empty());
}

TEST(Texts, ErrorsThatTheDaemonNeverRaisesAreNamedNowhere) {
    // Codes that only the client framework knows.
    for (const char* code : {"Unknown", "Disabled", "Failed", "SystemDormancy", "ActivePhoneCall", "DashLink",
                             "ConnectionInvalid", "ConnectionInterrupted"}) {
        const std::string name = std::string("RecordingErrorCode::") + code;
        for (const char* folder : {"src", "linux"})
            for (const SourceFile& file : sourcesBelow(folder)) {
                if (file.path.ends_with("/RecordingErrorCodes.cpp")) continue;  // the table of all keys
                EXPECT_FALSE(usesName(codeOf(file.text), name)) << file.path << " raises " << name;
            }
    }
}

}  // namespace
}  // namespace lumacast::architecture
