// The exemptions from the question to the user, and the messages about an application's activity.

#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {
namespace {

using std::chrono::seconds;

constexpr char kExpiry[] = "LCRecordingManager:removeAcknowledgementExemptionIfOverThreshholdForBundleID:";

class Exemptions : public DaemonWorld {
protected:
    Exemptions() {
        fakes_.preferences.set(kPreferenceDomain, "LCSuppressAlert", false);
        fakes_.userAlerts.setUser([](const AlertContent&) { return UserAlert::Response::OtherButton; });
    }

    void tell(TestClient& client, DaemonMessage message) {
        fakes_.logSink.clear();
        client.tell(message);
        settle();
    }
    void exempt(TestClient& client) {
        world_.scheduler.mainQueue().sync(
            [&] { process_->manager().updateExemptionListWithSession(*process_->manager().registeredSession(client.id)); });
    }
    bool isExempt(TestClient& client) {
        bool result = false;
        world_.scheduler.mainQueue().sync([&] {
            result = process_->manager().isExemptFromAcknowledgementAlertSession(
                *process_->manager().registeredSession(client.id));
        });
        return result;
    }
    /// The flags a start leaves on the manager, whatever comes of it.
    std::int64_t start(TestClient& client, bool microphone) {
        const auto asked = client.start({client.window}, {.microphone = microphone});
        settle();
        return asked->code();
    }
};

TEST_F(Exemptions, NobodyIsExemptAtFirst) {
    const auto client = makeConnected();
    EXPECT_FALSE(isExempt(*client));
    EXPECT_EQ(start(*client, false), -5801);
}

TEST_F(Exemptions, AnExemptApplicationStartsAndKeepsItsFlags) {
    const auto client = makeConnected();
    EXPECT_EQ(start(*client, true), -5801);  // the manager wants the microphone from now on
    exempt(*client);
    const auto asked = client->start({client->window}, {.microphone = true, .camera = true});
    settle();
    ASSERT_EQ(asked->code(), 0);
    EXPECT_EQ(asked->values[1], Value(true));
    EXPECT_EQ(asked->values[2], Value(true));
}

TEST_F(Exemptions, WithTheMicrophoneWantedOnlyTheSetOfSuchRecordingsCounts) {
    const auto client = makeConnected();
    EXPECT_EQ(start(*client, false), -5801);
    exempt(*client);
    EXPECT_TRUE(isExempt(*client));
    EXPECT_EQ(start(*client, true), -5801);
    EXPECT_FALSE(isExempt(*client));
    exempt(*client);
    EXPECT_TRUE(isExempt(*client));
    EXPECT_EQ(start(*client, false), 0);
    EXPECT_TRUE(isExempt(*client)) << "such an exemption is one of a plain recording too";
}

TEST_F(Exemptions, AnExemptionWithTheMicrophoneIsOneWithoutItToo) {
    const auto client = makeConnected();
    EXPECT_EQ(start(*client, true), -5801);
    exempt(*client);
    EXPECT_EQ(start(*client, false), 0);
}

TEST_F(Exemptions, ARefusedStartLeavesTheFlagsItAskedFor) {
    const auto client = makeConnected();
    const auto asked = client->start({client->window}, {.microphone = true, .camera = true});
    settle();
    ASSERT_EQ(asked->code(), -5801);
    EXPECT_TRUE(process_->manager().isMicrophoneRecording());
    EXPECT_TRUE(process_->manager().isCameraRecording());
    fakes_.appStateMonitor.setState(client->id, 0);
    EXPECT_EQ(start(*client, false), -5803);
    EXPECT_TRUE(process_->manager().isMicrophoneRecording()) << "refused before its flags were looked at";
}

TEST_F(Exemptions, EightMinutesInTheBackgroundAreForgivenAndASecondMoreIsNot) {
    const auto client = makeConnected();
    exempt(*client);
    tell(*client, DaemonMessage::ClientDidResignActive);
    EXPECT_EQ(fakes_.logSink.logged(), (Lines{"LCRecordingManager:clientDidResignActiveWithBundleID:"}));
    advance(seconds(480));
    tell(*client, DaemonMessage::ClientDidBecomeActive);
    EXPECT_EQ(fakes_.logSink.logged(), (Lines{"LCRecordingManager:clientDidBecomeActiveWithBundleID:", kExpiry}));
    EXPECT_TRUE(isExempt(*client));
    advance(seconds(1));
    tell(*client, DaemonMessage::ClientDidBecomeActive);
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"LCRecordingManager:clientDidBecomeActiveWithBundleID:", kExpiry, "removedExemption"}));
    EXPECT_FALSE(isExempt(*client));
}

TEST_F(Exemptions, TheFirstMomentInTheBackgroundCounts) {
    const auto client = makeConnected();
    exempt(*client);
    tell(*client, DaemonMessage::ClientDidResignActive);
    advance(seconds(300));
    tell(*client, DaemonMessage::ClientDidResignActive);
    advance(seconds(181));
    tell(*client, DaemonMessage::ClientDidBecomeActive);
    EXPECT_FALSE(isExempt(*client));
}

TEST_F(Exemptions, AnEndedExemptionTakesItsDateWithIt) {
    const auto client = makeConnected();
    exempt(*client);
    tell(*client, DaemonMessage::ClientDidResignActive);
    advance(seconds(481));
    tell(*client, DaemonMessage::ClientDidBecomeActive);
    exempt(*client);
    tell(*client, DaemonMessage::ClientDidBecomeActive);
    EXPECT_TRUE(isExempt(*client));
    EXPECT_EQ(logged("removedExemption"), 0u);
}

TEST_F(Exemptions, WithoutADateAnExemptionLasts) {
    const auto client = makeConnected();
    exempt(*client);
    advance(seconds(100'000));
    tell(*client, DaemonMessage::ClientDidBecomeActive);
    EXPECT_TRUE(isExempt(*client));
}

TEST_F(Exemptions, AReconnectionMayEndAnExemptionOfBothKinds) {
    const auto client = makeConnected();
    start(*client, true);
    exempt(*client);
    tell(*client, DaemonMessage::ClientDidResignActive);
    client->connect();
    settle();
    EXPECT_TRUE(isExempt(*client));
    advance(seconds(481));
    client->connect();
    settle();
    EXPECT_FALSE(isExempt(*client)) << "with the microphone";
    EXPECT_EQ(start(*client, false), -5801);
    EXPECT_FALSE(isExempt(*client)) << "without";
}

TEST_F(Exemptions, AnInterruptedMovieIsReportedWhenTheApplicationRecordsAgain) {
    fakes_.preferences.set(kPreferenceDomain, "LCSuppressAlert", true);
    const auto client = makeConnected();
    session(*client)->setInterruptedMovieURL(URL("file:///left.mp4"));
    tell(*client, DaemonMessage::ClientDidBecomeActive);
    EXPECT_EQ(fakes_.logSink.logged(), (Lines{"LCRecordingManager:clientDidBecomeActiveWithBundleID:", kExpiry}));
    EXPECT_TRUE(session(*client)->interruptedMovieURL()) << "an idle session keeps it";
    ASSERT_EQ(start(*client, false), 0);
    tell(*client, DaemonMessage::ClientDidBecomeActive);
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"LCRecordingManager:clientDidBecomeActiveWithBundleID:", kExpiry,
                     "current session was interrupted - notify client app of error",
                     "LCRecordingManager:recordingSessionStoppedWithError:movieURL:",
                     "LCClientProxy:stopRecordingWithError:movieURL:"}));
    ASSERT_EQ(client->toldOfStop(-5806), 1);
    EXPECT_EQ(client->told.back().arguments[1], Value(URL("file:///left.mp4")));
    EXPECT_FALSE(session(*client)->interruptedMovieURL());
    EXPECT_TRUE(session(*client)->isRecording());
    tell(*client, DaemonMessage::ClientDidBecomeActive);
    EXPECT_EQ(client->toldOfStop(-5806), 1) << "once";
}

TEST_F(Exemptions, WhatTheMicrophoneAndTheSoundFollowIsTakenOnlyWhileRecording) {
    fakes_.preferences.set(kPreferenceDomain, "LCSuppressAlert", true);
    const auto client = makeConnected();
    const auto both = [&](const Lines& ofTheSession) {
        fakes_.logSink.clear();
        client->tell(DaemonMessage::SetMicrophoneEnabled, {true});
        client->tell(DaemonMessage::UpdateProcessIDForAudioCapture, {std::int32_t{-7}});
        settle();
        EXPECT_EQ(fakes_.logSink.logged(), joined({"LCRecordingManager: setMicrophoneEnabled:1",
                                                   "LCRecordingManager: updateProcessIDForAudioCaptureWithPID:-7"},
                                                  ofTheSession));
    };
    both({});
    EXPECT_FALSE(session(*client)->microphoneEnabled());
    EXPECT_EQ(session(*client)->frontmostPIDForAudioTap(), ProcessID{0});
    ASSERT_EQ(start(*client, false), 0);
    session(*client)->setSystemRecording(true);  // system recordings too
    both({"updateProcessIDForAudioCaptureWithPID: -7", "stopping audio capture",
          "invalid pid stopping audio capture"});
    EXPECT_TRUE(session(*client)->microphoneEnabled());
    EXPECT_EQ(session(*client)->frontmostPIDForAudioTap(), ProcessID{-7});
}

}  // namespace
}  // namespace lumacast
