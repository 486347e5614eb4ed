// What an exempt application records without being asked about, and what a question and its answers log.

#include "tests/unit/daemon/AcknowledgementWorld.h"

namespace lumacast {
namespace {

using std::chrono::seconds;

constexpr char kHead[] =
    "LCRecordingManager:startRecordingWindowLayerContextID:windowSize:microphoneEnabled:streaming:withHandler:";

class ExemptStarts : public AcknowledgementWorld {
protected:
    std::unique_ptr<TestClient> makeEntitled() {
        auto client = makeConnected();
        fakes_.ipc.grant(client->pid, "com.orvane.private.luma-cast", true);
        return client;
    }
    void exempt(const TestClient& client) {
        world_.scheduler.mainQueue().sync(
            [&] { process_->manager().updateExemptionListWithSession(*session(client)); });
    }
};

TEST_F(ExemptStarts, AnExemptionIsForEveryKindOfRecording) {
    always(Response::DefaultButton);
    for (const bool displayFirst : {false, true}) {
        const auto client =
            makeConnected(displayFirst ? "Player" : "Editor", displayFirst ? 500 : 501, displayFirst ? 7 : 8);
        fakes_.ipc.grant(client->pid, "com.orvane.private.luma-cast", true);
        const auto before = shown().size();
        ASSERT_EQ(started(*client, {.system = displayFirst})->code(), 0);
        EXPECT_EQ(shown().size(), before + 1);
        advance(seconds(1));
        ASSERT_EQ(started(*client, {.system = !displayFirst})->code(), 0);
        EXPECT_EQ(shown().size(), before + 1) << "one acknowledgement is for both";
        EXPECT_EQ(session(*client)->isSystemRecording(), !displayFirst);
    }
}

TEST_F(ExemptStarts, NoNameAndNoTextIsLookedUpForThem) {
    const auto client = makeEntitled();
    exempt(*client);
    const auto names = fakes_.bundles.identifiersLookedUp(), texts = fakes_.bundles.languagesLookedUp();
    // The movie of the display has no application's name.
    ASSERT_EQ(started(*client, {.system = true})->code(), 0);
    EXPECT_EQ(fakes_.bundles.identifiersLookedUp(), names);
    EXPECT_EQ(fakes_.bundles.languagesLookedUp(), texts);
    EXPECT_EQ(logged("LCRecordingManager:showAcknowledgementAlert"), 1u);
    // Others need both.
    always(Response::OtherButton);
    EXPECT_EQ(started(*client, {.microphone = true, .system = true})->code(), -5801);
    EXPECT_GT(fakes_.bundles.identifiersLookedUp(), names);
    EXPECT_GT(fakes_.bundles.languagesLookedUp(), texts);
}

TEST_F(ExemptStarts, WithoutAnIdentifierNoExemptionIsLookedAt) {
    const auto client = makeConnected();
    exempt(*client);
    client->tell(DaemonMessage::ClientDidResignActive);
    settle();
    advance(seconds(481));
    fakes_.logSink.clear();
    world_.scheduler.mainQueue().sync(
        [&] { process_->manager().expireAcknowledgementExemptionsForBundleID(std::nullopt); });
    settle();
    EXPECT_EQ(fakes_.logSink.logged(), Lines{});
    EXPECT_TRUE(isExempt(*client));
}

TEST_F(ExemptStarts, TheLinesOfAQuestionThatIsRefused) {
    always(Response::OtherButton);
    const auto client = makeConnected();
    ASSERT_EQ(started(*client)->code(), -5801);
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{kHead, "LCRecordingManager:stopCurrentRecordingSession:", "LCRecordingManager: suppressAlert=0",
                     "LCRecordingManager:showAcknowledgementAlert", "user refused recording", "user declined",
                     "start request 1 refused with -5801: the user does not want it"}));
}

TEST_F(ExemptStarts, TheLinesOfAQuestionThatCannotBeAsked) {
    fakes_.faults.failNext("UserAlerts.show");
    const auto client = makeConnected();
    ASSERT_EQ(started(*client)->code(), -5801);
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{kHead, "LCRecordingManager:stopCurrentRecordingSession:", "LCRecordingManager: suppressAlert=0",
                     "LCRecordingManager:showAcknowledgementAlert", "error showing acknowledgement alert",
                     "user declined", "start request 1 refused with -5801: the user can't be asked"}));
}

TEST_F(ExemptStarts, TheLinesOfAQuestionThatIsAcknowledgedUpToTheStart) {
    always(Response::AlternateButton);
    const auto client = makeConnected();
    ASSERT_EQ(started(*client, {.microphone = true, .camera = true})->code(), 0);
    Lines lines = fakes_.logSink.logged();
    ASSERT_GE(lines.size(), 7u);
    lines.resize(7);
    EXPECT_EQ(
        lines,
        (Lines{kHead, "LCRecordingManager:stopCurrentRecordingSession:", "LCRecordingManager: suppressAlert=0",
               "LCRecordingManager:showAcknowledgementAlert",
               "user acknowledged recording, but camera recording is disabled", "starting...", "broadcast disabled"}));
}

}  // namespace
}  // namespace lumacast
