#pragma once
// The host of the extension that pushes samples, in the test's process.

#include <cmath>
#include <functional>
#include <memory>
#include <numbers>
#include <optional>
#include <string>
#include <vector>

#include "examples/scene/Scene.h"
#include "extensions/live-push/LivePush.h"
#include "tests/client/WaitUntil.h"
#include "tests/extension/SamplePayload.h"
#include "tests/extension/StandInHost.h"
#include "tests/extension/TestClips.h"

namespace lumacast::test {

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
            const double time = 10 + static_cast<double>(number) / kClipRate;
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
        for (int at = 0; at < 44'100 / kClipRate; ++at) {
            const double seconds = static_cast<double>(number) / kClipRate + at / 44'100.0;
            const auto sample =
                static_cast<std::int16_t>(8000 * std::sin(2 * std::numbers::pi * kApplicationTone * seconds));
            bytes.push_back(static_cast<std::uint8_t>(static_cast<std::uint16_t>(sample) >> 8));
            bytes.push_back(static_cast<std::uint8_t>(sample));
        }
        host.send(soundPayload(2, std::move(bytes), 44'100 / kClipRate, time, tap));
        AudioFormat microphone = tap;
        microphone.sampleRate = 48'000;
        microphone.formatFlags = AudioFormat::kFlagFloat | AudioFormat::kFlagPacked;
        microphone.bitsPerChannel = 32;
        microphone.bytesPerFrame = microphone.bytesPerPacket = 4;
        Data floats;
        for (int at = 0; at < 48'000 / kClipRate; ++at) {
            const double seconds = static_cast<double>(number) / kClipRate + at / 48'000.0;
            const Data sample =
                bytesOf(static_cast<float>(0.25 * std::sin(2 * std::numbers::pi * kMicrophoneTone * seconds)));
            floats.insert(floats.end(), sample.begin(), sample.end());
        }
        EXPECT_TRUE(host.sendAndWait(soundPayload(3, std::move(floats), 48'000 / kClipRate, time, microphone)));
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

}  // namespace lumacast::test
