// The project's number, wherever it is written down again.

#include <gtest/gtest.h>

#include <regex>

#include "tests/docs/SourceTree.h"

namespace lumacast::docs {
namespace {

/// What the first place that matches has in its first group.
std::string firstIn(const std::string& text, const std::string& pattern) {
    std::smatch match;
    return std::regex_search(text, match, std::regex(pattern)) ? match[1].str() : std::string();
}

TEST(Version, OfTheNewestEntryOfTheChangelogIsTheProjects) {
    // Debian's own revisions of a version follow a hyphen.
    EXPECT_EQ(firstIn(fileText("debian/changelog"), "^lumacastd \\(([^)-]+)(-[^)]*)?\\)"), LC_PROJECT_VERSION);
}

TEST(Version, OfTheNewestReleaseInTheMetainfoIsTheProjects) {
    // Releases stand with the newest one first.
    const std::string metainfo = fileText("packaging/lumacastctl/org.lumacast.lumacastctl.metainfo.xml");
    EXPECT_EQ(firstIn(metainfo, "<release\\s[^>]*\\bversion=\"([^\"]*)\""), LC_PROJECT_VERSION);
}

}  // namespace
}  // namespace lumacast::docs
