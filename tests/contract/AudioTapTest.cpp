// Who is heard by a tap, and who is not.

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <mutex>
#include <string>

#include "tests/contract/AudioTapFixture.h"

namespace lumacast {
namespace {

using test::AudioTapTest;
using test::expectNever;
using test::HeardSound;
using test::kHalf;
using test::kOther;
using test::kOwn;
using test::kThird;
using test::TonePlayer;

TEST_P(AudioTapTest, TwoApplicationsAreHeardApart) {
    const auto one = play(kOwn), other = play(kOther);
    const auto heard = hear(one->pid()), heardOther = hear(other->pid());
    ASSERT_TRUE(heard->waitForTone(kOwn));
    ASSERT_TRUE(heardOther->waitForTone(kOther));
    double own = 0, foreign = 0, own2 = 0, foreign2 = 0;
    // A busy machine makes the servers themselves stumble: one whole second without, at least. What is heard of somebody
    // else would be heard in every one.
    EXPECT_TRUE(eventually([&] {
        own = heard->level(kOwn, 1), foreign = heard->level(kOther, 1);
        own2 = heardOther->level(kOther, 1), foreign2 = heardOther->level(kOwn, 1);
        return std::abs(own - kHalf) < 0.2 && std::abs(own2 - kHalf) < 0.2 && foreign < own - 60 && foreign2 < own2 - 60;
    }));
    std::printf("%s: own %.1f and %.1f dB, the other's %.1f and %.1f dB\n", server_->name().c_str(), own, own2, foreign,
                foreign2);
    // And from the very beginning, not only by now.
    expectNever(*heard, kOther);
    expectNever(*heardOther, kOwn);
    EXPECT_TRUE(test::holesIn(heard->pieces()).empty());
}

TEST_P(AudioTapTest, WhoPlaysNothingIsDigitalSilenceWhileOthersPlay) {
    TonePlayer quiet(server_->address());
    const auto other = play(kOther);
    const auto heard = hear(quiet.pid()), heardOther = hear(other->pid());
    ASSERT_TRUE(heardOther->waitForTone(kOther));
    ASSERT_NE(heard->waitFor(0.6), SIZE_MAX);
    EXPECT_TRUE(heard->isSilent(0));
    EXPECT_TRUE(test::holesIn(heard->pieces()).empty());
}

TEST_P(AudioTapTest, SilenceOfOneThatPlaysNothingComesInLongPiecesAndWhatItPlaysThenInShortOnes) {
    TonePlayer one(server_->address());
    const auto heard = hear(one.pid());
    const auto longest = [&] {
        std::size_t frames = 0;
        for (const auto& piece : heard->pieces()) frames = std::max(frames, piece.frames);
        return frames;
    };
    EXPECT_TRUE(eventually([&] { return longest() >= 8820; })) << "a fifth of a second";
    ASSERT_TRUE(one.tell("play a 997 0.5 2"));
    ASSERT_TRUE(heard->waitForTone(kOwn));
    EXPECT_TRUE(eventually([&] { return heard->pieces().back().frames <= 2 * 882; }));
    EXPECT_TRUE(test::holesIn(heard->pieces()).empty());
}

TEST_P(AudioTapTest, SilenceThatMayComeLateComesOnceASecondAndSoundAtOnceWithoutAHole) {
    TonePlayer one(server_->address());
    const HeardSound heard(queues_, one.pid(), HeardSound::Silence::MayBeLate);
    // A piece is longer than a buffer of 0.65 s: two come together. Nothing comes for as long before.
    const auto waits = [&] {
        int count = 0;
        const auto pieces = heard.pieces();
        for (std::size_t i = 1; i < pieces.size(); ++i) count += pieces[i].arrived - pieces[i - 1].arrived >= 900'000'000;
        return count;
    };
    EXPECT_TRUE(eventually([&] { return waits() >= 3; }));
    ASSERT_TRUE(one.tell("play a 997 0.5 2"));
    ASSERT_TRUE(heard.waitForTone(kOwn));
    EXPECT_TRUE(eventually([&] { return heard.pieces().back().frames <= 2 * 882; }));
    EXPECT_TRUE(test::holesIn(heard.pieces()).empty());
}

TEST_P(AudioTapTest, WhenTheApplicationEndsNothingElseIsHeardInItsPlace) {
    auto one = play(kOwn);
    const auto other = play(kOther);
    const auto heard = hear(one->pid());
    ASSERT_TRUE(heard->waitForTone(kOwn));
    one->kill();
    ASSERT_TRUE(heard->waitForSilence());
    const std::size_t from = heard->waitFor(0.6);
    ASSERT_NE(from, SIZE_MAX);
    EXPECT_TRUE(heard->isSilent(from));
    expectNever(*heard, kOther);
}

TEST_P(AudioTapTest, StreamsThatComeAndGoAllTheTimeNeverLetAnotherBeHeard) {
    TonePlayer one(server_->address());
    const auto other = play(kOther);
    const auto heard = hear(one.pid());
    for (int round = 0; round < 12; ++round) {
        const std::string name = "v" + std::to_string(round);
        ASSERT_TRUE(one.tell("play " + name + " 997 0.5 2"));
        if (round % 3 == 0) {
            ASSERT_TRUE(heard->waitForTone(kOwn));
        } else {
            heard->waitFor(0.04 * (round % 5));
        }
        ASSERT_TRUE(one.tell("stop " + name));
    }
    ASSERT_TRUE(heard->waitForSilence());
    heard->waitFor(0.3);
    expectNever(*heard, kOther);
    EXPECT_TRUE(test::holesIn(heard->pieces()).empty());
}

TEST_P(AudioTapTest, AChildOfTheSameApplicationIsHeardAForeignChildIsNot) {
    const auto family = play(kOwn, {"--child"}), foreign = play(kOther, {"--child"}), nameless = play(kThird, {"--child"});
    {
        const std::lock_guard lock(familyMutex_);
        family_ = {{family->pid(), "org.example.A"},  {family->playing(), "org.example.A"},
                   {foreign->pid(), "org.example.A"}, {foreign->playing(), "org.example.B"}};
    }
    ASSERT_NE(family->pid(), family->playing());
    const auto heard = hear(family->pid()), heardForeign = hear(foreign->pid()), heardNameless = hear(nameless->pid());
    ASSERT_TRUE(heard->waitForTone(kOwn));
    heardForeign->waitFor(0.3);
    EXPECT_TRUE(heardForeign->isSilent(0));
    EXPECT_TRUE(heardNameless->isSilent(0));
    EXPECT_LT(heard->level(kOther), -80);
    // And not the other way round: a parent is not its child.
    const auto heardChild = hear(family->playing());
    EXPECT_TRUE(heardChild->waitForTone(kOwn));
}

TEST_P(AudioTapTest, AClientThatOnlyClaimsToBeTheApplicationIsNotHeard) {
    // The number alone, as from inside a container: this test's program is another one.
    const auto pretender = play(kOther, {"--claim", std::to_string(::getpid())});
    const auto heard = hear(ProcessID{::getpid()}), heardPretender = hear(pretender->pid());
    ASSERT_NE(heard->waitFor(0.6), SIZE_MAX);
    EXPECT_TRUE(heard->isSilent(0));
}

TEST_P(AudioTapTest, ACorkedApplicationIsSilentAndHeardAgain) {
    const auto one = play(kOwn);
    const auto heard = hear(one->pid());
    ASSERT_TRUE(heard->waitForTone(kOwn));
    ASSERT_TRUE(one->tell("cork a"));
    ASSERT_TRUE(heard->waitForSilence());
    heard->waitFor(0.3);
    ASSERT_TRUE(one->tell("uncork a"));
    ASSERT_TRUE(heard->waitForTone(kOwn));
    EXPECT_TRUE(test::holesIn(heard->pieces()).empty());
}

TEST_P(AudioTapTest, AStreamIsFollowedToAnotherOutput) {
    const auto one = play(kOwn), other = play(kOther), third = play(kThird);
    ASSERT_TRUE(third->tell("move a null1"));
    const auto heard = hear(one->pid());
    ASSERT_TRUE(heard->waitForTone(kOwn));
    for (const char* const sink : {"null1", "null0", "null1"}) {
        ASSERT_TRUE(one->tell(std::string("move a ") + sink));
        heard->waitFor(0.3);
        ASSERT_TRUE(heard->waitForTone(kOwn)) << sink;
    }
    expectNever(*heard, kOther);
    expectNever(*heard, kThird);
    EXPECT_TRUE(test::holesIn(heard->pieces()).empty());
}

TEST_P(AudioTapTest, AStreamThatIsMovedWhileItIsCorkedIsHeardWhenItPlaysAgain) {
    const auto one = play(kOwn), other = play(kOther);
    ASSERT_TRUE(other->tell("move a null1"));
    const auto heard = hear(one->pid());
    ASSERT_TRUE(heard->waitForTone(kOwn));
    ASSERT_TRUE(one->tell("cork a"));
    ASSERT_TRUE(heard->waitForSilence());
    ASSERT_TRUE(one->tell("move a null1"));
    const std::size_t from = heard->waitFor(0.3);
    ASSERT_NE(from, SIZE_MAX);
    EXPECT_TRUE(heard->isSilent(from));
    ASSERT_TRUE(one->tell("uncork a"));
    ASSERT_TRUE(heard->waitForTone(kOwn));
    expectNever(*heard, kOther);
    EXPECT_TRUE(test::holesIn(heard->pieces()).empty());
}

TEST_P(AudioTapTest, SeveralStreamsAreMixed) {
    const auto one = play(kOwn);
    const auto heard = hear(one->pid());
    ASSERT_TRUE(one->tell("play b 1703 0.25 1"));
    ASSERT_TRUE(one->tell("play c 2503 -0.4 2"));
    double own = 0, other = 0, third = 0;
    EXPECT_TRUE(eventually([&] {
        own = heard->level(kOwn), other = heard->level(kOther), third = heard->level(kThird);
        // One side of two is half as loud.
        return std::abs(own - kHalf) < 0.5 && std::abs(other - 2 * kHalf) < 0.5 &&
               std::abs(third - 20 * std::log10(0.2)) < 0.5;
    })) << own << ", " << other << ", " << third << " dB";
    ASSERT_TRUE(one->tell("stop b"));
    EXPECT_TRUE(eventually([&] { return heard->level(kOther) < -70 && std::abs(heard->level(kOwn) - kHalf) < 0.5; }));
}

TEST_P(AudioTapTest, AProcessThatHasEndedIsNone) {
    ProcessID gone{0};
    {
        TonePlayer one(server_->address());
        gone = one.pid();
    }
    const auto made = queues_.makeInputQueue(test::recorderFormat(), {}, AudioInputQueues::kCaptureProcessOutput);
    EXPECT_EQ(made.queue->setProcessTap(gone), AudioStatus::kNoSuchProcess);
}

}  // namespace
}  // namespace lumacast
