// Every link of every page leads somewhere, and every picture is there.

#include <gtest/gtest.h>

#include <filesystem>

#include "tests/docs/Markdown.h"
#include "tests/docs/SourceTree.h"

namespace lumacast::docs {
namespace {

namespace fs = std::filesystem;

/// What is wrong with a link; empty for a good one and for one that leads out of the tree.
std::string faultOf(const Page& page, const Link& link) {
    if (link.target.find("://") != std::string::npos || link.target.starts_with("mailto:")) return {};
    const auto hash = link.target.find('#');
    const std::string file = link.target.substr(0, hash);
    const std::string path =
        file.empty() ? page.path : (fs::path(page.path).parent_path() / file).lexically_normal().string();
    if (path.starts_with("..") || path.starts_with("/")) return "leads out of the tree";
    if (!file.empty() && !isThere(path)) return path + " is not there";
    if (hash == std::string::npos) return {};
    const Page& target = file.empty() ? page : docs::page(path);
    return target.anchors.contains(link.target.substr(hash + 1)) ? "" : path + " has no such heading";
}

TEST(Links, LeadToWhatIsThere) {
    std::size_t links = 0;
    for (const Page& page : allPages())
        for (const Link& link : page.links) {
            ++links;
            EXPECT_EQ(faultOf(page, link), "") << at(page, link.line) << link.target;
        }
    EXPECT_GT(links, 35u) << "the pages were not found";
}

TEST(Links, ThatLeadNowhereAreSeen) {
    const auto fault = [](const std::string& text) {
        const Page page = pageOf("docs/planted.md", "# Planted page\n\n" + text + "\n");
        return page.links.empty() ? "no link" : faultOf(page, page.links.front());
    };
    EXPECT_EQ(fault("[a](tour.md)"), "");
    EXPECT_EQ(fault("[a](../README.md)"), "");
    EXPECT_EQ(fault("[a](#planted-page)"), "");
    EXPECT_EQ(fault("![a [b] c](demo.png)"), "");
    EXPECT_NE(fault("[a](README.md)"), "");
    EXPECT_NE(fault("[a](tour.md#no-such-heading)"), "");
    EXPECT_NE(fault("[a](../../elsewhere)"), "");
    EXPECT_NE(fault("![a](none.png)"), "");
    EXPECT_EQ(fault("```\n[a](none)\n```"), "no link") << "what is shown as it is has no links";
}

TEST(Links, EveryPageOfTheDocsIsReachedFromTheFirst) {
    std::set<std::string> seen, next{"README.md"};
    while (!next.empty()) {
        const std::string path = *next.begin();
        next.erase(next.begin());
        if (!seen.insert(path).second) continue;
        const Page& from = docs::page(path);
        for (const Link& link : from.links) {
            std::string target = link.target.substr(0, link.target.find('#'));
            if (target.empty() || target.find("://") != std::string::npos) continue;
            target = (fs::path(path).parent_path() / target).lexically_normal().string();
            if (target.ends_with(".md")) next.insert(target);
        }
    }
    for (const Page& page : allPages())
        if (page.path.starts_with("docs/")) {
            EXPECT_TRUE(seen.contains(page.path)) << page.path << " is linked from nowhere";
        }
}

}  // namespace
}  // namespace lumacast::docs
