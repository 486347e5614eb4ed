#include "base/MessageTables.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <limits>
#include <set>

#include "base/Limits.h"
#include "tests/fakes/FakePlane.h"
#include "tests/unit/base/NamelessEndpoint.h"

namespace lumacast {
namespace {

bool fits(const Value& value, ArgumentType type) { return matches({value}, std::span(&type, 1)); }

const MessageDeclaration& declaration(DaemonMessage message) {
    return daemonProtocol().messages[static_cast<std::size_t>(message)];
}

TEST(MessageTables, TheProtocolsHaveTheirMessages) {
    EXPECT_EQ(daemonProtocol().name, "LCDaemonProtocol");
    EXPECT_EQ(daemonProtocol().messages.size(), 20u);
    EXPECT_EQ(clientProtocol().name, "LCClientProtocol");
    EXPECT_EQ(clientProtocol().messages.size(), 8u);
    EXPECT_EQ(declaration(DaemonMessage::StopRecording).name, "stopRecordingWithHandler:");
    EXPECT_EQ(declaration(DaemonMessage::ReportCameraUsage).name, "reportCameraUsage:");
    EXPECT_EQ(declaration(DaemonMessage::DiscardRecording).name, "discardRecordingWithHandler:");
    EXPECT_EQ(clientProtocol().messages[static_cast<std::size_t>(ClientMessage::RecordingTimerDidUpdate)].name,
              "recordingTimerDidUpdate:");
}

TEST(MessageTables, EachNumberHasItsName) {
    // Only the number travels: written out by hand.
    using D = DaemonMessage;
    using C = ClientMessage;
    const auto name = [](const Protocol& protocol, auto message) {
        return protocol.messages[static_cast<std::size_t>(message)].name;
    };
    const std::vector<std::pair<D, std::string_view>> daemon{
        {D::StartRecording,
         "startRecordingWindowLayerContextIDs:windowSize:microphoneEnabled:cameraEnabled:broadcast:systemRecording:"
         "captureEnabled:listenerEndpoint:withHandler:"},
        {D::SetupBroadcast,
         "setupBroadcastWithHostBundleID:broadcastExtensionBundleID:broadcastConfigurationData:userInfo:handler:"},
        {D::GetCurrentBroadcastImages, "getCurrentBroadcastImages:"},
        {D::GetSystemBroadcastExtensionInfo, "getSystemBroadcastExtensionInfo:"},
        {D::StopRecording, "stopRecordingWithHandler:"},
        {D::StopRecordingWithClipDurations, "stopRecordingWithStartClipDuration:endClipDuration:handler:"},
        {D::SaveVideoToCameraRoll, "saveVideoToCameraRoll:handler:"},
        {D::PauseRecording, "pauseRecording"},
        {D::ResumeRecording, "resumeRecordingWithWindowLayerContextID:"},
        {D::SetMicrophoneEnabled, "setMicrophoneEnabled:"},
        {D::UpdateProcessIDForAudioCapture, "updateProcessIDForAudioCaptureWithPID:"},
        {D::DiscardRecording, "discardRecordingWithHandler:"},
        {D::ClientDidBecomeActive, "clientDidBecomeActive"},
        {D::ClientDidResignActive, "clientDidResignActive"},
        {D::SynchronousGetCurrentState, "synchronousGetCurrentState:"},
        {D::SetHasUserConsentForCamera, "setHasUserConsentForCamera:"},
        {D::SetHasUserConsentForMicrophone, "setHasUserConsentForMicrophone:"},
        {D::SetBroadcastURL, "setBroadcastURL:"},
        {D::SetMicrophoneEnabledPersistent, "setMicrophoneEnabledPersistent:"},
        {D::ReportCameraUsage, "reportCameraUsage:"}};
    ASSERT_EQ(daemon.size(), daemonProtocol().messages.size());
    for (std::size_t i = 0; i < daemon.size(); ++i) {
        EXPECT_EQ(static_cast<std::size_t>(daemon[i].first), i);
        EXPECT_EQ(name(daemonProtocol(), daemon[i].first), daemon[i].second);
    }
    const std::vector<std::pair<C, std::string_view>> client{
        {C::UpdateScreenRecordingState, "updateScreenRecordingState:"},
        {C::StopRecordingWithError, "stopRecordingWithError:movieURL:"},
        {C::UpdateBroadcastServiceInfo, "updateBroadcastServiceInfo:"},
        {C::UpdateBroadcastURL, "updateBroadcastURL:"},
        {C::CaptureHandlerWithSample, "captureHandlerWithSample:timingData:"},
        {C::CaptureHandlerWithAudioSample,
         "captureHandlerWithAudioSample:absdData:itemCount:bufferType:timingData:"},
        {C::RecordingLockInterrupted, "recordingLockInterrupted:"},
        {C::RecordingTimerDidUpdate, "recordingTimerDidUpdate:"}};
    ASSERT_EQ(client.size(), clientProtocol().messages.size());
    for (std::size_t i = 0; i < client.size(); ++i) {
        EXPECT_EQ(static_cast<std::size_t>(client[i].first), i);
        EXPECT_EQ(name(clientProtocol(), client[i].first), client[i].second);
    }
}

TEST(MessageTables, NamesAreDistinctAndHaveAColonForEachArgumentAndTheHandler) {
    for (const Protocol* protocol : {&daemonProtocol(), &clientProtocol()}) {
        std::set<std::string_view> names;
        for (const MessageDeclaration& message : protocol->messages) {
            EXPECT_TRUE(names.insert(message.name).second) << message.name;
            const auto colons = static_cast<std::size_t>(std::count(message.name.begin(), message.name.end(), ':'));
            EXPECT_EQ(colons, message.arguments.size() + (message.reply == Reply::Expected ? 1 : 0)) << message.name;
            EXPECT_TRUE(message.reply == Reply::Expected || message.replyValues.empty()) << message.name;
        }
    }
}

TEST(MessageTables, NoMessageToAClientHasAReply) {
    for (const MessageDeclaration& message : clientProtocol().messages)
        EXPECT_EQ(message.reply, Reply::None) << message.name;
}

TEST(MessageTables, TheCountMustBeRight) {
    const auto& stop = declaration(DaemonMessage::StopRecordingWithClipDurations);
    EXPECT_TRUE(matches({0.0, 1.5}, stop.arguments));
    EXPECT_FALSE(matches({0.0}, stop.arguments));
    EXPECT_FALSE(matches({0.0, 1.5, 2.0}, stop.arguments));
    EXPECT_TRUE(matches({}, declaration(DaemonMessage::PauseRecording).arguments));
}

TEST(MessageTables, NumbersMustBeOfTheirKindAndRange) {
    EXPECT_TRUE(fits(Value(std::int64_t{-2147483648}), ArgumentType::Int32));
    EXPECT_TRUE(fits(Value(std::int64_t{2147483647}), ArgumentType::Int32));
    EXPECT_FALSE(fits(Value(std::int64_t{2147483648}), ArgumentType::Int32));
    EXPECT_FALSE(fits(Value(std::int64_t{-2147483649}), ArgumentType::Int32));
    EXPECT_FALSE(fits(Value(std::uint64_t{1}), ArgumentType::Int32));
    EXPECT_TRUE(fits(Value(std::uint64_t{4294967295}), ArgumentType::UInt32));
    EXPECT_FALSE(fits(Value(std::uint64_t{4294967296}), ArgumentType::UInt32));
    EXPECT_FALSE(fits(Value(std::int64_t{1}), ArgumentType::UInt32));
    EXPECT_TRUE(fits(Value(std::numeric_limits<std::int64_t>::min()), ArgumentType::Int64));
    EXPECT_FALSE(fits(Value(1), ArgumentType::Double));
    EXPECT_FALSE(fits(Value(1), ArgumentType::Bool));
    EXPECT_TRUE(fits(Value(false), ArgumentType::Bool));
}

TEST(MessageTables, EachTypeTakesItsKindAndNoOther) {
    struct Row {
        ArgumentType type;
        std::set<std::size_t> kinds;  ///< indexes of Value::Storage
        bool nullable;
    };
    const std::vector<Value> values{Value(),
                                    true,
                                    std::int64_t{1},
                                    std::uint64_t{1},
                                    1.0,
                                    "x",
                                    Data{1},
                                    Date{1},
                                    URL("u"),
                                    Array{},
                                    Dictionary{},
                                    Error("d", 1),
                                    Value::EndpointRef(std::make_shared<NamelessEndpoint>()),
                                    Value::PlaneRef(std::make_shared<FakePlane>(1, 1, 1, std::vector<PixelRect>()))};
    const std::vector<Row> rows{{ArgumentType::Bool, {1}, false},
                                {ArgumentType::Int32, {2}, false},
                                {ArgumentType::UInt32, {3}, false},
                                {ArgumentType::Int64, {2}, false},
                                {ArgumentType::Double, {4}, false},
                                {ArgumentType::Size, {}, false},
                                {ArgumentType::ContextIDs, {9}, false},
                                {ArgumentType::Text, {5}, false},
                                {ArgumentType::Data, {6}, false},
                                {ArgumentType::NullableData, {6}, true},
                                {ArgumentType::Dictionary, {10}, false},
                                {ArgumentType::NullableDictionary, {10}, true},
                                {ArgumentType::Array, {9}, false},
                                {ArgumentType::URL, {8}, false},
                                {ArgumentType::NullableURL, {8}, true},
                                {ArgumentType::NullableEndpoint, {12}, true},
                                {ArgumentType::NullableError, {11}, true},
                                {ArgumentType::SharedPlaneObject, {13}, true},
                                {ArgumentType::Any, {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13}, true}};
    ASSERT_EQ(rows.size(), static_cast<std::size_t>(ArgumentType::Any) + 1) << "a type without a row";
    for (const Row& row : rows)
        for (const Value& value : values) {
            const std::size_t kind = value.storage().index();
            EXPECT_EQ(fits(value, row.type), kind == 0 ? row.nullable : row.kinds.contains(kind))
                << static_cast<int>(row.type) << " " << kind;
        }
}

TEST(MessageTables, EndpointsTravelOnlyWhereTheyAreDeclared) {
    const Value endpoint = Value::EndpointRef(std::make_shared<NamelessEndpoint>());
    const Dictionary dictionary{{"deep", Array{Dictionary{{"deeper", endpoint}}}}};
    EXPECT_FALSE(fits(dictionary, ArgumentType::Dictionary));
    EXPECT_FALSE(fits(dictionary, ArgumentType::NullableDictionary));
    EXPECT_FALSE(fits(Array{1, endpoint}, ArgumentType::Array));
    EXPECT_FALSE(fits(Error("domain", 1, dictionary), ArgumentType::NullableError));
    const Value plane = Value::PlaneRef(std::make_shared<FakePlane>(1, 1, 1, std::vector<PixelRect>()));
    EXPECT_TRUE(fits(Dictionary{{"picture", plane}}, ArgumentType::Dictionary)) << "a payload carries its picture";
    EXPECT_TRUE(fits(Dictionary{{"deep", Array{Dictionary{{"deeper", "x"}}}}}, ArgumentType::Dictionary));
    EXPECT_TRUE(fits(Error("domain", 1, {{"why", Array{1}}}), ArgumentType::NullableError));
}

TEST(MessageTables, ASizeIsTwoNumbers) {
    EXPECT_TRUE(fits(Array{640.0, 480.5}, ArgumentType::Size));
    EXPECT_FALSE(fits(Array{640.0}, ArgumentType::Size));
    EXPECT_FALSE(fits(Array{640.0, 480.0, 1.0}, ArgumentType::Size));
    EXPECT_FALSE(fits(Array{640, 480}, ArgumentType::Size));
}

TEST(MessageTables, ContextIdentifiersAreFewAndOf32Bits) {
    const auto ids = [](std::uint64_t count) { return Array(count, Value(std::uint32_t{7})); };
    const std::uint64_t limit = limitOf(Limit::ContextIdentifiersPerRequest);
    EXPECT_TRUE(fits(ids(0), ArgumentType::ContextIDs));
    EXPECT_TRUE(fits(ids(limit), ArgumentType::ContextIDs));
    EXPECT_FALSE(fits(ids(limit + 1), ArgumentType::ContextIDs));
    EXPECT_FALSE(fits(Array{std::uint64_t{1} << 32}, ArgumentType::ContextIDs));
    EXPECT_FALSE(fits(Array{1}, ArgumentType::ContextIDs));
}

TEST(Limits, TheTableHasARowForEachLimitInItsOrder) {
    for (std::size_t i = 0; i < kLimits.size(); ++i) {
        EXPECT_EQ(static_cast<std::size_t>(kLimits[i].limit), i);
        EXPECT_GT(kLimits[i].value, 0u);
        EXPECT_FALSE(kLimits[i].meaning.empty());
        EXPECT_EQ(limitOf(kLimits[i].limit), kLimits[i].value);
    }
}

}  // namespace
}  // namespace lumacast
