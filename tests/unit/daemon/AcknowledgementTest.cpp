// Asking the user before a recording.

#include <algorithm>

#include "base/Limits.h"
#include "tests/unit/daemon/AcknowledgementWorld.h"

namespace lumacast {
namespace {

constexpr char kShow[] = "LCRecordingManager:showAcknowledgementAlert";

class Acknowledgement : public AcknowledgementWorld {};

TEST_F(Acknowledgement, WithNeitherMicrophoneNorCameraThereAreTwoButtons) {
    always(Response::DefaultButton);
    const auto client = makeConnected();
    ASSERT_EQ(started(*client)->code(), 0);
    ASSERT_EQ(shown().size(), 1u);
    const AlertContent alert = shown().front();
    EXPECT_EQ(alert.application, client->id);
    EXPECT_EQ(alert.header, "Record Player?");
    EXPECT_EQ(alert.message, textOf("BODY_TV"));
    EXPECT_EQ(alert.defaultButton, textOf("ACCEPT_BUTTON_1_MICROPHONE_DISABLED"));
    EXPECT_EQ(alert.alternateButton, std::nullopt);
    EXPECT_EQ(alert.otherButton, textOf("DECLINE_BUTTON"));
    EXPECT_EQ(alert.localizationURL, URL::file(fakes_.bundles.frameworkBundlePath()));
}

TEST_F(Acknowledgement, WithTheMicrophoneOrTheCameraThereAreThreeAndTheCameraWins) {
    always(Response::OtherButton);
    const auto client = makeConnected();
    struct Case {
        TestClient::Flags flags;
        std::string body, alternate;
    };
    for (const Case& wanted : {Case{{.microphone = true}, "BODY_MIC", "ACCEPT_BUTTON_1"},
                               Case{{.camera = true}, "BODY_CAMERA", "ACCEPT_BUTTON_1_CAMERA"},
                               Case{{.microphone = true, .camera = true}, "BODY_CAMERA", "ACCEPT_BUTTON_1_CAMERA"}}) {
        started(*client, wanted.flags);
        ASSERT_FALSE(shown().empty());
        const AlertContent alert = shown().back();
        EXPECT_EQ(alert.message, textOf("BODY_TV") + " " + textOf(wanted.body));
        EXPECT_EQ(alert.defaultButton, textOf("DECLINE_BUTTON"));
        EXPECT_EQ(alert.alternateButton, textOf(wanted.alternate));
        EXPECT_EQ(alert.otherButton, textOf("ACCEPT_BUTTON_2"));
    }
}

TEST_F(Acknowledgement, ASessionThatCapturedTheLastTimeIsAskedAboutCapturing) {
    always(Response::OtherButton);
    const auto client = makeConnected();
    session(*client)->setCaptureRecording(true);
    started(*client, {.microphone = true});
    EXPECT_EQ(shown().back().header, "Capture Player?");
    EXPECT_EQ(shown().back().message,
              "text of ACKNOWLEDGEMENT_CAPTURE_ALERT_BODY_TV " + textOf("BODY_MIC"));
    // What this start asks for does not count.
    session(*client)->setCaptureRecording(false);
    started(*client, {.capture = true});
    EXPECT_EQ(shown().back().header, "Record Player?");
}

TEST_F(Acknowledgement, OnlyTheOtherButtonRefusesWhateverWasAskedFor) {
    for (const bool microphone : {false, true}) {
        for (const Response response : {Response::DefaultButton, Response::AlternateButton, Response::OtherButton}) {
            always(response);
            const auto client = makeConnected("Player" + std::to_string(static_cast<int>(response)) +
                                                  (microphone ? "Mic" : ""),
                                              500 + static_cast<int>(response) + (microphone ? 10 : 0));
            const auto asked = started(*client, {.microphone = microphone});
            ASSERT_EQ(asked->answers, 1);
            const bool refused = response == Response::OtherButton;
            EXPECT_EQ(asked->code(), refused ? -5801 : 0);
            EXPECT_EQ(asked->values[1], Value(false));
            EXPECT_EQ(asked->values[2], Value(false));
            EXPECT_EQ(isExempt(*client), !refused);
            EXPECT_EQ(logged("user refused recording"), refused ? 1u : 0u);
            EXPECT_EQ(logged("user declined"), refused ? 1u : 0u);
            EXPECT_EQ(logged("starting..."), refused ? 0u : 1u);
        }
    }
}

TEST_F(Acknowledgement, AnAcknowledgedRecordingGoesOnWithoutMicrophoneAndCamera) {
    always(Response::AlternateButton);
    const auto client = makeConnected();
    struct Case {
        TestClient::Flags flags;
        const char* device;
    };
    for (const Case& wanted : {Case{{}, "microphone"}, Case{{.microphone = true}, "microphone"},
                               Case{{.camera = true}, "camera"},
                               Case{{.microphone = true, .camera = true}, "camera"}}) {
        const auto fresh = makeConnected(std::string("P") + wanted.device + std::to_string(wanted.flags.microphone),
                                         wanted.flags.microphone ? 700 : 600);
        const auto asked = started(*fresh, wanted.flags);
        ASSERT_EQ(asked->code(), 0);
        EXPECT_EQ(asked->values[1], Value(false));
        EXPECT_EQ(asked->values[2], Value(false));
        EXPECT_FALSE(session(*fresh)->microphoneEnabled());
        EXPECT_EQ(logged(std::string("user acknowledged recording, but ") + wanted.device + " recording is disabled"),
                  1u);
        fresh->die();
        settle();
    }
}

TEST_F(Acknowledgement, AnAcknowledgedApplicationIsAskedNoMoreButForTheMicrophone) {
    always(Response::DefaultButton);
    const auto client = makeConnected();
    ASSERT_EQ(started(*client, {.microphone = true})->code(), 0);
    ASSERT_EQ(shown().size(), 1u);
    ASSERT_EQ(started(*client)->code(), 0);
    EXPECT_EQ(shown().size(), 1u);
    EXPECT_EQ(logged(kShow), 1u);
    EXPECT_EQ(logged("user acknowledged recording, but microphone recording is disabled"), 0u);
    // The alert fills the plain exemptions alone, so the microphone is asked for each time.
    ASSERT_EQ(started(*client, {.microphone = true})->code(), 0);
    EXPECT_EQ(shown().size(), 2u);
    // The camera alone is not looked at: it is exempt, and kept.
    const auto camera = started(*client, {.camera = true});
    EXPECT_EQ(shown().size(), 2u);
    EXPECT_EQ(camera->values[2], Value(true));
}

TEST_F(Acknowledgement, AnAlertThatCannotBeShownRefuses) {
    const auto client = makeConnected();
    fakes_.faults.failNext("UserAlerts.show");
    EXPECT_EQ(started(*client)->code(), -5801);
    EXPECT_EQ(logged("error showing acknowledgement alert"), 1u);
    EXPECT_EQ(logged("user declined"), 1u);
    EXPECT_EQ(logged("user refused recording"), 0u);
    EXPECT_FALSE(isExempt(*client));
}

TEST_F(Acknowledgement, TheUserMayTakeAnyTimeWhileOthersAreServed) {
    const auto client = makeConnected();
    const auto asked = started(*client);
    EXPECT_EQ(fakes_.userAlerts.standing(), 1u);
    advance(std::chrono::hours(1000));
    EXPECT_EQ(fakes_.userAlerts.standing(), 1u);
    EXPECT_EQ(asked->answers, 0);
    fakes_.preferences.set(kPreferenceDomain, "LCSuppressAlert", true);
    const auto other = makeConnected("Editor", 501, 8);
    EXPECT_EQ(started(*other)->code(), 0);
    const auto state = other->ask(DaemonMessage::SynchronousGetCurrentState);
    settle();
    EXPECT_EQ(state->answers, 1);
    EXPECT_EQ(asked->answers, 0);
    EXPECT_TRUE(session(*other)->isRecording());
    answer(Response::DefaultButton);
    EXPECT_EQ(asked->answers, 1);
    EXPECT_EQ(asked->code(), 0);
    EXPECT_TRUE(session(*client)->isRecording());
    EXPECT_FALSE(session(*other)->isRecording());
}

TEST_F(Acknowledgement, OneAlertStandsAtATime) {
    const auto first = makeConnected("Player", 500, 7), second = makeConnected("Editor", 501, 8);
    const auto one = started(*first), two = started(*second);
    EXPECT_EQ(fakes_.userAlerts.standing(), 1u);
    EXPECT_EQ(shown().size(), 1u);
    answer(Response::OtherButton);
    EXPECT_EQ(one->code(), -5801);
    EXPECT_EQ(two->answers, 0);
    ASSERT_EQ(shown().size(), 2u);
    EXPECT_EQ(shown().back().application, second->id);
    answer(Response::DefaultButton);
    EXPECT_EQ(two->answers, 1);
    EXPECT_EQ(two->code(), 0);
    EXPECT_EQ(fakes_.userAlerts.mostStanding(), 1u);
}

TEST_F(Acknowledgement, FlagsOfAnotherStartWhileTheUserIsAskedAreNotMixedUp) {
    const auto first = makeConnected("Player", 500, 7), second = makeConnected("Editor", 501, 8);
    world_.scheduler.mainQueue().sync([&] { process_->manager().updateExemptionListWithSession(*session(*second)); });
    const auto one = started(*first, {.camera = true});
    // An exempt application keeps its camera, and the manager's flag is its own by then.
    const auto two = started(*second);
    ASSERT_EQ(two->answers, 1) << "who is exempt waits for nobody's answer";
    EXPECT_EQ(two->values[2], Value(false));
    fakes_.logSink.clear();
    answer(Response::DefaultButton);
    EXPECT_EQ(logged("user acknowledged recording, but camera recording is disabled"), 1u);
    EXPECT_EQ(one->values[2], Value(false));
}

TEST_F(Acknowledgement, AnAcknowledgedStartIsNotToldOfTheMicrophoneThatTheNextOneWants) {
    const auto first = makeConnected("Player", 500, 7), second = makeConnected("Editor", 501, 8);
    for (const Response response : {Response::DefaultButton, Response::OtherButton}) {
        const auto one = started(*first), two = started(*second, {.microphone = true, .camera = true});
        answer(Response::DefaultButton);
        EXPECT_EQ(one->code(), 0);
        EXPECT_EQ(one->values[1], Value(false));
        EXPECT_EQ(one->values[2], Value(false));
        answer(response);
        EXPECT_EQ(two->answers, 1);
        EXPECT_FALSE(process_->manager().isMicrophoneRecording());
        advance(std::chrono::seconds(1));
        first->tell(DaemonMessage::ClientDidResignActive);
        settle();
        advance(std::chrono::seconds(500));
        first->tell(DaemonMessage::ClientDidBecomeActive);  // it is to be asked about again
        settle();
    }
}

TEST_F(Acknowledgement, AWindowThatIsSomebodyElsesWhenTheUserHasAnsweredIsNotRecorded) {
    const auto client = makeConnected();
    const auto asked = started(*client);
    fakes_.renderServer.addLayer(client->window, ProcessID{999});
    answer(Response::DefaultButton);
    EXPECT_EQ(asked->code(), -5803);
    EXPECT_FALSE(session(*client)->isRecording());
    EXPECT_FALSE(isExempt(*client));
}

TEST_F(Acknowledgement, AWindowThatIsSomebodyElsesIsNotRecordedThoughAnotherStartIsAcknowledged) {
    const auto client = makeConnected();
    fakes_.ipc.grant(client->pid, "com.orvane.private.luma-cast", true);
    const auto display = started(*client, {.system = true}), window = started(*client);
    fakes_.renderServer.addLayer(client->window, ProcessID{999});
    answer(Response::DefaultButton);
    EXPECT_EQ(display->code(), 0);
    ASSERT_EQ(window->answers, 1);
    EXPECT_EQ(window->code(), -5803);
    EXPECT_TRUE(session(*client)->isSystemRecording());
    EXPECT_TRUE(session(*client)->isRecording());
}

TEST_F(Acknowledgement, AnEntitlementThatIsGoneWhenTheUserHasAnsweredCountsNoMore) {
    const auto client = makeConnected();
    fakes_.ipc.grant(client->pid, "com.orvane.private.luma-cast", true);
    const auto asked = started(*client, {.system = true});
    fakes_.ipc.grant(client->pid, "com.orvane.private.luma-cast", false);
    answer(Response::DefaultButton);
    EXPECT_EQ(asked->code(), -5810);
    EXPECT_FALSE(session(*client)->isRecording());
}

TEST_F(Acknowledgement, ASecondStartOfTheSameApplicationIsNotAskedAboutOnceTheFirstIsAcknowledged) {
    const auto client = makeConnected();
    const auto one = started(*client), two = started(*client);
    answer(Response::DefaultButton);
    EXPECT_EQ(shown().size(), 1u);
    EXPECT_EQ(one->code(), 0);
    EXPECT_EQ(two->answers, 1);
    EXPECT_EQ(two->code(), 0);
    EXPECT_TRUE(session(*client)->isRecording());
    EXPECT_EQ(client->toldOfStop(-5806), 1) << "the second start stopped what the first had begun";
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
}

TEST_F(Acknowledgement, AnAnswerDoesNotTakeARecordingAwayThatBeganMeanwhile) {
    const auto client = makeConnected();
    const auto asked = started(*client, {.microphone = true});
    fakes_.preferences.set(kPreferenceDomain, "LCSuppressAlert", true);
    ASSERT_EQ(started(*client)->code(), 0);
    ASSERT_TRUE(session(*client)->isRecording());
    answer(Response::DefaultButton);
    EXPECT_EQ(asked->code(), 0);
    EXPECT_EQ(client->toldOfStop(-5806), 1);
    EXPECT_TRUE(session(*client)->isRecording());
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
}

TEST_F(Acknowledgement, AClientThatHasGoneTakesItsAlertDown) {
    const auto client = makeConnected();
    started(*client);
    ASSERT_EQ(fakes_.userAlerts.standing(), 1u);
    const auto gone = session(*client);
    client->connection.reset();
    client->die();
    settle();
    EXPECT_EQ(fakes_.userAlerts.standing(), 0u);
    EXPECT_EQ(logged("user refused recording"), 0u) << "the user has not said anything";
    EXPECT_EQ(logged("starting..."), 0u);
    EXPECT_FALSE(gone->isRecording());
}

TEST_F(Acknowledgement, AnAnswerForAClientThatHasConnectedAnewCountsForNothing) {
    const auto client = makeConnected();
    const auto asked = started(*client);
    ASSERT_EQ(fakes_.userAlerts.standing(), 1u);
    client->connect();
    settle();
    EXPECT_EQ(fakes_.userAlerts.standing(), 0u);
    EXPECT_FALSE(isExempt(*client));
    EXPECT_FALSE(session(*client)->isRecording());
    EXPECT_EQ(asked->answers, 0) << "there is nobody to answer";
    // The new connection is asked about anew.
    const auto again = started(*client);
    answer(Response::DefaultButton);
    EXPECT_EQ(again->code(), 0);
}

TEST_F(Acknowledgement, AStartThatWaitsItsTurnIsForgottenWithItsClient) {
    const auto first = makeConnected("Player", 500, 7), second = makeConnected("Editor", 501, 8);
    const auto one = started(*first);
    started(*second);
    second->connection.reset();
    second->die();
    settle();
    EXPECT_EQ(fakes_.userAlerts.standing(), 1u);
    answer(Response::DefaultButton);
    EXPECT_EQ(one->code(), 0);
    EXPECT_EQ(shown().size(), 1u);
}

TEST_F(Acknowledgement, AnAnswerThatIsUnderWayWhenTheClientGoesCountsForNothing) {
    const auto client = makeConnected();
    started(*client);
    const auto gone = session(*client);
    ASSERT_TRUE(fakes_.userAlerts.answer(Response::DefaultButton));
    client->connection.reset();
    client->die();
    settle();
    EXPECT_FALSE(gone->isRecording());
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
}

class AcknowledgementWithoutTexts : public AcknowledgementWorld {
protected:
    AcknowledgementWithoutTexts() : AcknowledgementWorld(nullptr) {}
};

TEST_F(AcknowledgementWithoutTexts, TheKeysStandInTheirPlaces) {
    always(Response::OtherButton);
    const auto client = makeConnected();
    started(*client);
    EXPECT_EQ(shown().back().localizationURL, std::nullopt);
    EXPECT_EQ(shown().back().defaultButton, "ACKNOWLEDGEMENT_ALERT_ACCEPT_BUTTON_1_MICROPHONE_DISABLED");
    EXPECT_EQ(shown().back().header, "ACKNOWLEDGEMENT_ALERT_TITLE");
}

TEST_F(Acknowledgement, StartsThatWaitForTheUserAreLimited) {
    std::vector<std::unique_ptr<TestClient>> clients;
    const auto overflow = [&](Limit limit) {
        const std::uint64_t most = limitOf(limit);
        switch (limit) {
            case Limit::StartsOfApplicationWaitingForUser: {
                clients.push_back(makeConnected());
                std::vector<TestClient::AskedRef> asked;
                for (std::uint64_t i = 0; i < most; ++i) asked.push_back(started(*clients.back()));
                EXPECT_EQ(started(*clients.back())->code(), -5803);
                for (const auto& waiting : asked) EXPECT_EQ(waiting->answers, 0);
                break;
            }
            case Limit::StartsWaitingForUser: {
                std::int32_t pid = 1000;
                for (std::uint64_t waiting = 0; waiting < most;) {
                    clients.push_back(makeConnected("P" + std::to_string(pid), pid, static_cast<std::uint32_t>(pid)));
                    ++pid;
                    for (std::uint64_t i = 0; i < limitOf(Limit::StartsOfApplicationWaitingForUser) && waiting < most;
                         ++i, ++waiting)
                        EXPECT_EQ(started(*clients.back())->answers, 0);
                }
                clients.push_back(makeConnected("Last", pid, static_cast<std::uint32_t>(pid)));
                EXPECT_EQ(started(*clients.back())->code(), -5803);
                break;
            }
            default: FAIL() << "the manager keeps a limit that nothing overflows";
        }
        for (const auto& client : clients) {
            client->connection.reset();
            client->die();
        }
        clients.clear();
        settle();
        EXPECT_EQ(fakes_.userAlerts.standing(), 0u);
    };
    int kept = 0;
    for (const LimitRow& row : kLimits) {
        if (row.keeper != LimitKeeper::Manager) continue;
        ++kept;
        overflow(row.limit);
    }
    EXPECT_EQ(kept, 2);
}

}  // namespace
}  // namespace lumacast
