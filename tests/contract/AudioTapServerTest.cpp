// Taps of servers that die, hang or come later.

#include <unistd.h>

#include <chrono>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "tests/contract/AudioTapFixture.h"

namespace lumacast {
namespace {

using test::AudioTapTest;
using test::Begin;
using test::expectNever;
using test::HeardSound;
using test::kOther;
using test::kOwn;
using test::LateAudioTapTest;
using test::SoundServerMaker;
using test::TonePlayer;

TEST_P(AudioTapTest, AServerThatDiesLeavesSilenceAndIsFollowedWhenItComesBack) {
    const auto one = play(kOwn);
    const auto heard = hear(one->pid());
    ASSERT_TRUE(heard->waitForTone(kOwn));
    server_->kill();
    ASSERT_TRUE(heard->waitForSilence());
    const std::size_t from = heard->waitFor(0.3);
    ASSERT_NE(from, SIZE_MAX);
    EXPECT_TRUE(heard->isSilent(from));
    ASSERT_TRUE(server_->start());
    // As applications do: it connects again. So does another one, which may have got any number of the first one's.
    const auto other = play(kOther);
    ASSERT_TRUE(one->tell("connect"));
    ASSERT_TRUE(one->tell("play a 997 0.5 2"));
    ASSERT_TRUE(heard->waitForTone(kOwn));
    expectNever(*heard, kOther);
    EXPECT_TRUE(test::holesIn(heard->pieces()).empty());
}

TEST_P(AudioTapTest, AServerThatHangsLeavesSilenceAndIsHeardAgain) {
    const auto one = play(kOwn);
    const auto heard = hear(one->pid());
    ASSERT_TRUE(heard->waitForTone(kOwn));
    server_->hang();
    ASSERT_TRUE(heard->waitForSilence());
    server_->goOn();
    EXPECT_TRUE(heard->waitForTone(kOwn));
    EXPECT_TRUE(test::holesIn(heard->pieces()).empty());
}

TEST_P(LateAudioTapTest, AServerThatComesLaterIsJoinedWithoutLookingForIt) {
    sound::PulseConnection::Options options;
    options.server = server_->address();
    options.firstRetry = options.slowestRetry = options.slowestWithoutSocket = std::chrono::hours(1);
    LinuxAudioInputQueues queues(std::make_shared<sound::PulseTaps>(std::make_shared<sound::PulseConnection>(options), nullptr),
                                 clock_);
    TonePlayer one(server_->address(), {"--later"});
    ASSERT_TRUE(one.isReady());
    const HeardSound heard(queues, one.pid());
    ASSERT_NE(heard.waitFor(0.3), SIZE_MAX);
    ASSERT_TRUE(server_->start());
    ASSERT_TRUE(one.tell("connect"));
    ASSERT_TRUE(one.tell("play a 997 0.5 2"));
    EXPECT_TRUE(heard.waitForTone(kOwn));
}

TEST_P(LateAudioTapTest, AServerThatComesLaterIsJoined) {
    TonePlayer one(server_->address(), {"--later"});
    ASSERT_TRUE(one.isReady());
    const auto heard = hear(one.pid());
    ASSERT_NE(heard->waitFor(0.3), SIZE_MAX) << "silence comes without a server";
    EXPECT_TRUE(heard->isSilent(0));
    ASSERT_TRUE(server_->start());
    ASSERT_TRUE(one.tell("connect"));
    ASSERT_TRUE(one.tell("play a 997 0.5 2"));
    EXPECT_TRUE(heard->waitForTone(kOwn));
    EXPECT_TRUE(test::holesIn(heard->pieces()).empty());
}

TEST_P(LateAudioTapTest, AServerThatIsMissedIsToldOnceAndSoIsItsReturn) {
    struct Told {
        std::mutex mutex;
        std::vector<bool> isThere;
    };
    const auto told = std::make_shared<Told>();
    const auto isTold = [&](const std::vector<bool>& expected) {
        return eventually([&] {
            const std::lock_guard lock(told->mutex);
            return told->isThere == expected;
        });
    };
    sound::PulseConnection::Options options;
    options.server = server_->address();
    options.toldAfter = std::chrono::milliseconds(20);
    options.tell = [told](bool isThere) {
        const std::lock_guard lock(told->mutex);
        told->isThere.push_back(isThere);
    };
    const auto connection = std::make_shared<sound::PulseConnection>(options);
    LinuxAudioInputQueues queues(std::make_shared<sound::PulseTaps>(connection, nullptr), clock_);
    for (int time = 0; time < 2; ++time) {  // the second one's outage is the first one's
        const HeardSound heard(queues, ProcessID{::getpid()});
        EXPECT_TRUE(isTold({false}));
        ASSERT_NE(heard.waitFor(0.3), SIZE_MAX);
        EXPECT_TRUE(isTold({false}));
    }
    ASSERT_TRUE(eventually([&] { return !connection->hasThread(); }));
    ASSERT_TRUE(server_->start());
    const HeardSound heard(queues, ProcessID{::getpid()});
    EXPECT_TRUE(isTold({false, true}));
    server_->kill();
    EXPECT_TRUE(isTold({false, true, false}));
}

std::string nameOfServer(const ::testing::TestParamInfo<SoundServerMaker>& info) { return info.index == 0 ? "PulseAudio" : "PipeWire"; }

const auto kServers = ::testing::Values(
    SoundServerMaker([](Begin begin) { return std::make_unique<test::PrivateSoundServer>(begin); }),
    SoundServerMaker([](Begin begin) { return std::make_unique<test::PrivatePipeWire>(begin); }));

INSTANTIATE_TEST_SUITE_P(Real, AudioTapTest, kServers, nameOfServer);
INSTANTIATE_TEST_SUITE_P(Real, LateAudioTapTest, kServers, nameOfServer);

}  // namespace
}  // namespace lumacast
