#include <gtest/gtest.h>

#include <array>
#include <set>
#include <string>

#include "linux/apps/StringsTable.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast {
namespace {

constexpr std::array kLanguages{"en", "de", "pt-BR"};

constexpr std::array kRecordingErrors{"UNKNOWN",      "USER_DECLINED",     "DISABLED",
                                      "FAILED_TO_START", "FAILED",         "INSUFFICIENT_STORAGE",
                                      "INTERRUPTED",  "CONTENT_RESIZE",    "INVALID_BROADCAST_SESSION",
                                      "SYSTEM_DORMANCY", "ENTITLEMENTS",   "ACTIVE_PHONE_CALL",
                                      "FAILED_TO_SAVE", "DASHLINK",        "CONNECTION_INVALID",
                                      "CONNECTION_INTERRUPTED", "NO_CONTEXTID_MATCH", "MEDIASERVICES_FAILED",
                                      "MIXING_FAILURE"};

StringsTable table(const std::string& language) {
    return StringsTable::parse(ScratchDirectory::read(std::string(LC_SOURCE_DIR) + "/resources/Lumacast.bundle/" +
                                                      language + ".lproj/Localizable.strings"));
}

std::size_t placeholders(const std::string& text) {
    std::size_t count = 0;
    for (std::size_t at = text.find("%@"); at != std::string::npos; at = text.find("%@", at + 2)) ++count;
    return count;
}

TEST(Resources, EveryLanguageExplainsEveryRecordingError) {
    static_assert(kRecordingErrors.size() == 19);
    for (const char* language : kLanguages) {
        const StringsTable texts = table(language);
        EXPECT_TRUE(texts.isComplete()) << language;
        for (const char* name : kRecordingErrors) {
            const std::string* text = texts.find("RECORDING_ERROR_" + std::string(name));
            ASSERT_TRUE(text) << language << " " << name;
            EXPECT_GT(text->size(), 15u) << language << " " << name;
        }
    }
}

TEST(Resources, EveryLanguageHasTheKeysAndPlaceholdersOfEnglish) {
    const StringsTable english = table("en");
    ASSERT_GE(english.size(), 34u);
    for (const char* language : kLanguages) {
        const StringsTable texts = table(language);
        EXPECT_EQ(texts.size(), english.size()) << language;
        for (const auto& [key, text] : english.texts()) {
            const std::string* translated = texts.find(key);
            ASSERT_TRUE(translated) << language << " " << key;
            EXPECT_EQ(placeholders(*translated), placeholders(text)) << language << " " << key;
        }
    }
}

TEST(Resources, NoTwoErrorsHaveTheSameText) {
    for (const char* language : kLanguages) {
        const StringsTable texts = table(language);
        std::set<std::string> different;
        for (const char* name : kRecordingErrors) different.insert(*texts.find("RECORDING_ERROR_" + std::string(name)));
        EXPECT_EQ(different.size(), kRecordingErrors.size()) << language;
    }
}

}  // namespace
}  // namespace lumacast
