#include "linux/apps/DesktopEntry.h"

#include <gtest/gtest.h>

namespace lumacast {
namespace {

constexpr const char* kEntry = R"(# a comment
[Desktop Entry]
Type=Application
Name=Player
Name[de]=Spieler
Name[pt_BR]=Reprodutor
Name[sr@latin]=Svirac
 Exec = "/opt/my player/bin/player" --open %U
TryExec=player
Icon=org.example.Player

[Desktop Action New]
Name=New Window
Icon=other
Exec=other
)";

DesktopEntry entry(const std::string& text) {
    const auto parsed = DesktopEntry::parse(text);
    EXPECT_TRUE(parsed);
    return parsed.value_or(DesktopEntry());
}

std::string program(const std::string& exec) {
    return entry("[Desktop Entry]\nExec=" + exec + "\n").program().value_or("(none)");
}

std::string nameFor(const std::string& list) {
    return entry(kEntry).localizedName(userLocales(list, "")).value_or("(plain)");
}

TEST(DesktopEntry, ItsOwnGroupIsReadAndNoOther) {
    const DesktopEntry parsed = entry(kEntry);
    EXPECT_TRUE(parsed.isApplication);
    EXPECT_FALSE(parsed.hidden);
    EXPECT_EQ(parsed.name, "Player");
    EXPECT_EQ(parsed.tryExec, "player");
    EXPECT_EQ(parsed.icon, "org.example.Player");
    EXPECT_EQ(parsed.program(), "/opt/my player/bin/player");
}

TEST(DesktopEntry, WithoutItsGroupThereIsNone) {
    EXPECT_FALSE(DesktopEntry::parse(""));
    EXPECT_FALSE(DesktopEntry::parse("Name=x\n[Other]\nName=y\n"));
}

TEST(DesktopEntry, TextThatIsNotUtf8IsRefused) { EXPECT_FALSE(DesktopEntry::parse("[Desktop Entry]\nName=\xFF\n")); }

TEST(DesktopEntry, LinesThatMakeNoSenseArePassedOver) {
    EXPECT_EQ(entry("[Desktop Entry]\nnonsense\n=x\n[\nName=Player\n").name, "");
    EXPECT_EQ(entry("[Desktop Entry]\nnonsense\n=x\nName=Player\n").name, "Player");
}

TEST(DesktopEntry, ATranslationIsFoundByTheRulesOfLocales) {
    EXPECT_EQ(nameFor("de_AT"), "Spieler");
    EXPECT_EQ(nameFor("pt_BR"), "Reprodutor");
    EXPECT_EQ(nameFor("pt"), "(plain)");
    EXPECT_EQ(nameFor("sr_RS@latin"), "Svirac");
    EXPECT_EQ(nameFor("sr"), "(plain)");
    EXPECT_EQ(nameFor("fr:de"), "Spieler");
}

TEST(DesktopEntry, ThePlainNameIsEnglish) { EXPECT_EQ(nameFor("en_GB:de"), "(plain)"); }

TEST(DesktopEntry, EscapesInNamesAreResolved) {
    EXPECT_EQ(entry("[Desktop Entry]\nName=a\\sb\\\\c\\td\\q\n").name, "a b\\c\td\\q");
}

TEST(DesktopEntry, TheProgramIsTheFirstArgumentUnquoted) {
    EXPECT_EQ(program("player"), "player");
    EXPECT_EQ(program("player %f --x"), "player");
    EXPECT_EQ(program("\"a \\\\\"b\\\\\" c\" d"), "a \"b\" c");
    EXPECT_EQ(program("  player"), "player");
    EXPECT_EQ(program("\"100 %% player\""), "100 % player");
    EXPECT_EQ(program("player%%"), "player%");
}

TEST(DesktopEntry, EnvAndItsVariablesArePassedOver) {
    EXPECT_EQ(program("env A=1 B=2 player --x"), "player");
    EXPECT_EQ(program("env -i player"), "(none)");
    EXPECT_EQ(program("env"), "(none)");
    EXPECT_EQ(program("env A=1 env player"), "(none)");
    EXPECT_EQ(program("/bin/env player"), "(none)");
}

TEST(DesktopEntry, AnInterpreterIsNobodysProgram) {
    for (const char* exec : {"python3 /usr/share/app/main.py", "/usr/bin/python3.11 x", "sh -c player", "flatpak run x",
                             "wine64", "java -jar x.jar", "bwrap --ro-bind / / player", "/lib64/ld-linux-x86-64.so.2 player",
                             "tclsh8.6 player.tcl", "timeout 60 player"})
        EXPECT_EQ(program(exec), "(none)") << exec;
    EXPECT_EQ(program("pythonista"), "pythonista");
    EXPECT_EQ(program("shell"), "shell");
}

TEST(DesktopEntry, AnUnclosedQuoteOrAnEmptyExecStartsNothing) {
    EXPECT_EQ(program("\"player"), "(none)");
    EXPECT_EQ(program(""), "(none)");
    EXPECT_EQ(program("\"\""), "(none)");
}

TEST(DesktopEntry, AHiddenEntrySaysSo) { EXPECT_TRUE(entry("[Desktop Entry]\nHidden=true\n").hidden); }

}  // namespace
}  // namespace lumacast
