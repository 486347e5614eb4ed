// The folders that are installed: what is in them, and that the programs serve whoever launches them.

#include <gtest/gtest.h>

#include <filesystem>
#include <nlohmann/json.hpp>

#include "tests/client/WaitUntil.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/extension/SamplePayload.h"
#include "tests/extension/StandInHost.h"
#include "tests/extension/StreamJudge.h"
#include "tests/extension/TestClips.h"

namespace lumacast::test {
namespace {

std::string folderOf(const std::string& name) {
    return LC_BINARY_DIR "/extensions/" + name;
}

TEST(Installed, EachFolderHasWhatItsManifestNames) {
    for (const std::string name : {"hls-clips", "live-push"}) {
        const std::string folder = folderOf(name);
        const auto manifest = nlohmann::json::parse(ScratchDirectory::read(folder + "/manifest.json"), nullptr, false);
        ASSERT_TRUE(manifest.is_object()) << name;
        EXPECT_EQ(manifest.at("identifier"), "org.lumacast." + name);
        EXPECT_EQ(manifest.at("extensionPoint"), "com.orvane.broadcast-services-upload");
        EXPECT_FALSE(manifest.at("displayName").get<std::string>().empty());
        EXPECT_FALSE(manifest.at("displayName[de]").get<std::string>().empty());
        EXPECT_EQ(::access((folder + "/" + manifest.at("executable").get<std::string>()).c_str(), X_OK), 0);
        const std::string icon = ScratchDirectory::read(folder + "/" + manifest.at("icons").at(0).get<std::string>());
        EXPECT_TRUE(icon.starts_with("\x89PNG\r\n")) << name;
        const bool takesSamples = manifest.at("processMode") == "LCBroadcastProcessModeSampleBuffer";
        EXPECT_EQ(takesSamples, name == "live-push");
    }
}

TEST(Installed, HlsClipsMakesAStreamOfWhatItsLauncherHandsIt) {
    ScratchDirectory scratch;
    TestClips clips(scratch);
    StandInHost host(folderOf("hls-clips") + "/hls-clips");
    host.keepTokens([](std::span<const std::uint8_t> token) {
        TokenAnswer answer;
        answer.file = Fd(::open(std::string(token.begin(), token.end()).c_str(), O_RDONLY | O_CLOEXEC));
        return answer;
    });
    for (int at = 1; at <= 2; ++at) {
        host.beginClip(at, clips.nextFile({.frames = 15}), at == 2, Dictionary{{"directory", scratch.path("live")}});
        const auto answer = host.answers().next();
        ASSERT_TRUE(answer);
        EXPECT_EQ(answer->number, static_cast<std::uint16_t>(ExtensionRequestHostMessage::CompleteRequest));
    }
    expectFrames(scratch.path("live/index.m3u8"), 0, 29);
    host.hangUp();
    EXPECT_EQ(host.status(), 0);
}

TEST(Installed, LivePushConnectsAndReports) {
    StandInHost host(folderOf("live-push") + "/live-push");
    host.begin(1, std::vector<ExtensionItem>{ExtensionItem{}});
    ASSERT_NO_FATAL_FAILURE(host.connect());
    EXPECT_TRUE(host.sendAndWait(actionPayload(1)));
    const auto report = host.reports().next();
    ASSERT_TRUE(report);
    EXPECT_EQ(report->number, static_cast<std::uint16_t>(BroadcastDaemonMessage::FinishBroadcastWithError))
        << "there is no server to push to";
    host.hangUp();
    EXPECT_EQ(host.status(), 0);
}

}  // namespace
}  // namespace lumacast::test
