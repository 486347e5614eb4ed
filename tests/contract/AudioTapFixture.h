#pragma once
// Taps of real sound servers, each private to its test.

#include <gtest/gtest.h>

#include <cmath>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "linux/audio/LinuxAudioInputQueues.h"
#include "linux/audio/PulseTaps.h"
#include "linux/system/LinuxClock.h"
#include "tests/contract/HeardSound.h"
#include "tests/sound/PrivateSoundServer.h"

namespace lumacast::test {

using Begin = PrivateSoundServer::Begin;
using SoundServerMaker = std::function<std::unique_ptr<SoundServer>(Begin)>;

class AudioTapTest : public ::testing::TestWithParam<SoundServerMaker> {
protected:
    AudioTapTest() : AudioTapTest(Begin::Now) {}
    explicit AudioTapTest(Begin begin) : server_(GetParam()(begin)) {
        clock_.startCaptureClock();
        clock_.captureClock()->run();
    }

    void SetUp() override { ASSERT_TRUE(server_->isThere()); }

    std::unique_ptr<TonePlayer> play(double frequency, const std::vector<std::string>& options = {}) {
        auto player = std::make_unique<TonePlayer>(server_->address(), options);
        EXPECT_TRUE(player->isReady());
        EXPECT_TRUE(player->tell("play a " + std::to_string(frequency) + " 0.5 2"));
        return player;
    }
    std::unique_ptr<HeardSound> hear(ProcessID pid) { return std::make_unique<HeardSound>(queues_, pid); }

    static std::shared_ptr<sound::PulseConnection> connectTo(const std::string& address) {
        sound::PulseConnection::Options options;
        options.server = address;
        return std::make_shared<sound::PulseConnection>(options);
    }

    std::unique_ptr<SoundServer> server_;
    LinuxClock clock_;
    std::mutex familyMutex_;
    std::map<ProcessID, std::string> family_;  ///< bundle identifiers by process
    std::shared_ptr<sound::PulseConnection> connection_ = connectTo(server_->address());
    LinuxAudioInputQueues queues_{
        std::make_shared<sound::PulseTaps>(connection_, [this](ProcessID pid) -> std::optional<BundleIdentifier> {
            const std::lock_guard lock(familyMutex_);
            const auto found = family_.find(pid);
            if (found == family_.end()) return std::nullopt;
            return BundleIdentifier(found->second);
        }), clock_};
};

class LateAudioTapTest : public AudioTapTest {
protected:
    LateAudioTapTest() : AudioTapTest(Begin::Later) {}
    void SetUp() override { ASSERT_FALSE(server_->isThere()); }
};

inline constexpr double kOwn = 997, kOther = 1703, kThird = 2503;
/// What they are played at.
inline const double kHalf = 20 * std::log10(0.5);

/// That of a tone not even 10 ms were heard, which would be above -30 dB. Another tone, cut off anywhere, reaches -50.
inline void expectNever(const HeardSound& heard, double frequency) {
    const auto sound = heard.sound();
    EXPECT_EQ(checkers::checkToneAbsent(sound, frequency, -40, checkers::wholeOf(sound)), checkers::Findings{});
}

}  // namespace lumacast::test
