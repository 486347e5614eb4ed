// The extension for samples as a whole, in the test's process, pushing to a media server of the test's own.

#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <numbers>

#include "examples/scene/Scene.h"
#include "extensions/live-push/LivePush.h"
#include "tests/extension/PrivateNginx.h"
#include "tests/extension/SamplePayload.h"
#include "tests/extension/StandInHost.h"
#include "tests/extension/StreamJudge.h"

namespace lumacast::test {
namespace {

constexpr int kRate = 30;
constexpr double kApplicationTone = 440, kMicrophoneTone = 1000, kQuietTone = 3100;

/// Shows frame after frame of the scene, with sound, as the daemon sends them.
class SampleHost final {
public:
    static constexpr int kWidth = 640, kHeight = 360;

    SampleHost() {
        host.begin(1, std::vector<ExtensionItem>{ExtensionItem{}});
        host.connect();
    }
    void start(const Dictionary& userInfo) { EXPECT_TRUE(host.sendAndWait(actionPayload(1, userInfo))); }
    bool finish() { return host.sendAndWait(actionPayload(4)); }

    /// The next frames with their sound, each sent when the one before was processed.
    void show(int frames) {
        for (int at = 0; at < frames; ++at) {
            const double time = 10 + static_cast<double>(number) / kRate;
            EXPECT_TRUE(host.sendAndWait(videoPayload(plane(), time)));
            sendSound(time);
            ++number;
        }
    }
    /// Takes the reports that have come; the last service info.
    Dictionary info() {
        while (!host.reports().isEmpty()) {
            const auto report = host.reports().next();
            const Value& said = report->arguments[0];
            if (report->number == static_cast<std::uint16_t>(BroadcastDaemonMessage::UpdateServiceInfo)) {
                lastInfo = *said.as<Dictionary>();
                states.push_back(*lastInfo.find("state")->as<std::string>());
            } else if (report->number == static_cast<std::uint16_t>(BroadcastDaemonMessage::UpdateBroadcastURL)) {
                url = said.as<URL>()->text();
            } else if (report->number == static_cast<std::uint16_t>(BroadcastDaemonMessage::FinishBroadcastWithError)) {
                error = *said.asError();
            }
        }
        return lastInfo;
    }
    std::string state() {
        const Dictionary now = info();
        const Value* said = now.find("state");
        return said ? *said->as<std::string>() : std::string();
    }
    std::uint64_t count(std::string_view key) {
        const Dictionary now = info();
        const Value* said = now.find(key);
        return said ? *said->as<std::uint64_t>() : 0;
    }
    /// Shows frames until it holds.
    bool showUntil(const std::function<bool()>& condition) {
        return waitUntil([&] {
            show(1);
            return condition();
        });
    }

    std::shared_ptr<testing::PaintedPlane> plane() {
        auto plane = std::make_shared<testing::PaintedPlane>(kWidth, kHeight, number);
        auto* const pixels = const_cast<std::uint8_t*>(plane->pixels().data());
        scene.draw({pixels, kWidth, kHeight, plane->stride()}, number, {12, 34, 56, 789});
        return plane;
    }
    void sendSound(double time) {
        const AudioFormat tap = testing::tapFormat();
        Data bytes;
        for (int at = 0; at < 44'100 / kRate; ++at) {
            const double seconds = static_cast<double>(number) / kRate + at / 44'100.0;
            const auto sample =
                static_cast<std::int16_t>(8000 * std::sin(2 * std::numbers::pi * kApplicationTone * seconds));
            bytes.push_back(static_cast<std::uint8_t>(static_cast<std::uint16_t>(sample) >> 8));
            bytes.push_back(static_cast<std::uint8_t>(sample));
        }
        host.send(soundPayload(2, std::move(bytes), 44'100 / kRate, time, tap));
        AudioFormat microphone = tap;
        microphone.sampleRate = 48'000;
        microphone.formatFlags = AudioFormat::kFlagFloat | AudioFormat::kFlagPacked;
        microphone.bitsPerChannel = 32;
        microphone.bytesPerFrame = microphone.bytesPerPacket = 4;
        Data floats;
        for (int at = 0; at < 48'000 / kRate; ++at) {
            const double seconds = static_cast<double>(number) / kRate + at / 48'000.0;
            const Data sample =
                bytesOf(static_cast<float>(0.25 * std::sin(2 * std::numbers::pi * kMicrophoneTone * seconds)));
            floats.insert(floats.end(), sample.begin(), sample.end());
        }
        EXPECT_TRUE(host.sendAndWait(soundPayload(3, std::move(floats), 48'000 / kRate, time, microphone)));
    }

    extensions::LivePush extension{{std::chrono::milliseconds(50), std::chrono::milliseconds(200),
                                    std::chrono::milliseconds(200), std::chrono::milliseconds(1000)}};
    StandInHost host{extension};
    scene::Scene scene{kWidth, kHeight, scene::Motion::Everywhere};
    std::uint32_t number = 0;
    Dictionary lastInfo;
    std::vector<std::string> states;
    std::string url;
    std::optional<Error> error;
};

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
