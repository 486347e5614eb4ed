// The extension for clips as a whole, in the test's process: requests in, a stream out.

#include <gtest/gtest.h>

#include <filesystem>

#include "broadcast/ConfigurationArchive.h"
#include "linux/ipc/LinuxKeyedArchive.h"
#include "tests/extension/ClipHost.h"
#include "tests/extension/PrivateNginx.h"
#include "tests/extension/StreamJudge.h"

namespace lumacast::test {
namespace {

std::string textOf(const std::string& path) {
    return ScratchDirectory::read(path);
}

std::size_t filesIn(const std::string& folder) {
    std::size_t count = 0;
    for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator(folder)) ++count;
    return count;
}

TEST(HlsClips, AFoldersPlaylistPlaysTheWholeBroadcast) {
    ClipHost host;
    const Dictionary info{{"directory", host.scratch.path("live")}};
    const Dictionary first = ClipHost::infoOf(host.broadcast(info));
    EXPECT_EQ(*first.find("state"), Value("live"));
    EXPECT_EQ(*first.find("viewURL"), Value("file://" + host.scratch.path("live/index.m3u8")));
    host.broadcast(info);
    const std::string playlist = host.scratch.path("live/index.m3u8");
    EXPECT_TRUE(waitUntil([&] { return textOf(playlist).find("-2.m4s") != std::string::npos; }));
    EXPECT_EQ(textOf(playlist).find("#EXT-X-ENDLIST"), std::string::npos);
    const Dictionary last = ClipHost::infoOf(host.broadcast(info, true));
    EXPECT_EQ(*last.find("state"), Value("ended"));
    EXPECT_EQ(*last.find("segments"), Value(std::uint64_t{3}));
    EXPECT_EQ(*last.find("lostSegments"), Value(std::uint64_t{0}));
    EXPECT_TRUE(textOf(playlist).ends_with("#EXT-X-ENDLIST\n"));
    EXPECT_EQ(filesIn(host.scratch.path("live")), 6u)
        << "three segments, a header, a playlist, a page, and no temporary file";
    expectFrames(playlist, 0, host.clips.frames() - 1);
    const auto sound = soundOf(playlist);
    expectUnbrokenTone(sound, kApplicationTone, kQuietTone,
                       {std::chrono::milliseconds(50), std::chrono::milliseconds(4400)});
}

TEST(HlsClips, WhatTheApplicationAskedForIsReturnedWithTheFirstClipOnly) {
    ClipHost host;
    const Dictionary compression{{"AverageBitRate", std::int64_t{700'000}}};
    const Dictionary info{{"directory", host.scratch.path("live")},
                          {"clipDuration", 2.0},
                          {"compression", compression},
                          {"viewURL", "https://example.org/watch"}};
    const auto first = host.broadcast(info);
    ASSERT_TRUE(first);
    EXPECT_EQ(*ClipHost::infoOf(first).find("viewURL"), Value("https://example.org/watch"));
    const Value* archive = first->find(kItemBroadcastConfiguration);
    ASSERT_TRUE(archive && archive->as<Data>());
    LinuxKeyedArchive archives;
    const auto configuration = configurationIn(archives, *archive->as<Data>());
    ASSERT_TRUE(configuration);
    EXPECT_EQ(configuration->clipDuration, 2.0);
    EXPECT_EQ(configuration->videoCompressionProperties, compression);
    EXPECT_EQ(host.broadcast(info), Dictionary());
}

TEST(HlsClips, OldSegmentsGoSoMuchLaterThatSlowPlayersStillFindThem) {
    ClipHost host;
    const Dictionary info{{"directory", host.scratch.path("live")}, {"keep", std::int64_t{2}}};
    for (int at = 0; at < 6; ++at) host.broadcast(info, at == 5, {.frames = 15});
    const std::string text = textOf(host.scratch.path("live/index.m3u8"));
    EXPECT_NE(text.find("#EXT-X-MEDIA-SEQUENCE:4\n"), std::string::npos) << text;
    EXPECT_EQ(text.find("-4.m4s"), std::string::npos);
    EXPECT_NE(text.find("-5.m4s"), std::string::npos);
    // Two in the list, two that have left it, the header, the list and the page.
    EXPECT_EQ(filesIn(host.scratch.path("live")), 7u);
}

/// The variable for as long as it lives; without a value it is not there.
class Home final {
public:
    explicit Home(const char* value) {
        const char* before = std::getenv("HOME");
        if (before) before_ = before;
        set(value);
    }
    Home(const Home&) = delete;
    Home& operator=(const Home&) = delete;
    ~Home() { set(before_ ? before_->c_str() : nullptr); }

private:
    static void set(const char* value) { value ? ::setenv("HOME", value, 1) : ::unsetenv("HOME"); }
    std::optional<std::string> before_;
};

TEST(HlsClips, ARelativeFolderIsTheExtensionsOwn) {
    ScratchDirectory home;
    Home own(home.path().c_str());
    ClipHost host;
    EXPECT_TRUE(host.broadcast({}, true, {.frames = 15}));
    expectFrames(home.path("live/index.m3u8"), 0, 14);
    EXPECT_TRUE(host.broadcast({{"directory", "a/b"}}, true, {.frames = 15}));
    expectFrames(home.path("a/b/index.m3u8"), 15, 29);
}

TEST(HlsClips, ABroadcastWithoutADestinationIsGivenUpClipByClip) {
    Home none(nullptr);
    ClipHost host;
    EXPECT_FALSE(host.broadcast({}));
    EXPECT_FALSE(host.broadcast({{"directory", std::int64_t{5}}}));
    // The process serves on.
    EXPECT_TRUE(host.broadcast({{"directory", host.scratch.path("live")}}, true));
}

TEST(HlsClips, TheNextBroadcastOfTheSameProcessIsAnotherStream) {
    ClipHost host;
    const Dictionary one{{"directory", host.scratch.path("one")}}, two{{"directory", host.scratch.path("two")}};
    EXPECT_TRUE(host.broadcast(one, true, {.frames = 15}));
    EXPECT_TRUE(host.broadcast(two, true, {.frames = 15}));
    expectFrames(host.scratch.path("one/index.m3u8"), 0, 14);
    expectFrames(host.scratch.path("two/index.m3u8"), 15, 29);
}

TEST(HlsClips, AClipThatIsNoMovieIsGivenUpAndTheStreamGoesOnWithADiscontinuity) {
    ClipHost host;
    const Dictionary info{{"directory", host.scratch.path("live")}};
    EXPECT_TRUE(host.broadcast(info));
    EXPECT_FALSE(host.handOver(host.scratch.write("text", "no movie"), info));
    EXPECT_FALSE(host.handOver(host.scratch.path("missing"), info));
    EXPECT_TRUE(host.broadcast(info, true));
    const std::string text = textOf(host.scratch.path("live/index.m3u8"));
    EXPECT_NE(text.find("#EXT-X-DISCONTINUITY\n"), std::string::npos) << text;
    expectFrames(host.scratch.path("live/index.m3u8"), 0, 89);
}

TEST(HlsClips, WhenTheDaemonGoesThePlaylistEnds) {
    ClipHost host;
    EXPECT_TRUE(host.broadcast({{"directory", host.scratch.path("live")}}));
    host.host.hangUp();
    EXPECT_EQ(host.host.status(), 0);
    EXPECT_TRUE(textOf(host.scratch.path("live/index.m3u8")).ends_with("#EXT-X-ENDLIST\n"));
}

TEST(HlsClips, AWebServerGetsTheStreamByPut) {
    PrivateNginx server;
    ClipHost host;
    const Dictionary info{{"url", server.url()}, {"keep", "2"}};
    for (int at = 0; at < 6; ++at) {
        const Dictionary told = ClipHost::infoOf(host.broadcast(info, at == 5, {.frames = 15}));
        if (at == 0) {
            EXPECT_EQ(*told.find("viewURL"), Value(server.url() + "index.m3u8"));
        }
        if (at == 5) {
            EXPECT_EQ(*told.find("segments"), Value(std::uint64_t{6})) << server.log();
        }
    }
    EXPECT_EQ(filesIn(server.files()), 7u) << "old ones are deleted";
    // Watched where it is.
    expectFrames(server.url() + "index.m3u8", 60, 89);
}

TEST(HlsClips, AServerThatIsAwayForAWhileCostsSegmentsAndHoldsUpNobody) {
    PrivateNginx server;
    ClipHost host(std::chrono::seconds(20));
    const Dictionary info{{"url", server.url()}};
    EXPECT_TRUE(host.broadcast(info, false, {.frames = 15}));
    EXPECT_TRUE(waitUntil([&] { return textOf(server.files() + "/index.m3u8").find("-1.m4s") != std::string::npos; }));
    server.stop();
    // Refused three times; the daemon has its answers meanwhile, and the application hears of it.
    std::string state;
    EXPECT_TRUE(waitUntil([&] {
        const auto returned = host.broadcast(info, false, {.frames = 15});
        EXPECT_TRUE(returned);
        if (const Value* told = ClipHost::infoOf(returned).find("state")) state = *told->as<std::string>();
        return state == "stalled" || !returned;
    }));
    server.start();
    EXPECT_TRUE(waitUntil([&] {
        const auto returned = host.broadcast(info, false, {.frames = 15});
        if (const Value* told = ClipHost::infoOf(returned).find("state")) state = *told->as<std::string>();
        return state == "live" || !returned;
    }));
    const Dictionary last = ClipHost::infoOf(host.broadcast(info, true, {.frames = 15}));
    EXPECT_EQ(*last.find("state"), Value("ended"));
    EXPECT_GE(*last.find("lostSegments")->as<std::uint64_t>(), 1u);
    const std::string text = textOf(server.files() + "/index.m3u8");
    EXPECT_NE(text.find("#EXT-X-DISCONTINUITY\n"), std::string::npos) << text;
    EXPECT_TRUE(text.ends_with("#EXT-X-ENDLIST\n"));
    const auto pictures = picturesOf(server.url() + "index.m3u8");
    ASSERT_FALSE(pictures.empty());
    EXPECT_EQ(pictures.front().number, 0u);
    EXPECT_EQ(pictures.back().number, host.clips.frames() - 1);
}

TEST(HlsClips, ADeadServerIsWaitedForAtTheEndNoLongerThanThat) {
    ClipHost host(std::chrono::milliseconds(300));
    const std::string nobody = "http://127.0.0.1:" + std::to_string(PrivateNginx::freePort()) + "/";
    const auto begin = std::chrono::steady_clock::now();
    EXPECT_TRUE(host.broadcast({{"url", nobody}}, true, {.frames = 15}));
    EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::seconds(15));
}

}  // namespace
}  // namespace lumacast::test
