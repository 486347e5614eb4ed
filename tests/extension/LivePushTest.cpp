// The extension for samples as a whole, in the test's process, pushing to a media server of the test's own.

#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>

#include "tests/extension/PrivateNginx.h"
#include "tests/extension/SampleHost.h"
#include "tests/extension/StreamJudge.h"

namespace lumacast::test {
namespace {

/// The server's recordings, the oldest first.
std::vector<std::string> recordingsOf(const PrivateNginx& server) {
    std::vector<std::filesystem::directory_entry> entries;
    for (const auto& entry : std::filesystem::directory_iterator(server.recordings())) entries.push_back(entry);
    std::ranges::sort(entries, {}, [](const auto& entry) { return entry.last_write_time(); });
    std::vector<std::string> paths;
    for (const auto& entry : entries) paths.push_back(entry.path().string());
    return paths;
}

/// The sound of a recording, sample after sample: its own times are whole milliseconds, too coarse to judge a tone by.
std::string waveOf(const std::string& recording) {
    const std::string wave = recording + ".wav";
    checkers::Child convert(
        {"ffmpeg", "-nostdin", "-loglevel", "error", "-i", recording, "-vn", "-c:a", "pcm_s16le", wave}, {},
        recording + ".log");
    EXPECT_EQ(convert.wait(), 0) << ScratchDirectory::read(recording + ".log");
    return wave;
}

/// Whether nobody publishes any more: the server has closed its recording.
bool isClosed(const PrivateNginx& server, std::uint32_t lastFrame) {
    const auto paths = recordingsOf(server);
    if (paths.empty()) return false;
    checkers::MovieReader reader(paths.back());
    std::vector<checkers::NumberedPicture> pictures;
    return readFrameNumbers(reader, pictures) && !pictures.empty() && pictures.back().number == lastFrame;
}

TEST(LivePush, TheServerGetsEveryFrameInOrderAndTheSoundOfBothSources) {
    PrivateNginx server;
    SampleHost host;
    host.start({{"url", server.rtmpURL("show")}, {"viewURL", "https://example.org/watch"}});
    host.show(90);
    EXPECT_TRUE(host.finish());
    EXPECT_EQ(host.state(), "ended");
    EXPECT_EQ(host.url, "https://example.org/watch");
    EXPECT_EQ(host.count("sentFrames"), 90u);
    EXPECT_EQ(host.count("droppedFrames"), 0u);
    EXPECT_FALSE(host.error);
    ASSERT_TRUE(waitUntil([&] { return isClosed(server, 89); })) << server.log();
    const std::string recording = recordingsOf(server).at(0);
    expectFrames(recording, 0, 89);
    const auto sound = soundOf(waveOf(recording));
    const checkers::Stretch most{std::chrono::milliseconds(100), std::chrono::milliseconds(2800)};
    expectUnbrokenTone(sound, kApplicationTone, kQuietTone, most);
    expectUnbrokenTone(sound, kMicrophoneTone, kQuietTone, most);
}

TEST(LivePush, TheStreamGoesOnWhenTheServerComesBack) {
    PrivateNginx server;
    SampleHost host;
    host.start({{"url", server.rtmpURL("show")}});
    ASSERT_TRUE(host.showUntil([&] { return host.state() == "live"; }));
    host.show(30);
    server.stop();
    const std::vector<std::string> before = recordingsOf(server);
    ASSERT_EQ(before.size(), 1u);
    ASSERT_TRUE(host.showUntil([&] { return host.state() == "reconnecting"; }));
    server.start();
    ASSERT_TRUE(host.showUntil([&] { return host.state() == "live"; }));
    EXPECT_GE(host.count("reconnects"), 1u);
    host.show(30);
    EXPECT_TRUE(host.finish());
    ASSERT_TRUE(waitUntil([&] { return isClosed(server, host.number - 1); })) << server.log();
    EXPECT_EQ(picturesOf(before.front()).front().number, 0u);
    const auto recordings = recordingsOf(server);
    // The second one begins with a whole picture and has everything from there on.
    const auto pictures = picturesOf(recordings.back());
    ASSERT_GE(pictures.size(), 30u);
    expectFrames(recordings.back(), pictures.front().number.value_or(0), host.number - 1);
}

TEST(LivePush, AnSrtListenerGetsEveryFrameInOrderAndTheSound) {
    ScratchDirectory scratch;
    const int port = PrivateNginx::freePort();
    const std::string at = "srt://127.0.0.1:" + std::to_string(port), recording = scratch.path("show.ts");
    checkers::Child listener({"ffmpeg", "-nostdin", "-loglevel", "error", "-i", at + "?mode=listener&tlpktdrop=0",
                              "-map", "0", "-c", "copy", "-f", "mpegts", recording},
                             {}, scratch.path("listener.log"));
    SampleHost host;
    host.start({{"url", at + "?streamid=show"}});
    ASSERT_TRUE(host.showUntil([&] { return host.state() == "live"; }));
    host.show(90);
    EXPECT_TRUE(host.finish());
    EXPECT_EQ(host.state(), "ended");
    EXPECT_EQ(host.count("reconnects"), 0u);
    EXPECT_EQ(listener.wait(), 0) << ScratchDirectory::read(scratch.path("listener.log"));
    const auto pictures = picturesOf(recording);
    ASSERT_FALSE(pictures.empty());
    // The listener waits for what a busy machine delivers late. What was shown before it was there is left out, but for
    // the latest key frame.
    expectFrames(recording, pictures.front().number.value_or(0), host.number - 1);
    EXPECT_GE(pictures.size(), 90u);
    const auto sound = soundOf(waveOf(recording));
    const checkers::Stretch most{std::chrono::milliseconds(100), std::chrono::milliseconds(2800)};
    expectUnbrokenTone(sound, kApplicationTone, kQuietTone, most);
    expectUnbrokenTone(sound, kMicrophoneTone, kQuietTone, most);
}

TEST(LivePush, AServerThatStaysAwayEndsTheBroadcastWithAnError) {
    SampleHost host;
    const std::string nobody = "rtmp://127.0.0.1:" + std::to_string(PrivateNginx::freePort()) + "/live/show";
    host.start({{"url", nobody}, {"giveUpAfter", 1.0}});
    ASSERT_TRUE(host.showUntil([&] {
        host.info();
        return host.error.has_value();
    }));
    EXPECT_EQ(host.error->code(), 3);
    EXPECT_NE(host.error->localizedDescription(), nullptr);
    EXPECT_EQ(host.state(), "given up");
}

TEST(LivePush, ABroadcastWithoutAServerEndsWithAnError) {
    for (const char* url : {"", "file:///tmp/show.flv", "http://example.org"}) {
        SampleHost host;
        host.start({{"url", url}});
        EXPECT_TRUE(waitUntil([&] {
            host.info();
            return host.error.has_value();
        }));
        EXPECT_EQ(host.error->code(), 1) << url;
    }
}

TEST(LivePush, AServerThatHangsHoldsUpNoFrameAndTheEndNotForLong) {
    PrivateNginx server;
    SampleHost host;
    host.start({{"url", server.rtmpURL("show")}, {"bitRate", 3'000'000.0}});
    ASSERT_TRUE(host.showUntil([&] { return host.state() == "live"; }));
    server.hang();
    // The kernel takes some; what it doesn't take is left out, and each frame is processed all the same.
    EXPECT_TRUE(host.showUntil([&] { return host.state() == "reconnecting" && host.count("droppedFrames") > 0; }));
    const auto begin = std::chrono::steady_clock::now();
    EXPECT_TRUE(host.finish());
    EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::seconds(9)) << "the daemon's patience is ten";
}

}  // namespace
}  // namespace lumacast::test
