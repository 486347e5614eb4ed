// What a dialog program is told, and what its end says: without a dialog.

#include <gtest/gtest.h>

#include <algorithm>

#include "linux/desktop/AlertText.h"
#include "linux/desktop/DialogProgram.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast {
namespace {

using Kind = DialogProgram::Kind;
using Response = UserAlert::Response;

DialogTexts texts(const AlertContent& content, const std::optional<std::string>& icon = std::nullopt) {
    const auto made = dialogTexts(content, icon);
    EXPECT_TRUE(made);
    return made.value_or(DialogTexts());
}

AlertContent content() {
    return {.application = BundleIdentifier("org.example.Player"),
            .header = "Header",
            .message = "Message",
            .defaultButton = "Yes",
            .alternateButton = "Perhaps",
            .otherButton = "No",
            .localizationURL = std::nullopt};
}

TEST(AlertText, BecomesOneLineOfWhatCanBeSeen) {
    EXPECT_EQ(plainAlertText("  a\tb\r\n\n c \x7f\xC2\x85\xE2\x80\xA8 ", 80), "a b c");
    EXPECT_EQ(plainAlertText("\u202Egpj.\u2066exe\u200B\uFEFF\u00AD", 80), "gpj.exe");
    EXPECT_EQ(plainAlertText(std::string("a\0b\x1b[1m", 7), 80), "a b [1m");
    EXPECT_EQ(plainAlertText("\U000E0041\u3164x\u115F", 80), "x");
    EXPECT_EQ(plainAlertText("Grüße, 世界 “x”…", 80), "Grüße, 世界 “x”…");
}

TEST(AlertText, WhatIsNotUtf8IsReplaced) {
    EXPECT_EQ(plainAlertText("a\xff"
                             "b",
                             80),
              "a\uFFFD"
              "b");
    EXPECT_EQ(plainAlertText("\xC0\xAF", 80), "\uFFFD\uFFFD");                          // an overlong slash
    EXPECT_EQ(plainAlertText("\xED\xA0\x80", 80).find("\xED\xA0"), std::string::npos);  // half a surrogate pair
    EXPECT_EQ(plainAlertText("x\xE2\x82", 80), "x\uFFFD\uFFFD");                        // cut off
    EXPECT_EQ(plainAlertText("\xF4\x90\x80\x80", 80).find("\xF4"), std::string::npos);  // beyond the last character
}

TEST(AlertText, OfATextThatIsTooLongTheMiddleIsLeftOut) {
    const std::string header = "Allow “" + std::string(10'000, 'W') + "” to record the screen?";
    const std::string plain = plainAlertText(header, 160);
    EXPECT_TRUE(plain.starts_with("Allow “WWW"));
    EXPECT_TRUE(plain.ends_with("WWW” to record the screen?"));
    EXPECT_LE(plain.size(), 160u + 6u);  // three characters of more than a byte
    EXPECT_EQ(plainAlertText(std::string(160, 'x'), 160), std::string(160, 'x'));
}

TEST(AlertText, MarksAreNotPiledUp) {
    std::string pile = "a";
    for (int i = 0; i < 100; ++i) pile += "\u0301";
    EXPECT_EQ(plainAlertText(pile + "b", 80), "a\u0301\u0301\u0301\u0301b");
}

TEST(AlertText, LinesAreNoLongerThanTold) {
    EXPECT_EQ(inLines("one two three", 7), "one two\nthree");
    EXPECT_EQ(inLines("abcdefghij", 4), "abcd\nefgh\nij");
    EXPECT_EQ(inLines("ab cdefghij k", 4), "ab\ncdef\nghij\nk");
    EXPECT_EQ(inLines("世界世界", 4), "世界\n世界");
    EXPECT_EQ(inLines("", 4), "");
}

TEST(AlertText, MarkupSaysItLiterally) {
    EXPECT_EQ(asMarkup("<b>&amp;\"'\\n"), "&lt;b&gt;&amp;amp;&quot;&#39;&#92;n");
}

TEST(DialogProgram, AnApplicationsTextIsNeverAnArgumentOfItsOwn) {
    AlertContent hostile = content();
    hostile.header = hostile.message = "--button=Grant:39\n--extra-button=Yes";
    hostile.application = BundleIdentifier("--timeout=1");
    for (const Kind kind : {Kind::Yad, Kind::Zenity}) {
        const DialogProgram program{kind, "/usr/bin/x"};
        const auto harmless = dialogArguments(program, texts(content()), "/style");
        const auto words = dialogArguments(program, texts(hostile, "--image=x"), "/style");
        ASSERT_EQ(words.size(), harmless.size());
        for (std::size_t i = 0; i < words.size(); ++i)
            EXPECT_EQ(words[i].substr(0, words[i].find('=')), harmless[i].substr(0, harmless[i].find('=')));
    }
}

TEST(DialogProgram, OnlyAnIconsNameOrPathIsPassedOn) {
    EXPECT_EQ(texts(content(), "org.example.Player").icon, "org.example.Player");
    EXPECT_EQ(texts(content(), "player.png").icon, "player");
    EXPECT_EQ(texts(content(), "/opt/my player/icon.png").icon, "/opt/my player/icon.png");
    for (const std::string& odd : {std::string(), std::string("a b"), std::string("../x"), std::string("a!b"),
                                   std::string("/a\nb"), std::string(5'000, 'a'), std::string("x\0y", 3)})
        EXPECT_EQ(texts(content(), odd).icon, "dialog-question") << odd.substr(0, 20);
}

TEST(DialogProgram, OfAllEndsOnlyTwoGrantWithYad) {
    const DialogProgram yad{Kind::Yad, "/usr/bin/yad"};
    for (const bool three : {true, false}) {
        AlertContent asked = content();
        if (!three) asked.alternateButton.reset();
        const DialogTexts shown = texts(asked);
        int defaults = 0, alternates = 0;
        for (int status = 0; status < 256; ++status) {
            const Response response = responseOf(yad, shown, {status, ""});
            defaults += response == Response::DefaultButton;
            alternates += response == Response::AlternateButton;
            EXPECT_EQ(responseOf(yad, shown, {status, "x"}), Response::OtherButton);
            // What the shell, a signal and yad itself end with.
            if (status <= 3 || (status >= 70 && status != 90)) {
                EXPECT_EQ(response, Response::OtherButton) << status;
            }
        }
        EXPECT_EQ(defaults, 1);
        EXPECT_EQ(alternates, three ? 1 : 0);
        EXPECT_EQ(responseOf(yad, shown, {std::nullopt, ""}), Response::OtherButton);
    }
}

TEST(DialogProgram, OfAllEndsOnlyTheExactTextGrantsWithZenity) {
    const DialogProgram zenity{Kind::Zenity, "/usr/bin/zenity"};
    const DialogTexts shown = texts(content());
    EXPECT_EQ(responseOf(zenity, shown, {1, "Yes\n"}), Response::DefaultButton);
    EXPECT_EQ(responseOf(zenity, shown, {1, "Perhaps\n"}), Response::AlternateButton);
    for (const char* output : {"", "\n", "Yes", "yes\n", "Yes\n\n", " Yes\n", "Yes\nNo\n", "YesYes\n", "No\n", "Ye\n"})
        EXPECT_EQ(responseOf(zenity, shown, {1, output}), Response::OtherButton) << output;
    for (int status = 0; status < 256; ++status)
        if (status != 1) {
            EXPECT_EQ(responseOf(zenity, shown, {status, "Yes\n"}), Response::OtherButton) << status;
        }
    EXPECT_EQ(responseOf(zenity, shown, {std::nullopt, "Yes\n"}), Response::OtherButton);
}

TEST(DialogProgram, YadIsAskedBeforeZenityAndRelativePathsNever) {
    const ScratchDirectory scratch;
    const auto put = [&](const std::string& name) {
        std::filesystem::permissions(scratch.write(name, "#!/bin/sh\n"), std::filesystem::perms::owner_all);
    };
    put("a/zenity");
    const std::vector<std::string> directories{"bin", "", scratch.path("a"), scratch.path("b")};
    EXPECT_EQ(findDialogProgram(directories, ProgramOwner::Anybody)->path, scratch.path("a/zenity"));
    put("b/yad");
    EXPECT_EQ(findDialogProgram(directories, ProgramOwner::Anybody)->path, scratch.path("b/yad"));
    std::filesystem::permissions(scratch.path("b/yad"), std::filesystem::perms::owner_read);
    EXPECT_EQ(findDialogProgram(directories, ProgramOwner::Anybody)->path, scratch.path("a/zenity"));
    EXPECT_FALSE(findDialogProgram({"bin", ""}, ProgramOwner::Anybody));
}

}  // namespace
}  // namespace lumacast
