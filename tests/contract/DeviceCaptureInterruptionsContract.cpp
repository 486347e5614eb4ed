// A microphone that is suspended or taken.

#include <memory>

#include "tests/contract/DeviceCaptureFixture.h"

namespace lumacast {
namespace {

using testing::DeviceCaptureContract;
using testing::Interruptions;

TEST_P(DeviceCaptureContract, ASuspendedMicrophoneIsAnInterruptionUntilItIsHeardAgain) {
    const auto listened = listen();
    const Interruptions interruptions(devices_.sharedAudioSession());
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened));
    EXPECT_EQ(interruptions.count(), 0u);
    world_->setSuspended(true);
    ASSERT_TRUE(eventually([&] { return interruptions.count() >= 1; }));
    EXPECT_TRUE(listened.session->isRunning());
    world_->setSuspended(false);
    ASSERT_TRUE(hears(listened));
    ASSERT_TRUE(eventually([&] { return interruptions.count() >= 2; }));
    EXPECT_EQ(interruptions.types(),
              (std::vector{AudioSession::kInterruptionBegan, AudioSession::kInterruptionEnded}));
}

TEST_P(DeviceCaptureContract, ACallTakesTheMicrophoneUntilItIsOver) {
    const auto listened = listen();
    const Interruptions interruptions(devices_.sharedAudioSession());
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened));
    world_->setTakenByACall(true);
    ASSERT_TRUE(eventually([&] { return interruptions.count() >= 1; }));
    listened.drain();
    const std::size_t before = listened.listener->count();
    world_->hear();
    listened.drain();
    EXPECT_EQ(listened.listener->count(), before) << "nothing while it is taken";
    world_->setTakenByACall(false);
    ASSERT_TRUE(hears(listened));
    ASSERT_TRUE(eventually([&] { return interruptions.count() >= 2; }));
    EXPECT_EQ(interruptions.types(),
              (std::vector{AudioSession::kInterruptionBegan, AudioSession::kInterruptionEnded}));
}

TEST_P(DeviceCaptureContract, WhoNoLongerObservesInterruptionsIsNotTold) {
    const auto listened = listen();
    Interruptions gone(devices_.sharedAudioSession());
    const Interruptions stays(devices_.sharedAudioSession());
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened));
    gone.end();
    world_->setSuspended(true);
    ASSERT_TRUE(eventually([&] { return stays.count() == 1; }));
    EXPECT_EQ(gone.count(), 0u);
}

TEST_P(DeviceCaptureContract, OnlyKnownCategoriesAndOptionsAreAccepted) {
    AudioSession& session = devices_.sharedAudioSession();
    EXPECT_TRUE(session.setCategory(AudioSession::kPlayAndRecord,
                                    AudioSession::kMixWithOthers | AudioSession::kAllowBluetoothHandsFree));
    EXPECT_TRUE(session.setCategory(AudioSession::kPlayAndRecord, 0));
    EXPECT_FALSE(session.setCategory("PlayAndSing", 0));
    EXPECT_FALSE(session.setCategory("", 0));
    EXPECT_FALSE(session.setCategory(AudioSession::kPlayAndRecord, 2));
}

}  // namespace
}  // namespace lumacast
