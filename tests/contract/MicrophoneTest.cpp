// The microphone at real sound servers, each private to its test.

#include <gtest/gtest.h>

#include <cmath>
#include <functional>

#include "tests/contract/DeviceCaptureWorld.h"

namespace lumacast {
namespace {

using testing::Interruptions;
using testing::ListenedSession;
using testing::SoundServerWorld;

using Begin = test::PrivateSoundServer::Begin;
using Maker = std::function<std::unique_ptr<test::SoundServer>(Begin)>;

constexpr std::uint64_t kBegan = AudioSession::kInterruptionBegan, kEnded = AudioSession::kInterruptionEnded;
constexpr int kOwn = 997, kOther = 1703;

/// How long an operation took that may wait for nobody; far below what a server that hangs takes.
template <class Operation>
bool isAtOnce(const Operation& operation) {
    const auto begin = std::chrono::steady_clock::now();
    operation();
    return std::chrono::steady_clock::now() - begin < std::chrono::seconds(2);
}

class MicrophoneTest : public ::testing::TestWithParam<Maker> {
protected:
    MicrophoneTest() : MicrophoneTest(Begin::Now) {}
    explicit MicrophoneTest(Begin begin) : world_(GetParam()(begin)) {}

    void SetUp() override {
        ASSERT_TRUE(world_.server().isThere());
        room_ = world_.addMicrophone("mic");
        ASSERT_TRUE(room_);
    }

    ListenedSession listen(bool usesAudioSession = true) {
        ListenedSession listened(world_.devices(), world_.scheduler(), usesAudioSession);
        listened.session->startRunning();
        return listened;
    }
    static bool hears(const ListenedSession& listened, std::size_t more = 3) {
        const std::size_t before = listened.listener->count();
        return eventually([&] { return listened.listener->count() >= before + more; });
    }
    static bool hearsFor(const ListenedSession& listened, double seconds) {
        const double before = listened.listener->seconds();
        return eventually([&] { return listened.listener->seconds() >= before + seconds; });
    }
    static bool hearsTone(const ListenedSession& listened, int frequency) {
        return eventually([&] { return listened.listener->level(frequency) > -20; });
    }
    static bool wereTold(const Interruptions& interruptions, std::size_t count) {
        return eventually([&] { return interruptions.count() >= count; });
    }

    SoundServerWorld world_;
    testing::PipedMicrophone* room_ = nullptr;
};

/// The server comes later.
class LateMicrophoneTest : public MicrophoneTest {
protected:
    LateMicrophoneTest() : MicrophoneTest(Begin::Later) {}
    void SetUp() override { ASSERT_FALSE(world_.server().isThere()); }
};

TEST_P(MicrophoneTest, HearsItsRoomAndNotWhatApplicationsPlay) {
    room_->play(kOwn);
    const auto application = world_.play(kOther);
    ASSERT_TRUE(application);
    const auto listened = listen();
    ASSERT_TRUE(hearsTone(listened, kOwn));
    ASSERT_TRUE(hearsFor(listened, 0.25));
    const double own = listened.listener->level(kOwn), other = listened.listener->level(kOther);
    std::printf("%s: own tone %.1f dB, the applications' %.1f dB\n", world_.server().name().c_str(), own, other);
    EXPECT_NEAR(own, -6, 2);
    EXPECT_LT(other, own - 60);
}

TEST_P(MicrophoneTest, BothSidesCountTheSame) {
    room_->play(kOwn, 0.5, true);
    const auto listened = listen();
    ASSERT_TRUE(hearsTone(listened, kOwn));
    ASSERT_TRUE(hearsFor(listened, 0.25));
    EXPECT_NEAR(listened.listener->level(kOwn), -12, 2);
}

TEST_P(MicrophoneTest, SoundIsStampedWithTheMomentAtWhichItWasHeard) {
    room_->play(kOwn, 0);
    const auto listened = listen();
    ASSERT_TRUE(hearsFor(listened, 0.3));
    const HostTime beep = room_->beep();
    ASSERT_TRUE(hearsFor(listened, 0.2));
    const auto stamp = world_.clock().captureClock()->at(beep);
    ASSERT_TRUE(stamp);
    const auto onsets = checkers::beepOnsets({44100, listened.listener->sound()}, kOwn);
    ASSERT_EQ(onsets.size(), 1u);
    // From the place in the sound to the stamp of the sample that it is in.
    auto frame = static_cast<std::int64_t>(std::chrono::duration<double>(onsets[0]).count() * 44100);
    double heard = -1;
    for (const SampleRef& sample : listened.listener->samples()) {
        if (frame < sample->sampleCount()) {
            heard = sample->presentationTime().seconds() + static_cast<double>(frame) / 44100;
            break;
        }
        frame -= sample->sampleCount();
    }
    std::printf("%s: %.1f ms late\n", world_.server().name().c_str(), (heard - stamp->seconds()) * 1000);
    // PipeWire's end of the pipe keeps some sound back, and gives no account of it.
    EXPECT_NEAR(heard, stamp->seconds(), world_.server().name().starts_with("PipeWire") ? 0.1 : 0.03);
}

TEST_P(MicrophoneTest, SamplesFollowEachOtherWithoutHoles) {
    const auto listened = listen();
    ASSERT_TRUE(hears(listened, 40));
    const auto samples = listened.listener->samples();
    // A stream's first pieces settle where the server says they were heard.
    constexpr std::size_t kSettled = 15;
    for (std::size_t next = kSettled; next < samples.size(); ++next) {
        const double end = samples[next - 1]->presentationTime().seconds() + samples[next - 1]->duration().seconds();
        EXPECT_NEAR(samples[next]->presentationTime().seconds(), end, 1.0 / 44100) << next;
    }
}

TEST_P(MicrophoneTest, WhatIsHeardWhileTheClockOfTheStartStandsIsThrownAway) {
    world_.clock().startCaptureClock();
    const auto clock = world_.clock().captureClock();
    const auto listened = listen();
    // Later recordings have other clocks, and the witness hears by one.
    world_.clock().startCaptureClock();
    world_.clock().captureClock()->run();
    const auto witness = listen(false);
    ASSERT_TRUE(hears(witness, 5));
    EXPECT_EQ(listened.listener->count(), 0u);
    clock->run();
    ASSERT_TRUE(hears(listened, 5));
    clock->stand();
    ASSERT_TRUE(hears(witness, 5));
    listened.drain();
    const auto samples = listened.listener->samples();
    ASSERT_TRUE(hears(witness, 5));
    listened.drain();
    ASSERT_EQ(listened.listener->count(), samples.size());
    EXPECT_GE(samples.front()->presentationTime().seconds(), 0);
    EXPECT_LT(samples.front()->presentationTime().seconds(), 0.1);
    const double stood = clock->now().seconds();
    const double end = samples.back()->presentationTime().seconds() + samples.back()->duration().seconds();
    EXPECT_LE(end, stood + 0.005);
    EXPECT_GT(end, stood - 0.1);
    clock->run();
    ASSERT_TRUE(hears(listened));
    const double again = listened.listener->samples()[samples.size()]->presentationTime().seconds();
    EXPECT_GE(again, stood - 1e-6);
    EXPECT_LT(again, stood + 0.1);
}

TEST_P(MicrophoneTest, AnOutputsMonitorIsNoMicrophone) {
    room_->play(kOwn);
    const auto application = world_.play(kOther);
    ASSERT_TRUE(application);
    const Interruptions interruptions(world_.devices().sharedAudioSession());
    const auto listened = listen();
    ASSERT_TRUE(hearsTone(listened, kOwn));
    ASSERT_TRUE(world_.choose("null0.monitor"));
    ASSERT_TRUE(wereTold(interruptions, 1));
    EXPECT_TRUE(eventually([&] { return world_.recordings() == 0; }));
    ASSERT_TRUE(world_.choose("mic"));
    ASSERT_TRUE(hearsFor(listened, 0.2));
    const checkers::Sound sound{44100, listened.listener->sound()};
    // Nothing like what an application plays; the cut itself sounds a little.
    EXPECT_TRUE(checkers::checkToneAbsent(sound, kOther, -30, checkers::wholeOf(sound)).empty());
    EXPECT_EQ(interruptions.types(), (std::vector{kBegan, kEnded}));
}

TEST_P(MicrophoneTest, FollowsTheUsersChoice) {
    testing::PipedMicrophone* const other = world_.addMicrophone("other");
    ASSERT_TRUE(other);
    ASSERT_TRUE(world_.choose("mic"));
    room_->play(kOwn);
    other->play(kOther);
    const auto listened = listen();
    ASSERT_TRUE(hearsTone(listened, kOwn));
    ASSERT_TRUE(world_.choose("other"));
    ASSERT_TRUE(hearsTone(listened, kOther));
    ASSERT_TRUE(eventually([&] { return listened.listener->level(kOwn) < -60; }));
}

TEST_P(MicrophoneTest, OnlyACallAtTheSameMicrophoneTakesIt) {
    ASSERT_TRUE(world_.addMicrophone("other"));
    ASSERT_TRUE(world_.choose("mic"));
    const Interruptions interruptions(world_.devices().sharedAudioSession());
    const auto listened = listen();
    ASSERT_TRUE(hears(listened));
    const auto elsewhere = world_.call("other");
    const auto ordinary = world_.call("mic", "music");
    ASSERT_TRUE(eventually([&] { return world_.recordings(SoundServerWorld::kCalls) == 2; }));
    ASSERT_TRUE(hearsFor(listened, 0.2));
    EXPECT_EQ(interruptions.count(), 0u);
    auto call = world_.call("mic");
    ASSERT_TRUE(wereTold(interruptions, 1));
    EXPECT_TRUE(eventually([&] { return world_.recordings() == 0; })) << "the microphone is let go of";
    call.reset();
    ASSERT_TRUE(wereTold(interruptions, 2));
    ASSERT_TRUE(hears(listened));
    EXPECT_EQ(interruptions.types(), (std::vector{kBegan, kEnded}));
}

TEST_P(MicrophoneTest, ACallThatWasThereFirstIsAnInterruptionFromTheBeginning) {
    auto call = world_.call("mic");
    ASSERT_TRUE(eventually([&] { return world_.recordings(SoundServerWorld::kCalls) == 1; }));
    const Interruptions interruptions(world_.devices().sharedAudioSession());
    const auto listened = listen();
    ASSERT_TRUE(wereTold(interruptions, 1));
    EXPECT_EQ(listened.listener->count(), 0u);
    call.reset();
    ASSERT_TRUE(hears(listened));
    ASSERT_TRUE(wereTold(interruptions, 2));
    EXPECT_EQ(interruptions.types(), (std::vector{kBegan, kEnded}));
}

TEST_P(MicrophoneTest, AllSessionsTogetherAreInterruptedOnceAndOthersNot) {
    const Interruptions interruptions(world_.devices().sharedAudioSession());
    const auto one = listen(), two = listen(), apart = listen(false);
    ASSERT_TRUE(hears(one));
    ASSERT_TRUE(hears(two));
    ASSERT_TRUE(hears(apart));
    {
        const auto call = world_.call("mic");
        ASSERT_TRUE(wereTold(interruptions, 1));
        ASSERT_TRUE(eventually([&] { return world_.recordings() == 0; }));
    }
    ASSERT_TRUE(hears(one));
    ASSERT_TRUE(hears(two));
    ASSERT_TRUE(hears(apart));
    ASSERT_TRUE(wereTold(interruptions, 2));
    one.session->stopRunning();
    two.session->stopRunning();
    // Who takes no part in the audio session is interrupted by itself.
    const auto call = world_.call("mic");
    ASSERT_TRUE(eventually([&] { return world_.recordings() == 0; }));
    EXPECT_EQ(interruptions.types(), (std::vector{kBegan, kEnded}));
}

TEST_P(MicrophoneTest, AStopEndsTheInterruption) {
    const Interruptions interruptions(world_.devices().sharedAudioSession());
    const auto listened = listen();
    ASSERT_TRUE(hears(listened));
    const auto call = world_.call("mic");
    ASSERT_TRUE(wereTold(interruptions, 1));
    listened.session->stopRunning();
    ASSERT_TRUE(wereTold(interruptions, 2));
    EXPECT_EQ(interruptions.types(), (std::vector{kBegan, kEnded}));
}

TEST_P(MicrophoneTest, NothingIsLeftAtTheServerAfterTheStop) {
    const auto listened = listen();
    ASSERT_TRUE(hears(listened));
    EXPECT_EQ(world_.recordings(), 1u);
    listened.session->stopRunning();
    EXPECT_TRUE(eventually([&] { return world_.recordings() == 0; }));
    EXPECT_TRUE(eventually([&] { return !world_.connection().hasThread(); }));
}

TEST_P(MicrophoneTest, DestroyingASessionLetsGoOfTheMicrophone) {
    auto listened = listen();
    ASSERT_TRUE(hears(listened));
    listened.session.reset();
    EXPECT_TRUE(eventually([&] { return world_.recordings() == 0; }));
    EXPECT_TRUE(eventually([&] { return !world_.connection().hasThread(); }));
}

TEST_P(MicrophoneTest, AServerThatDiesIsAnInterruptionUntilAnotherHears) {
    const Interruptions interruptions(world_.devices().sharedAudioSession());
    const auto listened = listen();
    ASSERT_TRUE(hears(listened));
    world_.server().kill();
    ASSERT_TRUE(wereTold(interruptions, 1));
    EXPECT_TRUE(listened.session->isRunning());
    const std::size_t before = listened.listener->count();
    EXPECT_TRUE(isAtOnce([&] {
        listened.session->removeOutput(listened.output);
        listened.session->addOutput(listened.output);
    }));
    ASSERT_TRUE(world_.server().start());
    ASSERT_TRUE(world_.addMicrophone("mic"));
    ASSERT_TRUE(hears(listened));
    ASSERT_TRUE(wereTold(interruptions, 2));
    EXPECT_EQ(interruptions.types(), (std::vector{kBegan, kEnded}));
    const auto samples = listened.listener->samples();
    for (std::size_t next = 1; next < samples.size(); ++next)
        EXPECT_GT(compare(samples[next]->presentationTime(), samples[next - 1]->presentationTime()), 0) << next;
    EXPECT_GT(samples.size(), before);
}

TEST_P(MicrophoneTest, AServerThatHangsHoldsNobodyUpAndIsAnInterruption) {
    const Interruptions interruptions(world_.devices().sharedAudioSession());
    const auto listened = listen();
    ASSERT_TRUE(hears(listened));
    world_.server().hang();
    EXPECT_TRUE(isAtOnce([&] {
        auto other = listen();
        other.session->stopRunning();
        other.session->startRunning();
        other.session.reset();
    }));
    ASSERT_TRUE(wereTold(interruptions, 1));
    world_.server().goOn();
    ASSERT_TRUE(hears(listened));
    ASSERT_TRUE(wereTold(interruptions, 2));
    EXPECT_EQ(interruptions.types(), (std::vector{kBegan, kEnded}));
}

TEST_P(LateMicrophoneTest, ASessionRunsWithoutAServerAndHearsOnceThereIsOne) {
    const Interruptions interruptions(world_.devices().sharedAudioSession());
    const auto listened = listen();
    EXPECT_TRUE(listened.session->isRunning());
    ASSERT_TRUE(world_.server().start());
    ASSERT_TRUE(world_.addMicrophone("mic"));
    ASSERT_TRUE(hears(listened));
    EXPECT_EQ(interruptions.count(), 0u) << "it had not been heard before";
}

TEST_P(MicrophoneTest, OperationsOfManyLanesAtOnceLeaveItWorking) {
    const auto listened = listen();
    ASSERT_TRUE(hears(listened));
    const auto often = [](const std::function<void()>& operation) {
        return std::thread([operation] {
            for (int time = 0; time < 500; ++time) operation();
        });
    };
    std::vector<std::thread> lanes;
    lanes.push_back(often([&] {
        listened.session->stopRunning();
        listened.session->startRunning();
    }));
    lanes.push_back(often([&] {
        listened.session->removeInput(listened.input);
        listened.session->addInput(listened.input);
        (void)listened.session->canAddOutput(listened.output);
    }));
    lanes.push_back(often([&] {
        listened.session->removeOutput(listened.output);
        listened.session->addOutput(listened.output);
        listened.output->setSampleBufferDelegate(listened.listener, listened.queue);
    }));
    lanes.push_back(often([&] { listen(); }));
    for (std::thread& lane : lanes) lane.join();
    EXPECT_TRUE(hears(listened, 10));
    EXPECT_TRUE(eventually([&] { return world_.recordings() == 1; })) << world_.recordings();
}

Maker pulseAudio() {
    return [](Begin begin) { return std::make_unique<test::PrivateSoundServer>(begin); };
}
Maker pipeWire() {
    return [](Begin begin) { return std::make_unique<test::PrivatePipeWire>(begin); };
}
INSTANTIATE_TEST_SUITE_P(PulseAudio, MicrophoneTest, ::testing::Values(pulseAudio()));
INSTANTIATE_TEST_SUITE_P(PipeWire, MicrophoneTest, ::testing::Values(pipeWire()));
INSTANTIATE_TEST_SUITE_P(PulseAudio, LateMicrophoneTest, ::testing::Values(pulseAudio()));
INSTANTIATE_TEST_SUITE_P(PipeWire, LateMicrophoneTest, ::testing::Values(pipeWire()));

}  // namespace
}  // namespace lumacast
