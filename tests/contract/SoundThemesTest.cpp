#include <gtest/gtest.h>

#include "linux/sounds/EventSound.h"
#include "linux/sounds/SoundThemes.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::sound {
namespace {

class SoundThemesTest : public ::testing::Test {
protected:
    void theme(const ScratchDirectory& data, const std::string& name, const std::string& parents = "",
               const std::string& folders = "stereo") {
        data.write("sounds/" + name + "/index.theme",
                   "[Sound Theme]\nName=" + name + "\nInherits=" + parents + "\nDirectories=" + folders +
                       "\n[stereo]\nOutputProfile=stereo\n[surround]\nOutputProfile=5.1\n");
    }
    void wanted(const std::string& name) {
        config_.write("gtk-3.0/settings.ini", "[Settings]\ngtk-sound-theme-name=" + name + "\n");
    }
    std::string sound(const ScratchDirectory& data, const std::string& name) {
        return data.write("sounds/" + name, "x");
    }
    std::vector<std::string> files(const std::vector<std::string>& names) { return themes_.files(names); }
    using Files = std::vector<std::string>;

    ScratchDirectory user_, system_, config_;
    const SoundThemes themes_{{user_.path(), system_.path()}, {config_.path()}};
};

TEST_F(SoundThemesTest, WithoutSettingsItIsFreedesktop) {
    EXPECT_EQ(themes_.currentTheme(), "freedesktop");
    wanted("ocean");
    EXPECT_EQ(themes_.currentTheme(), "ocean");
    config_.write("kdeglobals", "[Sounds]\nTheme=breeze\n");
    EXPECT_EQ(themes_.currentTheme(), "breeze");
}

TEST_F(SoundThemesTest, AThemeIsAskedBeforeItsParentsAndFreedesktopLast) {
    wanted("child");
    theme(system_, "child", "first,second");
    theme(system_, "first", "grand");
    theme(system_, "second");
    theme(system_, "grand");
    theme(system_, "freedesktop");
    const Files expected{sound(system_, "child/stereo/bell.oga"),       sound(system_, "first/stereo/bell.oga"),
                         sound(system_, "grand/stereo/bell.oga"),       sound(system_, "second/stereo/bell.oga"),
                         sound(system_, "freedesktop/stereo/bell.oga"), sound(system_, "bell.wav")};
    EXPECT_EQ(files({"bell"}), expected);
}

TEST_F(SoundThemesTest, ThemesThatInheritFromEachOtherEnd) {
    wanted("one");
    theme(system_, "one", "two");
    theme(system_, "two", "one,two,freedesktop");
    const std::string bell = sound(system_, "two/stereo/bell.ogg");
    EXPECT_EQ(files({"bell"}), Files{bell});
}

TEST_F(SoundThemesTest, AThemeMayLieInSeveralDirectoriesAndTheUsersComeFirst) {
    theme(system_, "freedesktop");
    const Files expected{sound(user_, "freedesktop/stereo/bell.wav"), sound(system_, "freedesktop/stereo/bell.oga")};
    EXPECT_EQ(files({"bell"}), expected);
}

TEST_F(SoundThemesTest, TheFirstNameComesBeforeTheSecondWhateverTheTheme) {
    wanted("child");
    theme(system_, "child");
    theme(system_, "freedesktop");
    const std::string second = sound(system_, "child/stereo/second.oga");
    const Files expected{sound(system_, "freedesktop/stereo/first.oga"), second};
    EXPECT_EQ(files({"first", "second"}), expected);
}

TEST_F(SoundThemesTest, SoundsForOtherOutputsDoNotCount) {
    theme(system_, "freedesktop", "", "surround,stereo");
    sound(system_, "freedesktop/surround/bell.oga");
    EXPECT_EQ(files({"bell"}), Files{});
}

TEST_F(SoundThemesTest, AMarkThatASoundIsDisabledDoesNotCount) {
    theme(system_, "freedesktop");
    sound(system_, "freedesktop/stereo/bell.disabled");
    const std::string bell = sound(system_, "freedesktop/stereo/bell.oga");
    EXPECT_EQ(files({"bell"}), Files{bell});
}

TEST_F(SoundThemesTest, NamesThatLeadElsewhereFindNothing) {
    theme(system_, "freedesktop", "", "../../outside,stereo");
    system_.write("outside/bell.oga", "x");
    sound(system_, "freedesktop/bell.oga");
    sound(system_, "freedesktop/stereo/ring.oga");
    EXPECT_EQ(files({"bell", "../bell", "stereo/../../bell", ""}), Files{});
    wanted("../sounds/freedesktop");
    EXPECT_EQ(themes_.currentTheme(), "freedesktop");
}

TEST_F(SoundThemesTest, AFolderOrAPipeIsNoSound) {
    theme(system_, "freedesktop");
    system_.makeDirectory("sounds/freedesktop/stereo/bell.oga");
    ASSERT_EQ(::mkfifo(system_.path("sounds/freedesktop/stereo/ring.oga").c_str(), 0600), 0);
    EXPECT_EQ(files({"bell", "ring"}), Files{});
    EXPECT_EQ(readSoundFile(system_.path("sounds/freedesktop/stereo/ring.oga")), std::nullopt);
}

TEST_F(SoundThemesTest, WhatIsNoSoundIsNotRead) {
    EXPECT_EQ(readSoundFile(system_.write("a.wav", "")), std::nullopt);
    EXPECT_EQ(readSoundFile(system_.write("b.wav", "RIFF\x10\0\0\0WAVEfmt ")), std::nullopt);
    EXPECT_EQ(readSoundFile(system_.write("c.m3u8", "#EXTM3U\n#EXTINF:1,\n/etc/hostname\n")), std::nullopt);
    EXPECT_EQ(readSoundFile(system_.path("missing.wav")), std::nullopt);
}

}  // namespace
}  // namespace lumacast::sound
