#include "support/Localization.h"

#include <gtest/gtest.h>

#include "tests/fakes/FakeBundles.h"

namespace lumacast {
namespace {

class LocalizationTest : public ::testing::Test {
protected:
    FakeBundle framework() {
        FakeBundle bundle;
        bundle.path = bundles_.frameworkBundlePath();
        return bundle;
    }
    void installLanguage(const std::string& language, const FakeBundle::Texts& texts) {
        FakeBundle folder;
        folder.path = bundles_.frameworkBundlePath() + "/" + language + ".lproj";
        folder.tables["Localizable"] = texts;
        bundles_.install(folder);
    }

    FakeBundles bundles_;
    Localization localization_{bundles_};
};

TEST_F(LocalizationTest, AKeyIsLookedForInTheLanguageThenInItsBaseThenInTheDevelopmentLanguage) {
    FakeBundle bundle = framework();
    bundle.languages = {"en", "pt", "pt-BR"};
    bundle.resources["pt/Localizable.strings"] = bundle.path + "/pt.lproj/Localizable.strings";
    bundle.tables["Localizable"] = {{"ALL", "development"}, {"BASE", "development"}, {"ONLY", "development"}};
    bundles_.install(bundle);
    installLanguage("pt-BR", {{"ALL", "brasil"}});
    installLanguage("pt", {{"ALL", "portugal"}, {"BASE", "portugal"}});
    bundles_.setPreferredLanguages({"pt-BR", "en"});

    EXPECT_EQ(localization_._lcLocalizedStringFromFrameworkBundleWithKey("ALL"), "brasil");
    EXPECT_EQ(localization_._lcLocalizedStringFromFrameworkBundleWithKey("BASE"), "portugal");
    EXPECT_EQ(localization_._lcLocalizedStringFromFrameworkBundleWithKey("ONLY"), "development");
    EXPECT_EQ(localization_._lcLocalizedStringFromFrameworkBundleWithKey("NOWHERE"), std::nullopt);
}

TEST_F(LocalizationTest, WithoutTheFrameworkBundleThereAreNoTexts) {
    EXPECT_EQ(localization_._lcLocalizedStringFromFrameworkBundleWithKey("ALL"), std::nullopt);
}

TEST_F(LocalizationTest, TheFrameworkBundleIsOpenedOnce) {
    bundles_.install(framework());
    const auto first = localization_._lcFrameworkBundle();
    ASSERT_TRUE(first);
    bundles_.install(framework());  // another object at the same path
    EXPECT_EQ(localization_._lcFrameworkBundle(), first);
}

TEST_F(LocalizationTest, AnApplicationIsNamedByItsLocalizedThenPlainDisplayNameThenItsNameThenNothing) {
    FakeBundle app;
    EXPECT_EQ(Localization::_lcLocalizedAppName(app), "");
    app.infos[std::string(kInfoName)] = "name";
    EXPECT_EQ(Localization::_lcLocalizedAppName(app), "name");
    app.infos[std::string(kInfoDisplayName)] = "display name";
    EXPECT_EQ(Localization::_lcLocalizedAppName(app), "display name");
    app.localizedInfos[std::string(kInfoDisplayName)] = "Anzeigename";
    EXPECT_EQ(Localization::_lcLocalizedAppName(app), "Anzeigename");
}

TEST_F(LocalizationTest, AnUnknownBundleHasNoNameAndAProcessLeadsToItsBundle) {
    const BundleIdentifier id("org.example.Player");
    EXPECT_EQ(localization_._lcLocalizedAppNameFromBundleID(id), std::nullopt);
    EXPECT_EQ(localization_.bundleWithPID(ProcessID{7}), nullptr);
    bundles_.installApplication(id, "Player");
    bundles_.run(ProcessID{7}, id);
    EXPECT_EQ(localization_._lcLocalizedAppNameFromBundleID(id), "Player");
    ASSERT_TRUE(localization_.bundleWithPID(ProcessID{7}));
    EXPECT_EQ(localization_.bundleWithPID(ProcessID{7})->identifier(), id);
    EXPECT_EQ(localization_.bundleWithPID(ProcessID{8}), nullptr);
}

TEST_F(LocalizationTest, TheBaseIdentifierLosesItsLastComponent) {
    EXPECT_EQ(Localization::baseIdentifier("a.b.c.upload").text, "a.b.c");
    EXPECT_EQ(Localization::baseIdentifier("a.").text, "a");
    EXPECT_EQ(Localization::baseIdentifier("x").text, "");
    EXPECT_EQ(Localization::baseIdentifier("").text, "");
}

}  // namespace
}  // namespace lumacast
