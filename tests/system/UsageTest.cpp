// Every way in which a recording can end leaves a line that says how, and the administrator's tool shows it.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>

#include <filesystem>
#include <fstream>

#include "tests/contract/TestWindow.h"
#include "tests/system/MovingWindow.h"
#include "tests/system/Tool.h"
#include "tests/system/World.h"

namespace lumacast::test {
namespace {

using ::testing::AnyOf;
using ::testing::HasSubstr;
using ::testing::Not;

constexpr int kSummary = 1, kClosedAtEnd = 2;

nlohmann::json usage(const World& world) {
    const Outcome outcome = tool(world, {"usage", "--json"});
    EXPECT_EQ(outcome.status, 0);
    return nlohmann::json::parse(outcome.out, nullptr, false);
}

class Usage : public ::testing::Test {
protected:
    Usage() { world_.startDaemon(); }

    /// An application with a running recording.
    std::unique_ptr<Application> recordingApplication() {
        auto application = world_.application(kMoving);
        start(*application);
        return application;
    }
    void start(Application& application) {
        EXPECT_TRUE(application.waitForFrame(1));
        (void)application.askForFrame("start");
        EXPECT_TRUE(world_.waitForElapsed(1));
    }
    /// The one event more than before, waited for; null when there isn't exactly one.
    nlohmann::json newEvent() {
        nlohmann::json all;
        const bool came = waitUntil([&] {
            all = usage(world_);
            return all["events"].size() > seen_;
        });
        EXPECT_TRUE(came) << all << world_.daemonLog();
        EXPECT_EQ(all["events"].size(), seen_ + 1) << all;
        EXPECT_EQ(all["damagedLines"], 0u);
        seen_ = all["events"].size();
        return came ? all["events"].back() : nlohmann::json();
    }
    /// An ordinary summary of a recording that has taken pictures.
    void expectSummary(const nlohmann::json& event, int reason) {
        EXPECT_EQ(event["type"], kSummary) << event;
        EXPECT_EQ(event["serviceName"], "InAppRecording") << event;
        const auto& payload = event["payload"];
        EXPECT_EQ(payload.size(), 15u) << event;
        EXPECT_EQ(payload["EndReason"], reason) << event;
        EXPECT_EQ(payload["VideoCaptureWidth"], 320) << event;
        EXPECT_EQ(payload["VideoCaptureHeight"], 180) << event;
        EXPECT_GE(payload["ActiveDuration"].get<int>(), 1) << event;
        EXPECT_GT(payload["VideoFrameCount"].get<int>(), 5) << event;
    }
    void expectSummaryWithFile(const nlohmann::json& event, int reason) {
        expectSummary(event, reason);
        EXPECT_GT(event["payload"]["RecordedFileSize"].get<int>(), 0) << event;
    }

    World world_;
    std::size_t seen_ = 0;
};

TEST_F(Usage, StopsDiscardsAndRestartsEndWithoutAnError) {
    const auto application = recordingApplication();
    ASSERT_FALSE(application->stop().empty());
    expectSummaryWithFile(newEvent(), 0);

    start(*application);
    EXPECT_THAT(application->ask("pause"), ::testing::StartsWith("paused frame "));
    ASSERT_FALSE(application->stop().empty());
    expectSummaryWithFile(newEvent(), 0);
    EXPECT_EQ(application->ask("discard"), "discarded");

    start(*application);
    start(*application);
    EXPECT_THAT(application->nextEvent(), HasSubstr("stopped -5806"));
    expectSummary(newEvent(), 0);
    ASSERT_TRUE(world_.waitForElapsed(3));
    ASSERT_FALSE(application->stop("clip 1 1").empty());
    expectSummaryWithFile(newEvent(), 0);

    const Outcome shown = tool(world_, {"usage"});
    EXPECT_EQ(shown.status, 0);
    EXPECT_EQ(std::count(shown.out.begin(), shown.out.end(), '\n'), 5) << "a heading and a line each\n" << shown.out;
    EXPECT_THAT(shown.out, HasSubstr("  InAppRecording      0:0"));
    EXPECT_THAT(shown.out, HasSubstr("  320x180    "));
    EXPECT_TRUE(shown.out.ends_with("  it ended without an error\n")) << shown.out;
}

TEST_F(Usage, AnotherApplicationsStartAndAPurgeAreTheClientsErrorsAndNotTheRecordings) {
    const auto first = recordingApplication();
    const auto second = world_.otherApplication("Rival", kMoving);
    start(*second);
    EXPECT_THAT(first->nextEvent(), HasSubstr("stopped -5806"));
    expectSummary(newEvent(), 0);
    EXPECT_EQ(tool(world_, {"storage", "purge", "3"}).status, 0);
    EXPECT_THAT(second->nextEvent(), HasSubstr("stopped -5805"));
    expectSummary(newEvent(), 0);
}

TEST_F(Usage, AClientThatDiesHasALineToo) {
    recordingApplication()->kill();
    const auto event = newEvent();
    // Its window may go before its connection does.
    EXPECT_THAT(event["payload"]["EndReason"].get<int>(), AnyOf(0, -5817));
    expectSummary(event, event["payload"]["EndReason"].get<int>());
}

TEST_F(Usage, AWindowThatGoesIsAFailedCapture) {
    const auto application = recordingApplication();
    const TestWindow helper(world_.display().name(), {.mapped = false});
    xcb_destroy_window(helper.connection(), application->window());
    xcb_flush(helper.connection());
    EXPECT_THAT(application->nextEvent(), HasSubstr("stopped -5817"));
    expectSummaryWithFile(newEvent(), -5817);
    EXPECT_THAT(tool(world_, {"usage"}).out,
                HasSubstr("  the capture failed: its window or the display is gone (-5817)\n"));
}

TEST_F(Usage, ADisplayServerThatDiesIsAFailedCapture) {
    const auto application = recordingApplication();
    world_.display().crash();
    expectSummaryWithFile(newEvent(), -5817);
}

TEST_F(Usage, ARefusedStartIsNoRecording) {
    const auto application = world_.application(kMoving);
    ASSERT_TRUE(application->waitForFrame(1));
    EXPECT_EQ(application->ask("hide"), "ok");
    const auto rival = world_.otherApplication("Rival", kMoving);
    ASSERT_TRUE(rival->waitForFrame(1));
    application->send("start");
    EXPECT_THAT(application->answer(), HasSubstr("error -58")) << world_.daemonLog();
    start(*rival);
    ASSERT_FALSE(rival->stop().empty());
    expectSummaryWithFile(newEvent(), 0);
}

TEST_F(Usage, ADaemonThatIsToldToEndNotesWhatItsMovieTells) {
    const auto application = recordingApplication();
    EXPECT_EQ(world_.endDaemon(SIGTERM), 0);
    EXPECT_EQ(tool(world_, {"usage"}).status, 1) << "nobody answers";
    world_.startDaemon();
    const auto event = newEvent();
    EXPECT_EQ(event["type"], kClosedAtEnd) << event;
    const auto& payload = event["payload"];
    EXPECT_EQ(payload["EndReason"], -5806) << event;
    EXPECT_EQ(payload["VideoCaptureWidth"], 320) << event;
    EXPECT_EQ(payload["VideoCaptureHeight"], 180) << event;
    EXPECT_GE(payload["ActiveDuration"].get<int>(), 1) << event;
    EXPECT_EQ(payload["VideoFrameCount"].get<std::size_t>(), picturesOf(world_.moviePath()).size()) << event;
    EXPECT_GT(payload["RecordedFileSize"].get<int>(), 0) << event;
    EXPECT_THAT(tool(world_, {"usage"}).out, HasSubstr("  the daemon was told to end\n"));
}

TEST_F(Usage, ARecordingThatWasStoppedBeforeTheDaemonEndsHasItsOwnLineOnly) {
    const auto application = recordingApplication();
    ASSERT_FALSE(application->stop().empty());
    EXPECT_EQ(world_.endDaemon(SIGTERM), 0);
    world_.startDaemon();
    expectSummaryWithFile(newEvent(), 0);
}

TEST_F(Usage, AStateDirectoryThatCantBeWrittenCostsTheLineAlone) {
    const auto application = recordingApplication();
    const std::string file = world_.path("state/lumacast/telemetry.jsonl");
    std::filesystem::create_directory(file);
    const std::string movie = application->stop();
    EXPECT_FALSE(picturesOf(movie).empty());
    EXPECT_TRUE(waitUntil([&] { return usage(world_)["lostEvents"] == 1u; })) << usage(world_);
    std::filesystem::remove(file);
    start(*application);
    ASSERT_FALSE(application->stop().empty());
    expectSummaryWithFile(newEvent(), 0);
}

TEST_F(Usage, DamagedLinesAreSkippedAndNothingElse) {
    const auto application = recordingApplication();
    ASSERT_FALSE(application->stop().empty());
    expectSummaryWithFile(newEvent(), 0);
    std::ofstream(world_.path("state/lumacast/telemetry.jsonl"), std::ios::app) << "{\"type\":1,\"payload\":{\"EndRea";
    start(*application);
    ASSERT_FALSE(application->stop().empty());
    EXPECT_TRUE(waitUntil([&] { return usage(world_)["events"].size() == 2; })) << usage(world_);
    EXPECT_EQ(usage(world_)["damagedLines"], 1u);
    EXPECT_TRUE(tool(world_, {"usage"}).out.ends_with("\n1 line is damaged and left out.\n"));
}

}  // namespace
}  // namespace lumacast::test
