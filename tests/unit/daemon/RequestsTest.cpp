// The smaller requests: the state, the flags, and the messages that are declared but not served.

#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {
namespace {

class Requests : public DaemonWorld {
protected:
    Dictionary state(TestClient& client) {
        const auto asked = client.ask(DaemonMessage::SynchronousGetCurrentState);
        settle();
        const Dictionary* found = asked->answers == 1 ? asked->values[0].as<Dictionary>() : nullptr;
        EXPECT_TRUE(found);
        return found ? *found : Dictionary();
    }
    static Lines keysOf(const Dictionary& dictionary) {
        Lines keys;
        for (const auto& [key, value] : dictionary.entries()) keys.push_back(key);
        return keys;
    }
    void tell(TestClient& client, DaemonMessage message, Array arguments) {
        client.tell(message, std::move(arguments));
        settle();
    }
};

TEST_F(Requests, TheStateHasSevenKeysInOrderAndAnEighthWithABroadcastURL) {
    const auto client = makeConnected();
    Lines keys{"isRecording",
               "isBroadcasting",
               "microphoneEnabled",
               "isSystemRecording",
               "hasUserConsentForMicrophone",
               "hasUserConsentForCamera",
               "microphoneEnabledPersistent"};
    const Dictionary idle = state(*client);
    EXPECT_EQ(keysOf(idle), keys);
    for (const auto& [key, value] : idle.entries()) EXPECT_EQ(value, Value(false)) << key;
    tell(*client, DaemonMessage::SetBroadcastURL, {URL("https://example.org/live")});
    keys.push_back("broadcastURL");
    const Dictionary live = state(*client);
    EXPECT_EQ(keysOf(live), keys);
    EXPECT_EQ(*live.find("broadcastURL"), Value(URL("https://example.org/live")));
    tell(*client, DaemonMessage::SetBroadcastURL, {Value()});
    EXPECT_EQ(state(*client).size(), 7u);
}

TEST_F(Requests, TheStateIsThatOfTheCallersOwnSession) {
    const auto other = makeRecording("Editor", 501, 8);
    const auto client = makeConnected();
    EXPECT_EQ(*state(*client).find("isRecording"), Value(false));
    EXPECT_EQ(*state(*other).find("isRecording"), Value(true));
}

TEST_F(Requests, EachFlagIsStoredUnderItsOwnKey) {
    const std::vector<std::pair<DaemonMessage, std::string>> flags{
        {DaemonMessage::SetHasUserConsentForCamera, "hasUserConsentForCamera"},
        {DaemonMessage::SetHasUserConsentForMicrophone, "hasUserConsentForMicrophone"},
        {DaemonMessage::SetMicrophoneEnabledPersistent, "microphoneEnabledPersistent"}};
    const auto client = makeConnected();
    for (const auto& [message, key] : flags) {
        tell(*client, message, {true});
        const Dictionary now = state(*client);
        for (const auto& [name, value] : now.entries()) EXPECT_EQ(value, Value(name == key)) << key << ", " << name;
        tell(*client, message, {false});
        EXPECT_EQ(*state(*client).find(key), Value(false));
    }
}

TEST_F(Requests, TheFlagsLiveAsLongAsTheSessionNotTheRecording) {
    const auto client = makeRecording();
    tell(*client, DaemonMessage::SetHasUserConsentForCamera, {true});
    client->ask(DaemonMessage::StopRecording);
    settle();
    EXPECT_EQ(*state(*client).find("hasUserConsentForCamera"), Value(true));
}

TEST_F(Requests, TheCameraUsageIsAcceptedAndIgnored) {
    const auto client = makeRecording();
    tell(*client, DaemonMessage::ReportCameraUsage, {std::int32_t{1}});
    EXPECT_TRUE(fakes_.logSink.lines().empty());
    EXPECT_FALSE(session(*client)->reportingAgent()->metrics().frontCameraUsed);
}

TEST_F(Requests, AStartAfterTheApplicationWasUninstalledIsRefusedAndTheRestIgnored) {
    const auto client = makeConnected(), other = makeRecording("Editor", 501, 8);
    fakes_.bundles.uninstall(client->id);
    const auto plain = client->start({});
    const auto system = client->start({client->window}, {.system = true});
    settle();
    EXPECT_EQ(plain->code(), -5803) << "nobody is in the foreground";
    EXPECT_EQ(system->code(), -5810);
    // A window whose process belongs to no application is not that of a caller who belongs to none.
    const auto third = makeRecording("Editor", 503, 10);
    fakes_.renderServer.addLayer(ContextID{20}, ProcessID{900});
    EXPECT_EQ(client->start({ContextID{20}})->answers, 0);
    settle();
    EXPECT_TRUE(session(*third)->isRecording()) << "it was refused before room was made";
    const auto stop = client->ask(DaemonMessage::StopRecording);
    const auto discard = client->ask(DaemonMessage::DiscardRecording);
    for (const DaemonMessage message : {DaemonMessage::PauseRecording, DaemonMessage::ClientDidBecomeActive,
                                        DaemonMessage::ClientDidResignActive})
        client->tell(message);
    client->tell(DaemonMessage::ResumeRecording, {number(client->window)});
    settle();
    EXPECT_EQ(stop->answers + discard->answers, 0);
    EXPECT_TRUE(session(*third)->isRecording());
}

TEST_F(Requests, ARequestAfterTheApplicationWasUninstalledFindsNoSession) {
    const auto client = makeConnected();
    fakes_.bundles.uninstall(client->id);
    const auto asked = client->ask(DaemonMessage::SynchronousGetCurrentState);
    settle();
    ASSERT_EQ(asked->answers, 1);
    EXPECT_TRUE(asked->values[0].isNull());
}

}  // namespace
}  // namespace lumacast
