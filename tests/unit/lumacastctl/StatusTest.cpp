#include "client/lumacastctl/status/Status.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tests/unit/lumacastctl/Snapshots.h"

namespace lumacast::ctl {
namespace {

using ::testing::HasSubstr;

DaemonStatus read(const Dictionary& snapshot) {
    const auto result = readStatus(jsonText(snapshot));
    const auto* status = std::get_if<DaemonStatus>(&result);
    EXPECT_TRUE(status) << std::get<std::string>(result);
    return status ? *status : DaemonStatus();
}

TEST(Status, OfARecordingIsWrittenForPeople) {
    EXPECT_EQ(statusText(read(snapshotOfARecording())),
              "org.example.Player (pid 4711): recording\n"
              "  elapsed  1:02.5\n"
              "  picture  1280 x 720 pixels\n"
              "  frames   1874 (1880 captured, 6 dropped)\n"
              "  size     12.3 MB\n"
              "  file     /root/private/var/mobile/Library/Lumacast//Player.mp4\n"
              "\n"
              "Applications\n"
              "  org.example.Player  pid 4711    recording\n"
              "  org.example.Tea     pid 12      idle\n"
              "  org.example.Gone    no process  not connected\n"
              "\n"
              "Free space: 81.6 GB in /root/private/var/mobile/Library/Lumacast/\n");
}

TEST(Status, OfABroadcastNamesItsExtensionAndTheFramesThatItWasTooSlowFor) {
    DaemonStatus status = read(snapshotOfARecording());
    status.sessions.at(0).recording->extension = "org.example.Live";
    EXPECT_THAT(statusText(status), HasSubstr("dropped)\n  to       org.example.Live\n  size"));
    status.sessions.at(0).recording->leftOut = 0;
    EXPECT_THAT(statusText(status), HasSubstr("dropped)\n  to       org.example.Live\n  size"));
    status.sessions.at(0).recording->leftOut = 12;
    EXPECT_THAT(statusText(status), HasSubstr("  to       org.example.Live\n"
                                              "           12 frames left out: it was too slow for them\n"));
}

TEST(Status, OfAPausedRecordingSaysSoTwice) {
    DaemonStatus status = read(snapshotOfARecording());
    status.sessions.at(0).recording->paused = true;
    const std::string text = statusText(status);
    EXPECT_NE(text.find("org.example.Player (pid 4711): paused\n"), std::string::npos) << text;
    EXPECT_NE(text.find("  org.example.Player  pid 4711    paused\n"), std::string::npos) << text;
}

TEST(Status, OfAnIdleDaemonIsShort) {
    EXPECT_EQ(statusText(read(emptySnapshot())),
              "Nothing is being recorded.\n"
              "\n"
              "No application is connected.\n"
              "\n"
              "Free space: unknown, or none in /root/private/var/mobile/Library/Lumacast/\n");
}

TEST(Status, LeavesOutWhatTheDaemonDoesNotSay) {
    Dictionary session{{"bundleID", "org.example.Player"}, {"connected", true}, {"recording", true}};
    EXPECT_EQ(statusText(read({{"sessions", Array{Value(session)}}})),
              "org.example.Player (no process): recording\n"
              "  elapsed  0:00.0\n"
              "  frames   unknown\n"
              "\n"
              "Applications\n"
              "  org.example.Player  no process  recording\n"
              "\n"
              "Free space: unknown, or none\n");
}

TEST(Status, ShowsNoControlCharactersOfNamesAndPaths) {
    Dictionary current{{"path", "/tmp/\x1B]0;x\x07.mp4"}};
    Dictionary session{{"bundleID", "org.\x1B[2J"}, {"connected", true}, {"recording", true}, {"current", current}};
    const std::string text = statusText(read({{"temporaryDirectory", "/\x1B"}, {"sessions", Array{Value(session)}}}));
    EXPECT_EQ(text.find('\x1B'), std::string::npos);
    EXPECT_NE(text.find("org.?[2J"), std::string::npos);
}

TEST(Status, TakesFractionsOfPixelsAndSeconds) {
    Dictionary snapshot = emptySnapshot();
    const Dictionary current{{"elapsedSeconds", 2.25}, {"width", 640.0}, {"height", 479.6}};
    snapshot.set("sessions", Array{Value(Dictionary{{"bundleID", "a"}, {"recording", true}, {"current", current}})});
    const std::string text = statusText(read(snapshot));
    EXPECT_NE(text.find("elapsed  0:02.2\n"), std::string::npos) << text;
    EXPECT_NE(text.find("640 x 480 pixels"), std::string::npos) << text;
}

TEST(Status, OfADaemonThatHasNoneIsItsOwnError) {
    const auto result = readStatus(R"({"error":"the daemon is busy"})");
    ASSERT_TRUE(std::holds_alternative<std::string>(result));
    EXPECT_EQ(std::get<std::string>(result), "the daemon is busy");
}

TEST(Status, ThatCannotBeUnderstoodIsNone) {
    for (const char* answer : {"", "nonsense", "[]", "{}", R"({"sessions":3})", R"({"sessions":[3]})",
                               R"({"sessions":[{}]})", R"({"sessions":[{"bundleID":"a"})"}) {
        const auto result = readStatus(answer);
        ASSERT_TRUE(std::holds_alternative<std::string>(result)) << answer;
        EXPECT_NE(std::get<std::string>(result).find("can't be understood"), std::string::npos) << answer;
    }
}

}  // namespace
}  // namespace lumacast::ctl
