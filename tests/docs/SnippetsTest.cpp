// The examples that the pages show are the ones that are built and run.

#include <gtest/gtest.h>

#include <algorithm>

#include "linux/apps/DesktopEntry.h"
#include "linux/extensions/ExtensionManifest.h"
#include "tests/docs/Markdown.h"
#include "tests/docs/SourceTree.h"

namespace lumacast::docs {
namespace {

/// What stands in a source between "// [name]" and "// [/name]"; the whole of it when there is no name.
std::string partOf(const std::string& path, const std::string& name) {
    const std::string text = fileText(path);
    if (name.empty()) return text;
    const std::string begin = "// [" + name + "]\n";
    const auto from = text.find(begin), to = text.find("// [/" + name + "]");
    return from == std::string::npos || to == std::string::npos
               ? ""
               : text.substr(from + begin.size(), to - from - begin.size());
}

std::string textOf(const CodeBlock& block) {
    std::string text;
    for (const std::string& line : block.lines) text += line + "\n";
    return text;
}

bool shows(const Page& page, const std::string& language, const std::string& text) {
    return std::any_of(page.blocks.begin(), page.blocks.end(),
                       [&](const CodeBlock& block) { return block.language == language && textOf(block) == text; });
}

struct Snippet {
    const char *page, *language, *source, *part;
};
constexpr Snippet kSnippets[] = {
    {"docs/record-your-application.md", "cpp", "tests/consumer/recorder/main.cpp", "record"},
    {"docs/record-your-application.md", "cmake", "tests/consumer/CMakeLists.txt", ""},
    {"docs/record-your-application.md", "ini", "tests/consumer/recorder/org.example.Recorder.desktop.in", ""},
    {"docs/write-an-upload-extension.md", "cpp", "tests/consumer/extension/main.cpp", "extension"},
    {"docs/write-an-upload-extension.md", "json", "tests/consumer/extension/manifest.json", ""},
};

TEST(Snippets, AreWhatIsBuilt) {
    for (const Snippet& snippet : kSnippets) {
        const std::string text = partOf(snippet.source, snippet.part);
        ASSERT_NE(text, "") << snippet.source;
        EXPECT_TRUE(shows(docs::page(snippet.page), snippet.language, text))
            << snippet.page << " does not show " << snippet.source << ":\n"
            << text;
    }
}

TEST(Snippets, ThatDifferAreSeen) {
    const Page page = pageOf("docs/planted.md", "```cpp\nint one = 1;\n```\n");
    EXPECT_TRUE(shows(page, "cpp", "int one = 1;\n"));
    EXPECT_FALSE(shows(page, "cpp", "int one = 2;\n"));
    EXPECT_FALSE(shows(page, "json", "int one = 1;\n"));
}

TEST(Snippets, AreAsShortAsThePagesSay) {
    const auto lines = [](const std::string& text) { return std::count(text.begin(), text.end(), '\n'); };
    EXPECT_LE(lines(partOf("tests/consumer/recorder/main.cpp", "record")), 22);
    EXPECT_LE(lines(partOf("tests/consumer/extension/main.cpp", "extension")), 40);
}

TEST(Snippets, OfTheDesktopEntryAndTheManifestAreOnesThatTheDaemonTakes) {
    const auto entry = DesktopEntry::parse(fileText("tests/consumer/recorder/org.example.Recorder.desktop.in"));
    ASSERT_TRUE(entry);
    EXPECT_TRUE(entry->isApplication);
    EXPECT_EQ(entry->program(), "@CMAKE_INSTALL_PREFIX@/bin/recorder");
    const auto parsed = ExtensionManifest::parse(fileText("tests/consumer/extension/manifest.json"));
    const auto* manifest = std::get_if<ExtensionManifest>(&parsed);
    ASSERT_TRUE(manifest) << std::get<std::string>(parsed);
    EXPECT_EQ(manifest->identifier, "org.example.clip-keeper");
    EXPECT_EQ(manifest->executable, "clip-keeper");
    EXPECT_NE(manifest->processMode, "LCBroadcastProcessModeSampleBuffer");
    EXPECT_FALSE(manifest->grants.network);
    EXPECT_NE(textBelow("src", {".h", ".cpp"}).find("\"" + manifest->extensionPoint + "\""), std::string::npos);
}

}  // namespace
}  // namespace lumacast::docs
