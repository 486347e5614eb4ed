#include "linux/system/ThemeFiles.h"

#include <gtest/gtest.h>

#include <string>

namespace lumacast {
namespace {

using namespace std::string_literals;

TEST(ThemeFiles, APlainNameIsThatOfSomethingInAFolder) {
    EXPECT_TRUE(isPlainName("Adwaita"));
    EXPECT_TRUE(isPlainName("a name with blanks"));
    for (const auto& name : {""s, "."s, ".."s, ".hidden"s, "a/b"s, "/a"s, "a/"s, "a\0b"s})
        EXPECT_FALSE(isPlainName(name)) << name;
    EXPECT_TRUE(isPlainName(std::string(kMaximumThemeName, 'a')));
    EXPECT_FALSE(isPlainName(std::string(kMaximumThemeName + 1, 'a')));
}

TEST(ThemeFiles, APlainPathIsMadeOfPlainNames) {
    EXPECT_TRUE(isPlainPath("stereo"));
    EXPECT_TRUE(isPlainPath("48x48/apps"));
    EXPECT_TRUE(isPlainPath("a/b/c"));
    for (const auto& path : {""s, "/a"s, "a/"s, "a//b"s, "../a"s, "a/../b"s, "a/.."s, "a/.b"s, "a/b\0c"s})
        EXPECT_FALSE(isPlainPath(path)) << path;
}

TEST(ThemeFiles, APathHasALimitOfItsOwn) {
    std::string path = "a";
    while (path.size() + 2 <= kMaximumThemePath) path += "/a";
    path.resize(kMaximumThemePath, 'a');
    EXPECT_TRUE(isPlainPath(path));
    EXPECT_FALSE(isPlainPath(path + "a"));
    EXPECT_FALSE(isPlainPath("a/" + std::string(kMaximumThemeName + 1, 'a'))) << "each name has its own as well";
}

TEST(ThemeFiles, AListIsReadUpToItsLimit) {
    using Items = std::vector<std::string>;
    EXPECT_EQ(listedIn("", 8), Items());
    EXPECT_EQ(listedIn(" a , b;c ,, ; d e ", 8), (Items{"a", "b", "c", "d e"}));
    EXPECT_EQ(listedIn("a,b,c", 2), (Items{"a", "b"}));
    EXPECT_EQ(listedIn("a,b,c", 0), Items());
}

}  // namespace
}  // namespace lumacast
