// The tap against real sound servers, each private to its test.

#include <gtest/gtest.h>
#include <sys/resource.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <functional>
#include <map>
#include <utility>

#include "linux/audio/LinuxAudioInputQueues.h"
#include "linux/audio/PulseTaps.h"
#include "linux/system/LinuxClock.h"
#include "tests/contract/HeardSound.h"
#include "tests/sound/PrivateSoundServer.h"

namespace lumacast {
namespace {

using test::HeardSound;
using test::TonePlayer;

using Begin = test::PrivateSoundServer::Begin;
using Maker = std::function<std::unique_ptr<test::SoundServer>(Begin)>;

class AudioTapTest : public ::testing::TestWithParam<Maker> {
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

    std::unique_ptr<test::SoundServer> server_;
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

constexpr double kOwn = 997, kOther = 1703, kThird = 2503;
/// What they are played at.
const double kHalf = 20 * std::log10(0.5);

/// That of a tone not even 10 ms were heard, which would be above -30 dB. Another tone, cut off anywhere, reaches -50.
void expectNever(const HeardSound& heard, double frequency) {
    const auto sound = heard.sound();
    EXPECT_EQ(checkers::checkToneAbsent(sound, frequency, -40, checkers::wholeOf(sound)), checkers::Findings{});
}

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

TEST_P(AudioTapTest, ABeepIsStampedWithTheTimeAtWhichItWasHeard) {
    TonePlayer one(server_->address());
    ASSERT_TRUE(one.tell("play a 997 0.05 2"));
    const auto heard = hear(one.pid());
    ASSERT_TRUE(heard->waitForTone(kOwn, -40));
    std::vector<double> errors;
    std::string text;
    for (int beep = 0; beep < 5; ++beep) {
        heard->waitFor(0.1);
        const std::int64_t played = one.beep("a");
        ASSERT_NE(played, 0);
        const auto onsets = [&] { return checkers::beepOnsets(heard->sound(), kOwn, -6); };
        ASSERT_TRUE(eventually([&] { return onsets().size() == static_cast<std::size_t>(beep + 1); }))
            << beep << ": " << onsets().size() << " beeps heard";
        // The capture clock has run all the time: what it says now gives its zero.
        const std::int64_t zero = LinuxClock::currentHostTime().nanoseconds - clock_.captureClock()->now().value;
        const auto begin = static_cast<std::int64_t>(heard->pieces().front().start.hostTime);
        errors.push_back(static_cast<double>(zero + begin + onsets().back().count() - played) / 1e6);
        text += " " + std::to_string(errors.back()).substr(0, 5);
    }
    std::printf("%s: beeps stamped%s ms after the player's account\n", server_->name().c_str(), text.c_str());
    for (const double error : errors) EXPECT_LT(std::abs(error), 25) << "a picture at 40 a second";
    // On a busy machine single accounts come late.
    std::sort(errors.begin(), errors.end());
    EXPECT_LT(std::abs(errors[errors.size() / 2]), 5);
}

TEST_P(AudioTapTest, ATapCostsLittle) {
    const auto one = play(kOwn);
    const auto heard = hear(one->pid());
    ASSERT_TRUE(heard->waitForTone(kOwn));
    heard->waitFor(0.3);
    rusage before{}, after{};
    ::getrusage(RUSAGE_SELF, &before);
    heard->waitFor(1);
    ::getrusage(RUSAGE_SELF, &after);
    const auto seconds = [](const rusage& usage) {
        return static_cast<double>(usage.ru_utime.tv_sec + usage.ru_stime.tv_sec) +
               static_cast<double>(usage.ru_utime.tv_usec + usage.ru_stime.tv_usec) / 1e6;
    };
    // The test's own polling (200 times a second) is in it.
    const double share = (seconds(after) - seconds(before)) * 100;
    const double switches = static_cast<double>(after.ru_nvcsw - before.ru_nvcsw);
    std::printf("%s: %.2f %% of a core, %.0f wake-ups a second, of which the test's own about 200\n",
                server_->name().c_str(), share, switches);
    EXPECT_LT(share, 10);
}

TEST_P(AudioTapTest, WithoutAQueueThereIsNoThread) {
    EXPECT_FALSE(connection_->hasThread());
    {
        const auto one = play(kOwn);
        const auto heard = hear(one->pid());
        ASSERT_TRUE(heard->waitForTone(kOwn));
        EXPECT_TRUE(connection_->hasThread());
    }
    EXPECT_TRUE(eventually([this] { return !connection_->hasThread(); }));
}

TEST_P(AudioTapTest, ACallbackThatOwnsItsQueueEndsItWithoutATrace) {
    const auto threads = [] {
        const std::filesystem::directory_iterator tasks("/proc/self/task");
        return std::distance(begin(tasks), end(tasks));
    };
    const auto before = threads();
    struct Owner {
        std::shared_ptr<AudioInputQueue> queue;
    };
    auto owner = std::make_shared<Owner>();
    owner->queue = queues_
                       .makeInputQueue(
                           test::recorderFormat(),
                           [owner](const AudioQueueBufferRef&, const AudioTimeStamp&, std::uint32_t, auto) {
                               owner->queue->dispose();
                           },
                           AudioInputQueues::kCaptureProcessOutput)
                       .queue;
    AudioQueueBufferRef buffer;
    ASSERT_EQ(owner->queue->allocateBuffer(882 * 2, buffer), AudioStatus::kSuccess);
    ASSERT_EQ(owner->queue->enqueueBuffer(buffer), AudioStatus::kSuccess);
    ASSERT_EQ(owner->queue->start(), AudioStatus::kSuccess);
    const std::weak_ptr<Owner> weak = owner;
    owner.reset();
    EXPECT_TRUE(eventually([&] { return weak.expired() && threads() <= before; })) << threads() << " threads, " << before;
}

TEST_P(AudioTapTest, AQueueWithoutABufferForASecondGivesItsStreamBackAndTheNextBufferBringsItBack) {
    const auto one = play(kOwn);
    struct Heard {
        std::mutex mutex;
        std::vector<AudioQueueBufferRef> buffers;
        bool isLoud = false;
    };
    const auto heard = std::make_shared<Heard>();
    const auto made = queues_.makeInputQueue(
        test::recorderFormat(),
        [heard](const AudioQueueBufferRef& buffer, const AudioTimeStamp&, std::uint32_t, auto) {
            const std::lock_guard lock(heard->mutex);
            for (std::uint32_t byte = 0; byte < buffer->byteSize; ++byte)
                if (buffer->bytes[byte] != 0) heard->isLoud = true;
            heard->buffers.push_back(buffer);
        },
        AudioInputQueues::kCaptureProcessOutput);
    AudioInputQueue& queue = *made.queue;
    ASSERT_EQ(queue.setProcessTap(one->pid()), AudioStatus::kSuccess);
    AudioQueueBufferRef buffer;
    ASSERT_EQ(queue.allocateBuffer(8820, buffer), AudioStatus::kSuccess);
    ASSERT_EQ(queue.enqueueBuffer(buffer), AudioStatus::kSuccess);
    ASSERT_EQ(queue.start(), AudioStatus::kSuccess);
    EXPECT_TRUE(connection_->hasThread());
    EXPECT_TRUE(eventually([&] { return !connection_->hasThread(); })) << "nobody is tapped";
    {
        const std::lock_guard lock(heard->mutex);
        heard->isLoud = false;
    }
    // Whoever gives it back each time hears the process again.
    EXPECT_TRUE(eventually([&] {
        const std::lock_guard lock(heard->mutex);
        for (const auto& each : std::exchange(heard->buffers, {})) queue.enqueueBuffer(each);
        return heard->isLoud;
    }));
    queue.dispose();
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

std::string nameOfServer(const ::testing::TestParamInfo<Maker>& info) { return info.index == 0 ? "PulseAudio" : "PipeWire"; }

const auto kServers = ::testing::Values(
    Maker([](Begin begin) { return std::make_unique<test::PrivateSoundServer>(begin); }),
    Maker([](Begin begin) { return std::make_unique<test::PrivatePipeWire>(begin); }));

INSTANTIATE_TEST_SUITE_P(Real, AudioTapTest, kServers, nameOfServer);
INSTANTIATE_TEST_SUITE_P(Real, LateAudioTapTest, kServers, nameOfServer);

}  // namespace
}  // namespace lumacast
