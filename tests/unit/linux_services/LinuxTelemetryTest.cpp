#include "linux/system/LinuxTelemetry.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>

#include "linux/system/Json.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/unit/linux_services/Until.h"

namespace lumacast {
namespace {

constexpr std::chrono::seconds kPatience{30};

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

}  // namespace
}  // namespace lumacast
