// A live broadcast from the window to a browser: the daemon, hls-clips in its sandbox, a web server, the page.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdio>
#include <filesystem>
#include <nlohmann/json.hpp>

#include "tests/checkers/LibAv.h"
#include "tests/checkers/ToneChecker.h"
#include "tests/extension/PrivateBrowser.h"
#include "tests/extension/PrivateNginx.h"
#include "tests/sound/PrivateSoundServer.h"
#include "tests/system/World.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;
using ::testing::StartsWith;

// The judge listens for 500 Hz among others.
#ifdef LC_SANITIZED
const std::vector<std::string> kWatched{"--size", "320x180", "--fps", "10", "--tone", "500"};
#else
const std::vector<std::string> kWatched{"--size", "640x360", "--fps", "30", "--tone", "500"};
#endif

nlohmann::json told(const PrivateNginx& server, const std::string& name, const PrivateBrowser& browser) {
    nlohmann::json said;
    EXPECT_TRUE(waitUntil([&] {
        said = nlohmann::json::parse(ScratchDirectory::read(server.files() + "/" + name), nullptr, false);
        return said.is_object() || fs::exists(server.files() + "/error.json");
    })) << browser.log();
    EXPECT_TRUE(said.is_object()) << ScratchDirectory::read(server.files() + "/error.json");
    return said.is_object() ? said : nlohmann::json();
}

/// The longest stretch without the tone, to 10 ms.
double longestSilence(const checkers::Sound& sound, double tone) {
    const std::size_t length = static_cast<std::size_t>(sound.rate) / 100;
    std::size_t longest = 0, now = 0;
    for (std::size_t at = 0; at + length <= sound.samples.size(); at += length) {
        now = checkers::toneLevel(std::span(sound.samples).subspan(at, length), sound.rate, tone) > -40 ? 0 : now + 1;
        longest = std::max(longest, now);
    }
    return static_cast<double>(longest) / 100;
}

TEST(HlsBroadcast, ABrowserPlaysItWhileItIsLive) {
    PrivateNginx server;
    PrivateSoundServer sounds;
    World world;
    world.addVariable("PULSE_SERVER=" + sounds.address());
    world.installExtensionFolder(LC_EXTENSIONS "/hls-clips");
    world.startDaemon();
    const auto app = world.application(kWatched);
    const std::string answer =
        app->ask("broadcast org.lumacast.SelfRecorder org.lumacast.hls-clips clipDuration=2,url=" + server.url());
    ASSERT_THAT(answer, StartsWith("started frame")) << world.daemonLog();
    // The page comes with the first clip.
    ASSERT_TRUE(waitUntil([&] { return fs::exists(server.files() + "/watch.html"); })) << world.daemonLog();
    fs::copy_file(LC_SOURCE_DIR "/tests/extension/watch_judge.html", server.files() + "/judge.html");
    const PrivateBrowser browser(server.url() + "judge.html");
    const auto live = told(server, "live.json", browser);
    ASSERT_FALSE(live.is_null());
    const double played = live["to"].get<double>() - live["from"].get<double>(), passed = live["seconds"];
    std::printf("%.2f s played in %.2f s; the tone at %.1f and %.1f dB\n", played, passed,
                live["heard"][0][0].get<double>(), live["heard"][1][0].get<double>());
    EXPECT_EQ(live["state"], "Live");
    EXPECT_GT(played, passed * 0.3) << "a busy machine stalls now and then";
    EXPECT_GT(live["window"][1].get<double>() - live["window"][0].get<double>(), 4);
    for (const auto& channel : live["heard"]) {
        EXPECT_GT(channel[0], -30);
        EXPECT_LT(channel[1], -45);
    }
    EXPECT_EQ(live["sought"].size(), 4u);

    EXPECT_THAT(app->ask("stop"), HasSubstr("without movie")) << world.daemonLog();
    const auto ended = told(server, "ended.json", browser);
    ASSERT_FALSE(ended.is_null());
    EXPECT_NEAR(ended["time"], ended["duration"], 0.3);

    av_log_set_level(AV_LOG_ERROR);  // it tells each file of a playlist
    const std::string playlist = server.files() + "/index.m3u8";
    std::uint32_t last = 0, missing = 0;
    for (const auto& picture : picturesOf(playlist)) {
        if (!picture.number) continue;
        EXPECT_GE(*picture.number, last);
        if (last && *picture.number > last + 1) missing += *picture.number - last - 1;
        last = *picture.number;
    }
    checkers::MovieReader reader(playlist);
    const auto sound = reader.readSound();
    ASSERT_TRUE(sound) << reader.error();
    std::printf("of %u frames %u are missing; the tone was away for %.2f s at most\n", last, missing,
                longestSilence(*sound, 500));
    EXPECT_LT(missing, last * 2 / 3) << "most is lost";
}

}  // namespace
}  // namespace lumacast::test
