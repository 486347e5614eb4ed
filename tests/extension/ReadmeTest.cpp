// The example in the library's README is the one that is built.

#include <gtest/gtest.h>

#include <string>

#include "tests/contract/ScratchDirectory.h"

namespace lumacast::test {
namespace {

TEST(ExtensionReadme, ShowsTheExampleThatIsBuilt) {
    const std::string code = ScratchDirectory::read(LC_SOURCE_DIR "/tests/consumer/extension/main.cpp");
    const std::string begin = "// [extension]\n";
    const auto from = code.find(begin);
    const auto to = code.find("// [/extension]");
    ASSERT_NE(from, std::string::npos);
    ASSERT_NE(to, std::string::npos);
    const std::string example = "```cpp\n" + code.substr(from + begin.size(), to - from - begin.size()) + "```\n";
    EXPECT_NE(ScratchDirectory::read(LC_SOURCE_DIR "/client/extension/README.md").find(example), std::string::npos) << example;
}

}  // namespace
}  // namespace lumacast::test
