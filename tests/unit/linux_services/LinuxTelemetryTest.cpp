#include "linux/system/LinuxTelemetry.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <atomic>
#include <future>

#include "linux/system/Json.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/unit/linux_services/Until.h"

namespace lumacast {
namespace {

std::optional<Error> send(LinuxTelemetry& telemetry, std::int64_t type) {
    return telemetry.send({23, 1, 0, true, true}, {"Lumacast", "InAppRecording"}, 2, type, {{"Key", "text"}});
}

TEST(LinuxTelemetry, AnEventIsOneLineOfJsonForThisUserAlone) {
    ScratchDirectory scratch;
    LinuxTelemetry telemetry(scratch.path("state/lumacast/telemetry.jsonl"));
    EXPECT_FALSE(send(telemetry, 1));
    ASSERT_TRUE(telemetry.flush(kPatience));
    const std::string text = ScratchDirectory::read(scratch.path("state/lumacast/telemetry.jsonl"));
    EXPECT_EQ(std::count(text.begin(), text.end(), '\n'), 1);
    const auto event = valueFromJson(text);
    ASSERT_TRUE(event);
    EXPECT_EQ(*event->as<Dictionary>()->find("serviceName"), Value("InAppRecording"));
    struct stat status = {};
    ASSERT_EQ(::stat(scratch.path("state/lumacast/telemetry.jsonl").c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0600u);
}

TEST(LinuxTelemetry, AFullFileMakesRoomForANewOne) {
    ScratchDirectory scratch;
    const std::string path = scratch.path("telemetry.jsonl");
    LinuxTelemetry telemetry(path, 1000);
    for (std::int64_t type = 0; type < 30; ++type) {
        EXPECT_FALSE(send(telemetry, type));
        ASSERT_TRUE(telemetry.flush(kPatience));
        EXPECT_LE(std::filesystem::file_size(path), 1000u);
    }
    EXPECT_LE(std::filesystem::file_size(path + ".1"), 1000u);
    EXPECT_NE(ScratchDirectory::read(path).find("\"type\":29,"), std::string::npos);
    EXPECT_EQ(ScratchDirectory::read(path + ".1").find("\"type\":0,"), std::string::npos) << "the oldest are gone";
    EXPECT_FALSE(std::filesystem::exists(path + ".2"));
    EXPECT_EQ(telemetry.lostEvents(), 0u);
}

TEST(LinuxTelemetry, AnEventLargerThanTheFileIsRefused) {
    ScratchDirectory scratch;
    LinuxTelemetry telemetry(scratch.path("telemetry.jsonl"), 100);
    EXPECT_EQ(send(telemetry, 1)->code(), EMSGSIZE);
}

TEST(LinuxTelemetry, WhatTheDiskRefusesIsCountedAndNotFollowedThroughALink) {
    ScratchDirectory scratch;
    scratch.write("victim", "");
    std::filesystem::create_symlink(scratch.path("victim"), scratch.path("telemetry.jsonl"));
    LinuxTelemetry telemetry(scratch.path("telemetry.jsonl"));
    EXPECT_FALSE(send(telemetry, 1));
    ASSERT_TRUE(telemetry.flush(kPatience));
    EXPECT_EQ(telemetry.lostEvents(), 1u);
    EXPECT_EQ(ScratchDirectory::read(scratch.path("victim")), "");
}

TEST(LinuxTelemetry, ADiskThatHangsCostsEventsAndNotTheCaller) {
    ScratchDirectory scratch;
    const auto gate = std::make_shared<Gate>();
    gate->shut();
    LinuxTelemetry telemetry(scratch.path("telemetry.jsonl"), LinuxTelemetry::kDefaultLimit, [gate] { gate->pass(); });
    for (int i = 0; i < 64; ++i) EXPECT_FALSE(send(telemetry, i)) << i;
    for (int i = 0; i < 3; ++i) {
        const auto error = send(telemetry, 100 + i);
        ASSERT_TRUE(error);
        EXPECT_EQ(error->code(), ENOBUFS);
    }
    EXPECT_FALSE(telemetry.flush(std::chrono::milliseconds(1)));
    gate->open();
    ASSERT_TRUE(telemetry.flush(kPatience));
    const std::string text = ScratchDirectory::read(scratch.path("telemetry.jsonl"));
    EXPECT_EQ(std::count(text.begin(), text.end(), '\n'), 64);
}

TEST(LinuxTelemetry, ItsEndWaitsForWhatWasHandedOver) {
    ScratchDirectory scratch;
    {
        LinuxTelemetry telemetry(scratch.path("telemetry.jsonl"));
        for (int i = 0; i < 20; ++i) EXPECT_FALSE(send(telemetry, i));
    }
    const std::string text = ScratchDirectory::read(scratch.path("telemetry.jsonl"));
    EXPECT_EQ(std::count(text.begin(), text.end(), '\n'), 20);
}

/// What the files tell, waited for.
TelemetryHistory historyOf(LinuxTelemetry& telemetry) {
    auto told = std::make_shared<std::promise<TelemetryHistory>>();
    auto history = told->get_future();
    EXPECT_TRUE(telemetry.readHistory([told](TelemetryHistory result) { told->set_value(std::move(result)); }));
    return history.wait_for(kPatience) == std::future_status::ready ? history.get() : TelemetryHistory{};
}

std::int64_t typeOf(const Value& event) { return *event.as<Dictionary>()->find("type")->as<std::int64_t>(); }

TEST(LinuxTelemetry, TellsItsHistoryAcrossTheRotation) {
    ScratchDirectory scratch;
    LinuxTelemetry telemetry(scratch.path("telemetry.jsonl"), 1000);
    EXPECT_TRUE(historyOf(telemetry).events.empty()) << "there are no files yet";
    for (std::int64_t type = 0; type < 30; ++type) EXPECT_FALSE(send(telemetry, type));
    const TelemetryHistory history = historyOf(telemetry);  // without a flush: it comes behind what was sent
    ASSERT_GT(history.events.size(), 3u);
    for (std::size_t i = 0; i < history.events.size(); ++i)
        EXPECT_EQ(typeOf(history.events[i]), 30 - static_cast<std::int64_t>(history.events.size() - i));
    EXPECT_EQ(history.damagedLines, 0u) << "each file has whole lines";
    EXPECT_EQ(history.unreadableFiles, 0u);
}

TEST(LinuxTelemetry, SkipsAndCountsDamagedLines) {
    ScratchDirectory scratch;
    const std::string deep(20, '[');
    scratch.write("telemetry.jsonl.1", "{\"type\":1}\nnonsense\n{\"type\":2}\n");
    scratch.write("telemetry.jsonl", "[]\n{\"type\":3}\n{\"a\":" + deep + std::string(20, ']') + "}\n{\"type\":4");
    LinuxTelemetry telemetry(scratch.path("telemetry.jsonl"));
    const TelemetryHistory history = historyOf(telemetry);
    ASSERT_EQ(history.events.size(), 3u);
    for (std::size_t i = 0; i < 3; ++i) EXPECT_EQ(typeOf(history.events[i]), static_cast<std::int64_t>(i) + 1);
    EXPECT_EQ(history.damagedLines, 4u);
}

TEST(LinuxTelemetry, ALineThatWasCutOffDoesNotSpoilTheNext) {
    ScratchDirectory scratch;
    scratch.write("telemetry.jsonl", "{\"type\":3}\n{\"type\":4");
    LinuxTelemetry telemetry(scratch.path("telemetry.jsonl"));
    EXPECT_FALSE(send(telemetry, 5));
    const TelemetryHistory history = historyOf(telemetry);
    ASSERT_EQ(history.events.size(), 2u);
    EXPECT_EQ(typeOf(history.events[1]), 5);
    EXPECT_EQ(history.damagedLines, 1u);
    EXPECT_EQ(telemetry.lostEvents(), 0u);
}

TEST(LinuxTelemetry, AStateDirectoryThatCantBeWrittenLosesOnlyTheLine) {
    ScratchDirectory scratch;
    scratch.write("state", "a file where the directory should be");
    LinuxTelemetry telemetry(scratch.path("state/lumacast/telemetry.jsonl"));
    EXPECT_FALSE(send(telemetry, 1)) << "it is handed over, and refused by the disk";
    EXPECT_EQ(historyOf(telemetry).lostEvents, 1u);
    std::filesystem::remove(scratch.path("state"));
    EXPECT_FALSE(send(telemetry, 2));
    const TelemetryHistory history = historyOf(telemetry);
    ASSERT_EQ(history.events.size(), 1u);
    EXPECT_EQ(typeOf(history.events[0]), 2);
}

TEST(LinuxTelemetry, AFileThatIsNoneIsCountedAndNotWaitedFor) {
    ScratchDirectory scratch;
    ASSERT_EQ(::mkfifo(scratch.path("telemetry.jsonl").c_str(), 0600), 0);
    scratch.makeDirectory("telemetry.jsonl.1");
    LinuxTelemetry telemetry(scratch.path("telemetry.jsonl"));
    EXPECT_FALSE(send(telemetry, 1));
    const TelemetryHistory history = historyOf(telemetry);
    EXPECT_EQ(history.unreadableFiles, 2u);
    EXPECT_EQ(history.lostEvents, 1u);
}

TEST(LinuxTelemetry, ADiskThatHangsIsAskedForHistoryOnlyAFewTimes) {
    ScratchDirectory scratch;
    const auto gate = std::make_shared<Gate>();
    const auto told = std::make_shared<std::atomic<int>>(0);
    gate->shut();
    LinuxTelemetry telemetry(scratch.path("telemetry.jsonl"), LinuxTelemetry::kDefaultLimit, [gate] { gate->pass(); });
    const auto ask = [&] { return telemetry.readHistory([told](TelemetryHistory) { ++*told; }); };
    for (int i = 0; i < 8; ++i) EXPECT_TRUE(ask()) << i;
    EXPECT_FALSE(ask());
    EXPECT_FALSE(send(telemetry, 1)) << "events have places of their own";
    gate->open();
    EXPECT_TRUE(until([&] { return *told == 8; }));
    EXPECT_EQ(historyOf(telemetry).events.size(), 1u);
}

}  // namespace
}  // namespace lumacast
