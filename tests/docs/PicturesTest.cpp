// Every picture of the documentation can be made again: a table says by what.

#include <gtest/gtest.h>

#include <map>

#include "tests/docs/Markdown.h"
#include "tests/docs/SourceTree.h"

namespace lumacast::docs {
namespace {

/// Pictures and the script that makes each, by the table in `text`'s page.
std::map<std::string, std::string> makersIn(const Page& page) {
    std::map<std::string, std::string> makers;
    for (std::size_t i = 0; i + 1 < page.spans.size(); ++i) {
        const std::string& picture = page.spans[i].text;
        const bool isSameRow = page.spans[i].line == page.spans[i + 1].line;
        if (picture.ends_with(".png") && isSameRow)
            makers[picture] = page.spans[i + 1].text.substr(0, page.spans[i + 1].text.find(' '));
    }
    return makers;
}

/// What is wrong with a picture's row; empty for a good one. Scripts may make one picture for each language.
std::string faultOf(const std::string& picture, const std::string& script) {
    if (!isThere(script)) return script + " is not there";
    const std::string name = picture.substr(picture.rfind('/') + 1), text = fileText(script);
    const auto language = name.rfind('-');
    const bool makesIt =
        text.find(name) != std::string::npos ||
        (language != std::string::npos && text.find(name.substr(0, language) + "-$language.png") != std::string::npos);
    return makesIt ? "" : script + " does not make " + picture;
}

TEST(Pictures, AreMadeByAScriptThatThePageNames) {
    const auto makers = makersIn(docs::page("docs/maintaining.md"));
    std::size_t pictures = 0;
    for (const std::string& file : treeFiles()) {
        if (!file.starts_with("docs/") || !(file.ends_with(".png") || file.ends_with(".jpg") || file.ends_with(".svg")))
            continue;
        ++pictures;
        const auto maker = makers.find(file);
        ASSERT_NE(maker, makers.end()) << file << " is made by nothing that docs/maintaining.md names";
        EXPECT_EQ(faultOf(file, maker->second), "");
    }
    EXPECT_EQ(pictures, makers.size()) << "a row is for a picture that is not there";
    EXPECT_GT(pictures, 4u);
}

TEST(Pictures, ThatNothingMakesAreSeen) {
    EXPECT_EQ(faultOf("docs/dialog-de.png", "scripts/pictures"), "");
    EXPECT_NE(faultOf("docs/dialog-de.png", "scripts/demo"), "");
    EXPECT_NE(faultOf("docs/dialog-de.png", "scripts/none"), "");
}

TEST(Pictures, AreAllShown) {
    std::set<std::string> shown;
    for (const Page& page : allPages())
        for (const Link& link : page.links)
            if (link.isPicture) shown.insert(link.target.substr(link.target.rfind('/') + 1));
    for (const std::string& file : treeFiles())
        if (file.starts_with("docs/") && file.ends_with(".png") && file != "docs/dialog-de.png") {
            EXPECT_TRUE(shown.contains(file.substr(file.rfind('/') + 1))) << file << " is shown nowhere";
        }
}

}  // namespace
}  // namespace lumacast::docs
