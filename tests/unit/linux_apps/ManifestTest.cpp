#include "linux/apps/Manifest.h"

#include <gtest/gtest.h>

#include <string>

namespace lumacast {
namespace {

constexpr const char* kManifest = R"({"identifier": "org.example.Player", "name": "Player", "name[de]": "Spieler",
    "displayName": "The Player", "displayName[pt-BR]": "O Reprodutor", "name[]": "x", "icon": "player", "version": 3})";

TEST(Manifest, ItsTextsAreRead) {
    const auto manifest = Manifest::parse(kManifest);
    ASSERT_TRUE(manifest);
    EXPECT_EQ(manifest->identifier, "org.example.Player");
    EXPECT_EQ(manifest->name, "Player");
    EXPECT_EQ(manifest->displayName, "The Player");
    EXPECT_EQ(manifest->icon, "player");
    EXPECT_EQ(manifest->developmentLanguage, "en");
    EXPECT_EQ(manifest->localizedName(userLocales("de_AT", "")), "Spieler");
    EXPECT_EQ(manifest->localizedDisplayName(userLocales("pt_BR", "")), "O Reprodutor");
    EXPECT_EQ(manifest->localizedName(userLocales("fr", "")), std::nullopt);
    EXPECT_EQ(manifest->localizedName(userLocales("en:de", "")), std::nullopt);
    EXPECT_EQ(manifest->localizedNames.size(), 1u);
}

TEST(Manifest, WhatIsNoObjectIsRefused) {
    for (const char* text : {"", "[]", "\"x\"", "{", "{\"identifier\": \"a\"} x", "{'identifier': 'a'}"})
        EXPECT_FALSE(Manifest::parse(text)) << text;
}

TEST(Manifest, AnIdentifierThatIsNoneIsLeftOut) {
    for (const char* text : {R"({"identifier": ""})", R"({"identifier": "a/b"})", R"({"identifier": "../x"})",
                             R"({"identifier": 3})", R"({"identifier": "a b"})"}) {
        const auto manifest = Manifest::parse(text);
        ASSERT_TRUE(manifest) << text;
        EXPECT_EQ(manifest->identifier, "") << text;
    }
    EXPECT_EQ(Manifest::parse("{\"identifier\": \"" + std::string(256, 'a') + "\"}")->identifier, "");
}

TEST(Manifest, DeepNestingIsRefusedAndDoesNotCrash) {
    const std::string deep(1'000'000, '[');
    EXPECT_FALSE(Manifest::parse(deep));
    EXPECT_FALSE(Manifest::parse("{\"a\": " + deep));
}

}  // namespace
}  // namespace lumacast
