#include "client/lumacastctl/usage/Usage.h"

#include <stdlib.h>
#include <time.h>

#include <set>

#include "base/RecordingErrorCodes.h"
#include "client/lumacastctl/ExitStatus.h"
#include "client/lumacastctl/Fields.h"
#include "linux/system/Json.h"
#include "linux/system/UsageCommand.h"
#include "tests/unit/lumacastctl/FindingMatchers.h"
#include "tests/unit/lumacastctl/Snapshots.h"
#include "tests/unit/lumacastctl/StandInDaemon.h"
#include "tests/unit/lumacastctl/ToolFixture.h"

namespace lumacast::ctl {
namespace {

using ::testing::HasSubstr;

Dictionary eventOf(const std::string& service, std::int64_t type, std::int64_t endReason, double time) {
    const Dictionary payload{{"ActiveDuration", std::int64_t{3723}},
                             {"VideoCaptureWidth", std::int64_t{1280}},
                             {"VideoCaptureHeight", std::int64_t{720}},
                             {"VideoCaptureRate", std::int64_t{60}},
                             {"VideoFrameCount", std::int64_t{223'380}},
                             {"AppAudioFrameCount", std::int64_t{99}},
                             {"MicFrameCount", std::int64_t{0}},
                             {"RecordedFileSize", std::uint64_t{12'345'678}},
                             {"EndReason", endReason}};
    return {
        {"time", time}, {"serviceName", service}, {"category", std::int64_t{2}}, {"type", type}, {"payload", payload}};
}

Dictionary usageAnswer() {
    return {{"events", Array{Value(eventOf("InAppRecording", 1, 0, 1'700'000'000.5)),
                             Value(eventOf("SystemRecording", 1, -5817, 1'700'000'100.0)),
                             Value(Dictionary{{"type", std::int64_t{2}},
                                              {"payload", Dictionary{{"EndReason", std::int64_t{-5806}}}}})}},
            {"damagedLines", std::uint64_t{0}},
            {"unreadableFiles", std::uint64_t{0}},
            {"lostEvents", std::uint64_t{0}}};
}

/// Moments are local time.
class Usage : public Tool {
protected:
    Usage() {
        ::setenv("TZ", "UTC-2", 1);  // two hours east
        ::tzset();
        set("TZ", "UTC-2");
    }
    ~Usage() override {
        ::unsetenv("TZ");
        ::tzset();
    }
    static UsageReport read(const Dictionary& answer) {
        const auto result = readUsage(jsonText(answer));
        const auto* report = std::get_if<UsageReport>(&result);
        EXPECT_TRUE(report) << std::get<std::string>(result);
        return report ? *report : UsageReport();
    }
};

TEST_F(Usage, EachRecordingIsALineAndTheNewestIsLast) {
    EXPECT_EQ(usageText(read(usageAnswer())),
              "ENDED                SERVICE          DURATION    PIXELS  RATE  FRAMES  SOUND  MIC     FILE  WHY\n"
              "2023-11-15 00:13:20  InAppRecording    1:02:03  1280x720    60  223380     99    0  12.3 MB  "
              "it ended without an error\n"
              "2023-11-15 00:15:00  SystemRecording   1:02:03  1280x720    60  223380     99    0  12.3 MB  "
              "the capture failed: its window or the display is gone (-5817)\n"
              "-                    -                       -         -     -       -      -    -        -  "
              "the daemon was told to end\n");
}

TEST_F(Usage, WhatIsMissingFromTheTableIsCounted) {
    EXPECT_EQ(usageText(read({{"events", Array()}})), "No recording has ended yet.\n");
    Dictionary answer = usageAnswer();
    answer.set("damagedLines", std::uint64_t{1});
    answer.set("unreadableFiles", std::uint64_t{1});
    answer.set("lostEvents", std::uint64_t{1});
    EXPECT_THAT(
        usageText(read(answer)),
        HasSubstr("\n1 line is damaged and left out.\n1 file of the daemon's notes can't be read.\n1 line was lost "
                  "since the daemon was started: its state directory could not be written.\n"));
    answer.set("events", Array{Value(3), Value(Dictionary{{"type", std::int64_t{1}}}), Value(Dictionary())});
    EXPECT_EQ(read(answer).damagedLines, 4u) << "what is no event counts too";
}

TEST_F(Usage, EventsOfOtherKindsArePassedOver) {
    const UsageReport report = read({{"events", Array{Value(eventOf("a", 7, 0, 0)), Value(eventOf("b", 1, 0, 0))}}});
    ASSERT_EQ(report.entries.size(), 1u);
    EXPECT_EQ(report.entries[0].service, "b");
    EXPECT_EQ(report.damagedLines, 0u);
}

TEST_F(Usage, EveryReasonHasWordsOfItsOwn) {
    std::set<std::string> all{endReasonText(0)};
    for (std::int64_t code = -5818; code <= -5800; ++code) {
        const std::string text = endReasonText(code);
        const std::string behind = " (" + std::to_string(code) + ")";
        ASSERT_TRUE(text.ends_with(behind)) << text;
        EXPECT_TRUE(all.insert(text.substr(0, text.size() - behind.size())).second) << text;
    }
    EXPECT_EQ(endReasonText(-5799), "an unknown reason (-5799)");
    EXPECT_EQ(endReasonText(-5819), "an unknown reason (-5819)");
    EXPECT_EQ(endReasonText(static_cast<std::int64_t>(RecordingErrorCode::InsufficientStorage)),
              "too little storage (-5805)");
    EXPECT_FALSE(all.contains("an unknown reason"));
}

TEST_F(Usage, NamesHaveNoControlCharacters) {
    EXPECT_THAT(usageText(read({{"events", Array{Value(eventOf("\x1B]0;x\x07", 1, 0, 0))}}})), HasSubstr("  ?]0;x?  "));
}

TEST_F(Usage, AnswersThatAreNoneAreNotUnderstood) {
    for (const char* answer : {"", "[]", "{}", R"({"events": 3})"})
        EXPECT_EQ(std::get<std::string>(readUsage(answer)), kNotUnderstood) << answer;
    EXPECT_EQ(std::get<std::string>(readUsage(R"({"events": [], "error": "no"})")), "no");
}

/// The tool as it is built against the command as the daemon has it.
TEST_F(Usage, TheToolShowsBothFilesOfTheStateDirectoryInTheirOrder) {
    scratch_.write("state/lumacast/telemetry.jsonl.1",
                   jsonText(eventOf("First", 1, 0, 1'700'000'000.0)) + "\n{\"type\":1,\"payl\n\n" +
                       jsonText(eventOf("Second", 1, -5806, 1'700'000'001.0)) + "\n");
    scratch_.write("state/lumacast/telemetry.jsonl", jsonText(eventOf("Third", 1, 0, 1'700'000'002.0)) + "\n");
    LinuxTelemetry telemetry(scratch_.path("state/lumacast/telemetry.jsonl"));
    const StandInDaemon daemon(runtimeDirectory(), emptySnapshot, StandInDaemon::Lane::Runs,
                               {{"usage", usageCommand(telemetry)}});
    const Outcome shown = run({"usage"});
    EXPECT_EQ(shown.status, kGood);
    EXPECT_EQ(shown.complaints, "");
    const auto first = shown.out.find("First"), second = shown.out.find("Second"), third = shown.out.find("Third");
    ASSERT_NE(third, std::string::npos) << shown.out;
    EXPECT_LT(first, second);
    EXPECT_LT(second, third);
    EXPECT_TRUE(shown.out.ends_with("\n2 lines are damaged and left out.\n")) << shown.out;

    const Outcome json = run({"usage", "--json"});
    EXPECT_EQ(json.status, kGood);
    const auto value = valueFromJson(json.out);
    ASSERT_TRUE(value) << json.out;
    EXPECT_EQ(countIn(*value->as<Dictionary>(), "damagedLines"), 2u);
    EXPECT_EQ(value->as<Dictionary>()->find("events")->as<Array>()->size(), 3u);
}

TEST_F(Usage, TheToolSaysWhyThereIsNoAnswer) {
    const Outcome none = run({"usage"});
    EXPECT_EQ(none.status, kNoAnswer);
    EXPECT_EQ(none.out, "");
    EXPECT_THAT(none.complaints, HasSubstr("the daemon isn't running"));
    const StandInDaemon daemon(runtimeDirectory(), emptySnapshot, StandInDaemon::Lane::Runs,
                               {{"usage", [](const auto&, const AdminAnswer& answer) {
                                     answer({{"error", "not\x1B now"}});
                                 }}});
    const Outcome refused = run({"usage", "--json"});
    EXPECT_EQ(refused.status, kNoAnswer);
    EXPECT_EQ(refused.out, "");
    EXPECT_THAT(refused.complaints, HasSubstr("no usage to show: not? now\n"));
}

}  // namespace
}  // namespace lumacast::ctl
