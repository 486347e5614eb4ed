#include "support/RecordingErrors.h"

#include <gtest/gtest.h>

#include <set>

#include "support/Localization.h"
#include "tests/fakes/FakeBundles.h"

namespace lumacast {
namespace {

class RecordingErrorsTest : public ::testing::Test {
protected:
    /// Installs the framework bundle with a text for every key but those left out.
    void installTexts(const std::set<std::string>& without = {}) {
        FakeBundle framework;
        framework.path = bundles_.frameworkBundlePath();
        framework.languages = {"en"};
        bundles_.install(framework);
        FakeBundle english;
        english.path = framework.path + "/en.lproj";
        for (std::int64_t code = -5818; code <= -5800; ++code) {
            const std::string key(recordingErrorKey(code));
            if (!without.contains(key)) english.tables["Localizable"][key] = "text of " + key;
        }
        bundles_.install(english);
    }

    FakeBundles bundles_;
    Localization localization_{bundles_};
    RecordingErrors errors_{localization_};
};

TEST_F(RecordingErrorsTest, EveryCodeOfTheBlockHasAKeyOfItsOwn) {
    std::set<std::string_view> keys;
    for (std::int64_t code = -5818; code <= -5800; ++code) keys.insert(recordingErrorKey(code));
    EXPECT_EQ(keys.size(), 19u);
    EXPECT_EQ(recordingErrorKey(-5801), "RECORDING_ERROR_USER_DECLINED");
    EXPECT_EQ(recordingErrorKey(-5808), "RECORDING_ERROR_INVALID_BROADCAST_SESSION");
    EXPECT_EQ(recordingErrorKey(-5813), "RECORDING_ERROR_DASHLINK");
    EXPECT_EQ(recordingErrorKey(-5816), "RECORDING_ERROR_NO_CONTEXTID_MATCH");
    EXPECT_EQ(recordingErrorKey(-5818), "RECORDING_ERROR_MIXING_FAILURE");
}

TEST_F(RecordingErrorsTest, CodesOutsideTheBlockKeepTheirNumberAndGetTheUnknownDescription) {
    installTexts();
    for (const std::int64_t code : {-5800, 0, -5819, -5799, 17}) {
        const Error error = errors_._lcUserErrorForCode(code);
        EXPECT_EQ(error.code(), code);
        EXPECT_EQ(error.domain(), "com.orvane.Lumacast.LCRecordingErrorDomain");
        ASSERT_TRUE(error.localizedDescription());
        EXPECT_EQ(*error.localizedDescription(), "text of RECORDING_ERROR_UNKNOWN");
    }
}

TEST_F(RecordingErrorsTest, AGivenDescriptionIsReplacedAndTheOtherEntriesAndTheCallersDictionaryStay) {
    installTexts();
    const Dictionary mine{{std::string(kLocalizedDescriptionKey), "mine"}, {"detail", std::int64_t{7}}};
    const Dictionary before = mine;
    const Error error = errors_._lcUserErrorForCode(RecordingErrorCode::Interrupted, mine);
    EXPECT_EQ(*error.localizedDescription(), "text of RECORDING_ERROR_INTERRUPTED");
    ASSERT_TRUE(error.userInfo().find("detail"));
    EXPECT_EQ(*error.userInfo().find("detail"), Value(std::int64_t{7}));
    EXPECT_EQ(mine, before);
}

TEST_F(RecordingErrorsTest, WithoutATextTheErrorCarriesNoDescriptionButKeepsAGivenOne) {
    installTexts({"RECORDING_ERROR_INTERRUPTED"});
    EXPECT_FALSE(errors_._lcUserErrorForCode(RecordingErrorCode::Interrupted).localizedDescription());
    EXPECT_EQ(errors_._lcUserErrorForCode(RecordingErrorCode::Interrupted).userInfo().size(), 0u);
    const Error kept =
        errors_._lcUserErrorForCode(RecordingErrorCode::Interrupted, {{std::string(kLocalizedDescriptionKey), "mine"}});
    EXPECT_EQ(*kept.localizedDescription(), "mine");
}

TEST_F(RecordingErrorsTest, TextsThatWereReadAreNotLookedUpAgainAndMissingOnesAre) {
    const std::string missing(recordingErrorKey(-5812));
    installTexts({missing});
    errors_.readTexts();
    FakeBundle empty;
    empty.path = bundles_.frameworkBundlePath() + "/en.lproj";
    bundles_.install(empty);
    const Error read = errors_._lcUserErrorForCode(-5806), unread = errors_._lcUserErrorForCode(-5812);
    ASSERT_TRUE(read.localizedDescription());
    EXPECT_EQ(*read.localizedDescription(), "text of " + std::string(recordingErrorKey(-5806)));
    EXPECT_FALSE(unread.localizedDescription());
    installTexts();
    const Error found = errors_._lcUserErrorForCode(-5812);
    ASSERT_TRUE(found.localizedDescription());
    EXPECT_EQ(*found.localizedDescription(), "text of " + missing);
}

}  // namespace
}  // namespace lumacast
