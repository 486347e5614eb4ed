#include "support/LCReportingAgent.h"

#include <gtest/gtest.h>

#include <mutex>

#include "base/Log.h"
#include "tests/fakes/FakeTelemetry.h"
#include "tests/fakes/FaultPlan.h"

namespace lumacast {
namespace {

class LCReportingAgentTest : public ::testing::Test {
protected:
    Value metric(std::string_view key) {
        const Dictionary metrics = agent_.collectSummaryEventMetrics();
        const Value* value = metrics.find(key);
        return value ? *value : Value("missing");
    }
    FaultPlan faults_;
    FakeTelemetry telemetry_{faults_};
    Log log_;
    LCReportingAgent agent_{log_, telemetry_, "InAppRecording"};
};

TEST_F(LCReportingAgentTest, TheSummaryHasItsFifteenEntriesInOrder) {
    std::vector<std::string> keys;
    const Dictionary metrics = agent_.collectSummaryEventMetrics();
    for (const auto& [key, value] : metrics.entries()) keys.push_back(key);
    EXPECT_EQ(keys, (std::vector<std::string>{"ActiveDuration", "VideoCaptureWidth", "VideoCaptureHeight",
                                              "VideoCaptureRate", "VideoFrameCount", "AppAudioCaptureRate",
                                              "AppAudioFrameCount", "MicCaptureRate", "MicFrameCount",
                                              "FrontCameraUsed", "BackCameraUsed", "RecordedFileSize",
                                              "BroadcastExtensionBundleID", "ClientAppBundleID", "EndReason"}));
    EXPECT_EQ(metric("AppAudioCaptureRate"), Value(std::int64_t{2}));
    EXPECT_EQ(metric("MicCaptureRate"), Value(std::int64_t{43}));
    EXPECT_EQ(metric("FrontCameraUsed"), Value(false));
    EXPECT_EQ(metric("BackCameraUsed"), Value(false));
    EXPECT_EQ(metric("ClientAppBundleID"), Value(""));
}

TEST_F(LCReportingAgentTest, DurationsAreRoundedToTheNearestWholeNumber) {
    agent_.update([](UsageMetrics& m) { m.activeDuration = 12.5; });
    EXPECT_EQ(metric("ActiveDuration"), Value(std::int64_t{13}));
    agent_.update([](UsageMetrics& m) { m.activeDuration = 12.49; });
    EXPECT_EQ(metric("ActiveDuration"), Value(std::int64_t{12}));
}

TEST_F(LCReportingAgentTest, NumbersAreRoundedInSinglePrecision) {
    agent_.update([](UsageMetrics& m) { m.activeDuration = 16777217; });
    EXPECT_EQ(metric("ActiveDuration"), Value(std::int64_t{16777216}));
    agent_.update([](UsageMetrics& m) { m.activeDuration = 12.4999999; });
    EXPECT_EQ(metric("ActiveDuration"), Value(std::int64_t{13})) << "12.5 in single precision";
}

TEST_F(LCReportingAgentTest, AnEventIsSentWithItsSessionAndUser) {
    agent_.reportEventWithType(1, agent_.collectSummaryEventMetrics());
    const auto events = telemetry_.events();
    ASSERT_EQ(events.size(), 1u);
    EXPECT_EQ(events[0].session.clientType, 23);
    EXPECT_EQ(events[0].session.clientVersion, 1);
    EXPECT_EQ(events[0].session.sessionIdentifier, 0);
    EXPECT_TRUE(events[0].session.batchEvent);
    EXPECT_TRUE(events[0].session.requireUserInfo);
    EXPECT_EQ(events[0].user.clientName, "Lumacast");
    EXPECT_EQ(events[0].user.serviceName, "InAppRecording");
    EXPECT_EQ(events[0].category, 2);
    EXPECT_EQ(events[0].type, 1);
    EXPECT_EQ(events[0].payload.size(), 15u);
}

TEST_F(LCReportingAgentTest, AMissingPayloadIsLoggedAndSendsNothing) {
    agent_.reportEventWithType(1, std::nullopt);
    EXPECT_TRUE(telemetry_.events().empty());
    EXPECT_EQ(log_.recentLines(), std::vector<std::string>{"LCReportingAgent: payloadDict cannot be null!"});
}

TEST_F(LCReportingAgentTest, AFailedSendIsOnlyLogged) {
    faults_.failNext("TelemetryReporter.send");
    agent_.reportEventWithType(1, Dictionary{{"a", true}});
    EXPECT_EQ(log_.recentLines(), (std::vector<std::string>{"LCReportingAgent: reportingEvent:1 payload:{\"a\" = 1; }",
                                                           "eventType:1 error code 5."}));
}

}  // namespace
}  // namespace lumacast
