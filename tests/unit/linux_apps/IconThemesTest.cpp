#include "linux/apps/IconThemes.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "tests/contract/ScratchDirectory.h"

namespace lumacast {
namespace {

class IconThemesTest : public ::testing::Test {
protected:
    static std::string png(const std::string& contents) { return "\x89PNG\r\n\x1a\n" + contents; }
    static std::optional<std::string> contentsOf(const std::optional<Data>& icon) {
        return icon ? std::optional(std::string(icon->begin() + 8, icon->end())) : std::nullopt;
    }
    std::string icon(const std::string& path, const std::string& contents) {
        return scratch_.write("data/icons/" + path, png(contents));
    }
    std::optional<std::string> find(const std::string& name, int size) { return contentsOf(themes_.png(name, size)); }
    void SetUp() override {
        scratch_.write("data/icons/hicolor/index.theme",
                       "[Icon Theme]\nName=Hicolor\nDirectories=16x16/apps,48x48/apps,128x128/apps,big\n"
                       "[16x16/apps]\nSize=16\nType=Fixed\n[48x48/apps]\nSize=48\nType=Threshold\nThreshold=2\n"
                       "[128x128/apps]\nSize=128\n[big]\nSize=128\nScale=2\nType=Fixed\n");
    }

    ScratchDirectory scratch_;
    IconThemes themes_{
        scratch_.path("home"), {scratch_.path("data"), scratch_.path("more")}, {scratch_.path("config")}};
};

TEST_F(IconThemesTest, TheNearestSizeIsTaken) {
    icon("hicolor/16x16/apps/player.png", "16");
    icon("hicolor/48x48/apps/player.png", "48");
    icon("hicolor/128x128/apps/player.png", "128");
    icon("hicolor/big/player.png", "256");
    EXPECT_EQ(find("player", 16), "16");
    EXPECT_EQ(find("player", 32), "48");
    EXPECT_EQ(find("player", 50), "48");
    EXPECT_EQ(find("player", 64), "48");
    EXPECT_EQ(find("player", 120), "128");
    EXPECT_EQ(find("player", 128), "128") << "a folder of another scale is not for it";
    EXPECT_EQ(find("player.png", 16), "16") << "names are often written with their ending";
    EXPECT_EQ(find("other", 16), std::nullopt);
}

TEST_F(IconThemesTest, TheDesktopsThemeGoesBeforeItsParentsAndTheyBeforeTheDefault) {
    scratch_.write("config/gtk-3.0/settings.ini", "[Settings]\ngtk-icon-theme-name=Fine\n");
    scratch_.write("data/icons/Fine/index.theme",
                   "[Icon Theme]\nInherits=Parent,../evil\nDirectories=48\n[48]\nSize=48\n");
    scratch_.write("more/icons/Parent/index.theme", "[Icon Theme]\nInherits=Fine\nDirectories=48\n[48]\nSize=48\n");
    EXPECT_EQ(themes_.currentTheme(), "Fine");
    icon("hicolor/48x48/apps/player.png", "default");
    EXPECT_EQ(find("player", 48), "default");
    scratch_.write("more/icons/Parent/48/player.png", png("parent"));
    EXPECT_EQ(find("player", 48), "parent");
    icon("Fine/48/player.png", "fine");
    EXPECT_EQ(find("player", 48), "fine");
}

TEST_F(IconThemesTest, TheUsersOwnIconsAndThoseOutsideThemesAreFound) {
    scratch_.write("more/pixmaps/player.png", png("pixmap"));
    EXPECT_EQ(find("player", 48), "pixmap");
    scratch_.write("home/.icons/hicolor/48x48/apps/player.png", png("home"));
    EXPECT_EQ(find("player", 48), "home");
}

TEST_F(IconThemesTest, NamesDontLeadOutOfTheirFolders) {
    scratch_.write("secret.png", png("secret"));
    scratch_.write("data/secret.png", png("secret"));
    for (const char* name :
         {"../secret", "../../secret", "../../../secret", "x/../../secret", "", ".", "..", ".secret"})
        EXPECT_EQ(find(name, 48), std::nullopt) << name;
}

TEST_F(IconThemesTest, APathIsTakenAsItStandsWhereTheFileIsTheUsersOrTheAdministrators) {
    const std::string path = scratch_.write("own.png", png("own"));
    EXPECT_EQ(find(path, 48), "own");
    ::chmod(path.c_str(), 0666);
    EXPECT_EQ(find(path, 48), std::nullopt) << "everybody may write it";
    ::chmod(path.c_str(), 0644);
    if (::geteuid() == 0) {
        ASSERT_EQ(::chown(path.c_str(), 12345, 0), 0);
        EXPECT_EQ(find(path, 48), std::nullopt) << "somebody else's";
    }
    EXPECT_EQ(find(scratch_.path("not-there.png"), 48), std::nullopt);
    EXPECT_EQ(find(scratch_.makeDirectory("folder.png"), 48), std::nullopt);
}

TEST_F(IconThemesTest, WhatIsNoPngOrTooLargeIsNoIcon) {
    EXPECT_EQ(find(scratch_.write("text.png", "not a picture"), 48), std::nullopt);
    EXPECT_EQ(find(scratch_.write("largest.png", png(std::string((1 << 20) - 8, 'x'))), 48)->size(), (1u << 20) - 8);
    EXPECT_EQ(find(scratch_.write("larger.png", png(std::string((1 << 20) - 7, 'x'))), 48), std::nullopt);
    const std::string pipe = scratch_.path("pipe.png");
    ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
    EXPECT_EQ(find(pipe, 48), std::nullopt) << "and nothing waits for a writer";
}

}  // namespace
}  // namespace lumacast
