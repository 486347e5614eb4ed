// The texts of the system: log lines, keys, names that travel. Other programs read them, so none changes unnoticed: each
// stands in docs/texts.md, which tests/docs compares with the code.

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "tests/unit/architecture/SourceText.h"

namespace lumacast::architecture {
namespace {

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
