// The page that plays a stream, in a real browser: what is seen of known colours, heard of known tones, and sought.

#include <gtest/gtest.h>

#include <array>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <nlohmann/json.hpp>
#include <sstream>

#include "tests/extension/ClipHost.h"
#include "tests/extension/PrivateBrowser.h"
#include "tests/extension/PrivateNginx.h"

namespace lumacast::test {
namespace {

constexpr int kWidth = 560, kHeight = 320, kClipSeconds = 2;
using Colour = std::array<int, 3>;
constexpr std::array<Colour, 7> kBars{
    {{191, 191, 191}, {191, 191, 0}, {0, 191, 191}, {0, 191, 0}, {191, 0, 191}, {191, 0, 0}, {0, 0, 191}}};
/// How far a colour may be from what was drawn, of 255: the browser's conversion and the encoder's. A picture taken for
/// one of BT.709 is off by more.
constexpr double kTolerance = 8;
/// The strip below the bars is brighter in each clip.
int stripOf(int clip) {
    return 40 + 30 * clip;
}

/// A clip of colour bars with a tone on the left (500 Hz) and another on the right (900 Hz).
std::string makeBars(const ScratchDirectory& folder, int clip) {
    std::string picture = "P6 " + std::to_string(kWidth) + " " + std::to_string(kHeight) + " 255\n";
    for (int y = 0; y < kHeight; ++y)
        for (int x = 0; x < kWidth; ++x)
            for (std::size_t part = 0; part < 3; ++part)
                picture += static_cast<char>(y < kHeight * 4 / 5 ? kBars[static_cast<std::size_t>(x * 7 / kWidth)][part]
                                                                 : stripOf(clip));
    const std::string path = folder.path("bars-" + std::to_string(clip) + ".mp4");
    const std::string length = std::to_string(kClipSeconds);
    checkers::Child make({"ffmpeg",
                          "-nostdin",
                          "-loglevel",
                          "error",
                          "-loop",
                          "1",
                          "-framerate",
                          "30",
                          "-i",
                          folder.write("bars.ppm", picture),
                          "-f",
                          "lavfi",
                          "-i",
                          "aevalsrc=0.25*sin(2*PI*500*t)|0.25*sin(2*PI*900*t):s=44100:d=" + length,
                          "-t",
                          length,
                          "-vf",
                          "scale=out_color_matrix=bt601:out_range=tv:flags=accurate_rnd,format=yuv420p",
                          "-colorspace",
                          "smpte170m",
                          "-color_trc",
                          "smpte170m",
                          "-color_primaries",
                          "smpte170m",
                          "-color_range",
                          "tv",
                          "-c:v",
                          "libx264",
                          "-preset",
                          "ultrafast",
                          "-bf",
                          "0",
                          "-g",
                          "30",
                          "-crf",
                          "18",
                          "-c:a",
                          "aac",
                          "-b:a",
                          "160k",
                          path},
                         {}, path + ".log");
    EXPECT_EQ(make.wait(), 0) << ScratchDirectory::read(path + ".log");
    return path;
}

/// What the watcher put on the server under that name.
nlohmann::json told(const PrivateNginx& server, const std::string& name, const PrivateBrowser& browser) {
    nlohmann::json said;
    const auto isThere = [&] {
        said = nlohmann::json::parse(ScratchDirectory::read(server.files() + "/" + name), nullptr, false);
        return said.is_object() || std::filesystem::exists(server.files() + "/error.json");
    };
    EXPECT_TRUE(waitUntil(isThere)) << browser.log();
    EXPECT_TRUE(said.is_object()) << ScratchDirectory::read(server.files() + "/error.json");
    return said.is_object() ? said : nlohmann::json();
}

double distance(const nlohmann::json& seen, const Colour& drawn) {
    double most = 0;
    for (std::size_t part = 0; part < 3; ++part)
        most = std::max(most, std::abs(seen.at(part).get<double>() - drawn[part]));
    return most;
}

/// `clips` are those of the playlist.
void expectStrip(const nlohmann::json& seen, double time, const std::vector<int>& clips) {
    const auto place = static_cast<std::size_t>(time / kClipSeconds);
    ASSERT_LT(place, clips.size());
    const int grey = stripOf(clips[place]);
    EXPECT_LE(distance(seen, {grey, grey, grey}), kTolerance)
        << seen << " at " << time << " s, in clip " << clips[place];
}

void putJudge(const PrivateNginx& server) {
    std::filesystem::copy_file(LC_SOURCE_DIR "/tests/extension/watch_judge.html", server.files() + "/judge.html");
}

TEST(WatchPage, ABrowserShowsTheColoursAndPlaysLeftAndRightAndSeeks) {
    PrivateNginx server;
    ClipHost host;
    const Dictionary info{{"url", server.url()}};
    constexpr int kClips = 6;
    for (int clip = 0; clip + 1 < kClips; ++clip)
        ASSERT_TRUE(host.handOver(makeBars(host.scratch, clip), info)) << server.log();
    ASSERT_TRUE(waitUntil([&] { return std::filesystem::exists(server.files() + "/watch.html"); })) << server.log();
    putJudge(server);
    const PrivateBrowser browser(server.url() + "judge.html");

    const auto live = told(server, "live.json", browser);
    ASSERT_FALSE(live.is_null());
    std::printf("%s\n", live.dump().c_str());
    EXPECT_EQ(live["size"], (std::vector<int>{kWidth, kHeight}));
    double worst = 0;
    for (std::size_t bar = 0; bar < kBars.size(); ++bar) {
        const double off = distance(live["bars"][bar], kBars[bar]);
        EXPECT_LE(off, kTolerance) << "bar " << bar << ": " << live["bars"][bar];
        worst = std::max(worst, off);
    }
    std::printf("the colours are within %.1f of those that were drawn\n", worst);
    for (std::size_t channel = 0; channel < 2; ++channel) {
        EXPECT_GT(live["heard"][channel][channel], -15) << "an amplitude of 0.25 is at -12 dB";
        EXPECT_LT(live["heard"][channel][1 - channel], -50) << "the other channel's tone";
    }
    // Time goes on as outside; a busy machine stalls now and then.
    const double played = live["to"].get<double>() - live["from"].get<double>(), passed = live["seconds"];
    EXPECT_GT(played, passed * 0.5);
    EXPECT_LT(played, passed + 0.5);
    EXPECT_NEAR(live["window"][0], 0, 0.1);
    EXPECT_NEAR(live["window"][1], (kClips - 1) * kClipSeconds, 0.2);
    for (const auto& sought : live["sought"]) expectStrip(sought["strip"], sought["time"], {0, 1, 2, 3, 4});

    ASSERT_TRUE(host.handOver(makeBars(host.scratch, kClips - 1), info, true)) << server.log();
    const auto ended = told(server, "ended.json", browser);
    ASSERT_FALSE(ended.is_null());
    EXPECT_NEAR(ended["duration"], kClips * kClipSeconds, 0.2);
    EXPECT_NEAR(ended["time"], ended["duration"], 0.2);
    expectStrip(ended["strip"], kClips * kClipSeconds - 0.1, {0, 1, 2, 3, 4, 5});
}

TEST(WatchPage, WhatWasLeftOutIsPassedOver) {
    PrivateNginx server;
    ClipHost host;
    constexpr int kClips = 7;
    std::filesystem::create_directories(server.files());
    for (int clip = 0; clip < kClips; ++clip)
        ASSERT_TRUE(host.handOver(makeBars(host.scratch, clip), {{"directory", server.files()}}, clip + 1 == kClips));
    // As the playlist is when it no longer names the first two, and one from the middle did not get to the server.
    const std::string path = server.files() + "/index.m3u8";
    std::istringstream before(ScratchDirectory::read(path));
    std::string after, length;
    int clip = 0;
    for (std::string line; std::getline(before, line);) {
        if (line.starts_with("#EXT-X-MEDIA-SEQUENCE")) {
            after += "#EXT-X-MEDIA-SEQUENCE:2\n";
        } else if (line.starts_with("#EXTINF")) {
            length = line + "\n";
        } else if (line.starts_with('#')) {
            if (line != "#EXT-X-PLAYLIST-TYPE:EVENT") after += line + "\n";
        } else {
            if (clip == 5) after += "#EXT-X-DISCONTINUITY\n";
            if (clip >= 2 && clip != 4) after += length + line + "\n";
            ++clip;
        }
    }
    ASSERT_EQ(clip, kClips);
    std::ofstream(path) << after;
    const std::vector<int> clips{2, 3, 5, 6};
    putJudge(server);
    const PrivateBrowser browser(server.url() + "judge.html");
    const auto seen = told(server, "live.json", browser);
    ASSERT_FALSE(seen.is_null());
    expectStrip(seen["strip"], seen["from"], clips);
    for (const auto& sought : seen["sought"]) expectStrip(sought["strip"], sought["time"], clips);
    const auto ended = told(server, "ended.json", browser);
    ASSERT_FALSE(ended.is_null());
    EXPECT_NEAR(ended["duration"], kClipSeconds * 4, 0.2);
    expectStrip(ended["strip"], kClipSeconds * 4 - 0.1, clips);
}

}  // namespace
}  // namespace lumacast::test
