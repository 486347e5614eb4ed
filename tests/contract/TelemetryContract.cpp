#include <gtest/gtest.h>

#include <functional>
#include <sstream>
#include <thread>
#include <vector>

#include "linux/system/Json.h"
#include "linux/system/LinuxTelemetry.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/fakes/FakeTelemetry.h"

namespace lumacast {
namespace {

/// An event as the receiver has it.
struct Received {
    std::int64_t clientType, clientVersion, sessionIdentifier;
    bool batchEvent, requireUserInfo;
    std::string clientName, serviceName;
    std::int64_t category, type;
    Dictionary payload;
};

class TelemetryWorld {
public:
    virtual ~TelemetryWorld() = default;
    virtual TelemetryReporter& telemetry() = 0;
    /// Everything that was sent, oldest first.
    virtual std::vector<Received> received() = 0;
};

class FakeTelemetryWorld final : public TelemetryWorld {
public:
    TelemetryReporter& telemetry() override { return telemetry_; }
    std::vector<Received> received() override {
        std::vector<Received> result;
        for (const auto& [session, user, category, type, payload] : telemetry_.events())
            result.push_back({session.clientType, session.clientVersion, session.sessionIdentifier, session.batchEvent,
                              session.requireUserInfo, user.clientName, user.serviceName, category, type, payload});
        return result;
    }

private:
    FaultPlan faults_;
    FakeTelemetry telemetry_{faults_};
};

class PortTelemetryWorld final : public TelemetryWorld {
public:
    TelemetryReporter& telemetry() override { return telemetry_; }
    std::vector<Received> received() override {
        EXPECT_TRUE(telemetry_.flush(std::chrono::seconds(30)));
        std::vector<Received> result;
        std::istringstream lines(ScratchDirectory::read(scratch_.path("state/telemetry.jsonl")));
        for (std::string line; std::getline(lines, line);) {
            const auto value = valueFromJson(line);
            EXPECT_TRUE(value) << line;
            const Dictionary event = value ? *value->as<Dictionary>() : Dictionary();
            const auto number = [&](std::string_view key) { return *event.find(key)->as<std::int64_t>(); };
            const auto truth = [&](std::string_view key) { return *event.find(key)->as<bool>(); };
            const auto text = [&](std::string_view key) { return *event.find(key)->as<std::string>(); };
            result.push_back({number("clientType"), number("clientVersion"), number("sessionIdentifier"),
                              truth("batchEvent"), truth("requireUserInfo"), text("clientName"), text("serviceName"),
                              number("category"), number("type"), *event.find("payload")->as<Dictionary>()});
        }
        return result;
    }

private:
    ScratchDirectory scratch_;
    LinuxTelemetry telemetry_{scratch_.path("state/telemetry.jsonl")};
};

using Maker = std::function<std::unique_ptr<TelemetryWorld>()>;

class TelemetryContract : public ::testing::TestWithParam<Maker> {
protected:
    std::unique_ptr<TelemetryWorld> world_ = GetParam()();
};

TEST_P(TelemetryContract, AnEventArrivesWhole) {
    const Dictionary payload{{"ActiveDuration", std::int64_t{13}},
                             {"FrontCameraUsed", false},
                             {"RecordedFileSize", std::int64_t{123'456'789'012}},
                             {"ClientAppBundleID", ""}};
    EXPECT_FALSE(world_->telemetry().send({23, 1, 0, true, true}, {"Lumacast", "In\"App\n"}, 2, 1, payload));
    const auto received = world_->received();
    ASSERT_EQ(received.size(), 1u);
    const Received& event = received.front();
    EXPECT_EQ(event.clientType, 23);
    EXPECT_EQ(event.clientVersion, 1);
    EXPECT_EQ(event.sessionIdentifier, 0);
    EXPECT_TRUE(event.batchEvent);
    EXPECT_TRUE(event.requireUserInfo);
    EXPECT_EQ(event.clientName, "Lumacast");
    EXPECT_EQ(event.serviceName, "In\"App\n");
    EXPECT_EQ(event.category, 2);
    EXPECT_EQ(event.type, 1);
    EXPECT_EQ(Value(event.payload), Value(payload));
}

TEST_P(TelemetryContract, EventsArriveInTheirOrder) {
    for (std::int64_t type = 0; type < 20; ++type)
        EXPECT_FALSE(world_->telemetry().send({}, {"a", "b"}, 2, type, {}));
    const auto received = world_->received();
    ASSERT_EQ(received.size(), 20u);
    for (std::int64_t type = 0; type < 20; ++type) EXPECT_EQ(received[static_cast<std::size_t>(type)].type, type);
}

TEST_P(TelemetryContract, ManyLanesMaySend) {
    std::vector<std::thread> lanes;
    for (int lane = 0; lane < 4; ++lane)
        lanes.emplace_back([this] {
            for (int i = 0; i < 10; ++i)
                EXPECT_FALSE(world_->telemetry().send({}, {"a", "b"}, 2, 1, {{"key", "value"}}));
        });
    for (std::thread& lane : lanes) lane.join();
    EXPECT_EQ(world_->received().size(), 40u);
}

INSTANTIATE_TEST_SUITE_P(Fake, TelemetryContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeTelemetryWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, TelemetryContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortTelemetryWorld>(); })));

}  // namespace
}  // namespace lumacast
