#include "linux/apps/Languages.h"

#include <gmock/gmock.h>

namespace lumacast {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

std::vector<std::string> tags(std::string_view list, std::string_view locale) {
    std::vector<std::string> result;
    for (const Locale& each : userLocales(list, locale)) result.push_back(languageTag(each));
    return result;
}

TEST(Languages, ALocaleNameIsTakenApart) {
    EXPECT_EQ(parseLocale("pt_BR.UTF-8"), (Locale{"pt", "BR", ""}));
    EXPECT_EQ(parseLocale("sr_RS.UTF-8@latin"), (Locale{"sr", "RS", "latin"}));
    EXPECT_EQ(parseLocale("de"), (Locale{"de", "", ""}));
}

TEST(Languages, WhatIsNoLanguageHasAnEmptyOne) {
    for (const char* name : {"", "C", "C.UTF-8", "POSIX", "x", "waytoolongname", "d/e", "../..", "de_A/x"})
        EXPECT_EQ(parseLocale(name).language, "") << name;
}

TEST(Languages, TheLanguageListComesBeforeTheMessageLocale) {
    EXPECT_THAT(tags("pt_BR:pt:en", "de_DE.UTF-8"), ElementsAre("pt-BR", "pt", "en", "de-DE"));
}

TEST(Languages, ALocaleIsNamedOnce) { EXPECT_THAT(tags("de:en:de", "en"), ElementsAre("de", "en")); }

TEST(Languages, TheCLocaleSwitchesTheListOff) {
    EXPECT_THAT(tags("de", "C"), ElementsAre("en"));
    EXPECT_THAT(tags("de", "C.UTF-8"), ElementsAre("en"));
    EXPECT_THAT(tags("de", "POSIX"), ElementsAre("en"));
}

TEST(Languages, WithoutALocaleTheListStillCounts) { EXPECT_THAT(tags("de", ""), ElementsAre("de")); }

TEST(Languages, NobodyIsWithoutALanguage) { EXPECT_THAT(tags("", ""), ElementsAre("en")); }

TEST(Languages, AScriptIsPartOfTheTag) { EXPECT_EQ(languageTag({"sr", "RS", "latin"}), "sr-Latn-RS"); }

TEST(Languages, TheSameTagIsBetterThanAShorterOne) {
    EXPECT_THAT(matchingLocalizations({"de-AT"}, {"en", "de", "de_AT"}), ElementsAre("de_AT", "de"));
}

TEST(Languages, EarlierLanguagesComeFirst) {
    EXPECT_THAT(matchingLocalizations({"fr", "pt-BR", "en"}, {"en", "de", "pt-BR"}), ElementsAre("pt-BR", "en"));
}

TEST(Languages, ABareLanguageIsSuitedByItsVariants) {
    EXPECT_THAT(matchingLocalizations({"pt"}, {"pt-BR", "ptx", "en"}), ElementsAre("pt-BR"));
}

TEST(Languages, AnotherCountryDoesNotSuit) { EXPECT_THAT(matchingLocalizations({"pt-PT"}, {"pt-BR"}), IsEmpty()); }

TEST(Languages, NothingSuitsWhenNothingIsThere) { EXPECT_THAT(matchingLocalizations({"de"}, {}), IsEmpty()); }

}  // namespace
}  // namespace lumacast
