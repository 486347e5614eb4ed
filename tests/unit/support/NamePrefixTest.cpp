#include "support/NamePrefix.h"

#include <gtest/gtest.h>

namespace lumacast {
namespace {

TEST(NamePrefix, IsComparedWithoutCaseAndDiacritics) {
    for (const auto& [name, prefix] : {std::pair{"Player.mp4", "player"},
                                       {"player.mp4", "PLAYER"},
                                       {"\u00C9t\u00E9 1.mp4", "ete"},  // composed, capital and small
                                       {"ETE 1.mp4", "\u00E9t\u00E9"},
                                       {"e\u0301te.mp4", "\u00C9TE"},  // a combining mark
                                       {"ete.mp4", "e\u0301"},
                                       {"\u0158eka.mp4", "rEKA"},  // Latin Extended-A
                                       {"\u017D\u017E.mp4", "zZ"},
                                       {"\u0141\u00F3d\u017A.mp4", "\u0142ODZ"},  // a stroke is no mark
                                       {"\u00C6ther.mp4", "\u00E6THER"},
                                       {"\u03A3\u03BF\u03C6.mp4", "\u03C3\u039F\u03A6"},
                                       {"\u0418\u0433\u0440\u0430.mp4", "\u0438\u0413\u0420\u0410"},
                                       {"\u4E2D\u6587.mp4", "\u4E2D"},
                                       {"Player.mp4", ""}})
        EXPECT_TRUE(beginsWithCaseAndDiacriticInsensitive(name, prefix)) << name << " " << prefix;
}

TEST(NamePrefix, MustStandAtTheBeginningWhole) {
    for (const auto& [name, prefix] : {std::pair{"A Player.mp4", "player"},
                                       {"Play", "Player"},
                                       {"Lodz.mp4", "\u0141"},
                                       {"Aether.mp4", "\u00C6"},
                                       {"\xE9te.mp4", "ete"},
                                       {"\xE9te.mp4", "\u00E9te"},
                                       {"", "a"}})
        EXPECT_FALSE(beginsWithCaseAndDiacriticInsensitive(name, prefix)) << name << " " << prefix;
}

TEST(NamePrefix, ABrokenNameIsComparedByItsBytes) {
    EXPECT_TRUE(beginsWithCaseAndDiacriticInsensitive("a\xFF\xC3.mp4", "A\xFF\xC3"));
    EXPECT_FALSE(beginsWithCaseAndDiacriticInsensitive("a\xFE", "a\xFF"));
    EXPECT_TRUE(beginsWithCaseAndDiacriticInsensitive("\xE4\xB8", "\xE4"));
    EXPECT_FALSE(beginsWithCaseAndDiacriticInsensitive("\u4E2D", "\xE4")) << "half a character is none";
}

TEST(NamePrefix, EachLetterOfTheTwoBlocksHasOneForm) {
    // Both cases of a letter fold to the same, whatever their diacritics.
    EXPECT_EQ(foldedForComparison("\u00C0\u00C1\u00C2\u00C3\u00C4\u00C5\u00C6\u00C7\u00D0\u00D1\u00D8\u00DD\u00DE"),
              foldedForComparison("\u00E0\u00E1\u00E2\u00E3\u00E4\u00E5\u00E6\u00E7\u00F0\u00F1\u00F8\u00FD\u00FE"));
    EXPECT_EQ(foldedForComparison("\u0110\u0126\u0132\u013F\u0141\u014A\u0152\u0166\u0178\u017F"),
              foldedForComparison("\u0111\u0127\u0133\u0140\u0142\u014B\u0153\u0167\u00FFs"));
    EXPECT_EQ(foldedForComparison("\u00D7\u00F7\u0138\u0149\u0131"), U"\u00D7\u00F7\u0138\u0149\u0131")
        << "these have none";
}

}  // namespace
}  // namespace lumacast
