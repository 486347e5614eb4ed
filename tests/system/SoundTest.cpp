// Sound through the real daemon and real sound servers, judged by what the movies show and play.

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>

#include "tests/checkers/SyncChecker.h"
#include "tests/checkers/ToneChecker.h"
#include "tests/sound/PrivateSoundServer.h"
#include "tests/system/World.h"

namespace lumacast::test {
namespace {

using checkers::NumberRange;
using std::chrono::milliseconds;
using std::chrono::nanoseconds;
using std::chrono::seconds;

// A sanitizer's daemon is many times slower: a small, slow picture and a short run there.
#ifdef LC_SANITIZED
const std::vector<std::string> kHeard{"--size", "320x180", "--fps", "10"};
constexpr milliseconds kInSync{250};
constexpr int kFramesPerSecond = 10;
#else
const std::vector<std::string> kHeard{"--size", "320x180", "--fps", "30"};
constexpr milliseconds kInSync{40};
constexpr int kFramesPerSecond = 30;
#endif
constexpr milliseconds kDrift{20};
constexpr double kBeep = 1000;

std::vector<std::string> with(std::vector<std::string> options, const std::vector<std::string>& more) {
    options.insert(options.end(), more.begin(), more.end());
    return options;
}

checkers::Sound soundOf(const std::string& movie, std::size_t track = 0) {
    checkers::MovieReader reader(movie);
    EXPECT_EQ(reader.audioTracks().size(), 1u);
    auto sound = reader.readSound(track);
    EXPECT_TRUE(sound) << reader.error();
    return sound.value_or(checkers::Sound{});
}

/// The sound from `from` to `to` seconds of the movie.
checkers::Sound part(const checkers::Sound& sound, double from, double to) {
    const auto at = [&](double seconds) {
        return sound.samples.begin() +
               std::clamp<std::ptrdiff_t>(static_cast<std::ptrdiff_t>(seconds * sound.rate), 0, std::ssize(sound.samples));
    };
    return {sound.rate, {at(from), at(std::max(from, to))}};
}
double lengthOf(const checkers::Sound& sound) {
    return static_cast<double>(sound.samples.size()) / std::max(1, sound.rate);
}
double loudest(const checkers::Sound& sound) {
    float most = 0;
    for (const float sample : sound.samples) most = std::max(most, std::abs(sample));
    return most;
}
double levelOf(const checkers::Sound& sound, double frequency) {
    return checkers::toneLevel(sound.samples, sound.rate, frequency);
}

/// The half second in which a tone is loudest: on a busy machine a server runs out of sound now and then, and a tone that
/// is cut off is heard in all the other frequencies.
checkers::Sound bestPart(const checkers::Sound& sound, double frequency) {
    constexpr double kLength = 0.5, kStep = 0.05;
    checkers::Sound best;
    for (double from = 0; from + kLength <= lengthOf(sound); from += kStep) {
        auto one = part(sound, from, from + kLength);
        if (best.samples.empty() || levelOf(one, frequency) > levelOf(best, frequency)) best = std::move(one);
    }
    return best;
}

/// Whether the application itself drew the marked picture of that moment more than half a frame time too late.
bool wasDrawnLate(nanoseconds mark, const std::vector<checkers::NumberedPicture>& pictures,
                  const checkers::FramesLog& drawn) {
    const auto picture = std::find_if(pictures.begin(), pictures.end(), [&](const auto& one) { return one.time == mark; });
    if (picture == pictures.end() || !picture->number) return false;
    const auto frame = drawn.find(*picture->number);
    if (frame == drawn.end() || frame == drawn.begin()) return false;
    return frame->second.shown - std::prev(frame)->second.shown > nanoseconds(seconds(1)) * 3 / 2 / kFramesPerSecond;
}

enum class Kind { PulseAudio, PipeWire };

class SoundOnServer : public ::testing::TestWithParam<Kind> {
protected:
    SoundOnServer() {
        if (GetParam() == Kind::PulseAudio)
            server_ = std::make_unique<PrivateSoundServer>();
        else
            server_ = std::make_unique<PrivatePipeWire>();
        EXPECT_TRUE(server_->isThere());
        world_.addVariable("PULSE_SERVER=" + server_->address());
        world_.addVariable("DBUS_SESSION_BUS_ADDRESS=");
        world_.startDaemon();
    }

    /// Records an application for so long; the movie's path.
    std::string record(Application& application, double length) {
        (void)application.askForFrame("start");
        EXPECT_TRUE(world_.waitForElapsed(length));
        return application.stop();
    }

    std::unique_ptr<SoundServer> server_;
    World world_;
};

TEST_P(SoundOnServer, EachRecordingHoldsItsOwnApplicationsToneAndNoOther) {
    // The newest window is in front; what is behind it goes on playing.
    const std::vector<double> tones{1900, 700, 1100};
    std::vector<std::unique_ptr<Application>> applications;
    for (const double own : tones) {
        const std::string tone = std::to_string(static_cast<int>(own));
        applications.push_back(world_.otherApplication("Plays" + tone, with(kHeard, {"--tone", tone})));
        Application& front = *applications.back();
        ASSERT_TRUE(front.waitForFrame(2 * kFramesPerSecond));  // it plays by then
        const auto sound = soundOf(record(front, 3));
        ASSERT_GT(lengthOf(sound), 2.5);
        const auto middle = part(sound, 0.5, lengthOf(sound) - 0.3);
        const auto best = bestPart(middle, own);
        const double heard = levelOf(best, own);
        EXPECT_GT(heard, -20);
        for (std::size_t i = 0; i + 1 < applications.size(); ++i) {
            // They are played at -6 dB.
            EXPECT_LT(levelOf(middle, tones[i]), -50) << tones[i] << " Hz";
            const double separation = heard - levelOf(best, tones[i]);
            std::printf("    %s: %.0f Hz at %.1f dB, the other application's %.0f Hz %.1f dB below it\n",
                        server_->name().c_str(), own, heard, tones[i], separation);
            EXPECT_GE(separation, 60);
        }
    }
    const auto silent = world_.otherApplication("Silent", kHeard);
    ASSERT_TRUE(silent->waitForFrame(2));
    const auto nothing = soundOf(record(*silent, 2));
    EXPECT_GT(lengthOf(nothing), 1.5);
    EXPECT_LT(loudest(nothing), 1e-4) << "somebody else's sound";
}

TEST_P(SoundOnServer, IsInSyncFromEndToEndHoweverOftenTheRecordingIsPaused) {
    // Sixty seconds, and ten minutes in the long runs; shorter where another server or a sanitizer repeats it.
    double length = longTests() ? 600 : GetParam() == Kind::PulseAudio ? 60 : 20;
#ifdef LC_SANITIZED
    length = 15;
#endif
    constexpr int kPauses = 5;
    const auto application =
        world_.application(with(kHeard, {"--beep-every", std::to_string(kFramesPerSecond / 2 + 5)}));
    ASSERT_TRUE(application->waitForFrame(2 * kFramesPerSecond));
    (void)application->askForFrame("start");
    checkers::SyncExpectation expectation;
    for (int pause = 1; pause <= kPauses; ++pause) {
        ASSERT_TRUE(waitUntil([&] { return world_.recording()["elapsedSeconds"].get<double>() >= length * pause / 6; },
                              seconds(600)));
        const std::uint32_t paused = application->askForFrame("pause");
        // Pauses of different lengths, so that none is a whole number of buffers or beeps.
        ASSERT_TRUE(application->waitForFrame(paused + static_cast<std::uint32_t>(kFramesPerSecond / 3 * pause)));
        const std::uint32_t stillPaused = application->askForFrame("frame") - 1;
        (void)application->askForFrame("resume");
        expectation.forbidden.push_back({paused + 1, stillPaused});
    }
    ASSERT_TRUE(waitUntil([&] { return world_.recording()["elapsedSeconds"].get<double>() >= length; }, seconds(600)));
    const std::string beeps = application->ask("beeps");
    const std::string movie = application->stop();
    const auto sound = soundOf(movie);
    expectation.tolerance = milliseconds(250);  // each has its partner; how close is judged below
    expectation.leastPairs = static_cast<std::size_t>(length / 0.67 * 0.7);
    const auto pictures = picturesOf(movie);
    const auto report = checkers::checkBeepsAtMarks(pictures, checkers::beepOnsets(sound, kBeep), expectation);
    for (const auto& finding : report.findings) ADD_FAILURE() << finding << " (" << beeps << ")";
    ASSERT_TRUE(report.drift.has_value());
    // A machine that stands still for a moment makes the application draw a mark late: by its own log, which is not the
    // recording's doing. Those are counted, and must be few.
    const auto drawn = application->framesLog();
    std::size_t late = 0;
    nanoseconds worst{};
    for (const auto& pair : report.pairs) {
        if (wasDrawnLate(pair.mark, pictures, drawn)) {
            ++late;
            continue;
        }
        if (std::chrono::abs(pair.late) > std::chrono::abs(worst)) worst = pair.late;
        EXPECT_LE(std::chrono::abs(pair.late), kInSync) << "the beep at " << pair.mark.count() / 1'000'000 << " ms, " << beeps;
    }
    EXPECT_LE(late, report.pairs.size() / 10);
    std::printf("    %s: %zu beeps in %.0f s, the furthest %.1f ms from its picture (without %zu that were drawn late), "
                "drift %.1f ms; %s\n",
                server_->name().c_str(), report.pairs.size(), lengthOf(sound), static_cast<double>(worst.count()) / 1e6,
                late, static_cast<double>(report.drift->count()) / 1e6, beeps.c_str());
#ifndef LC_SANITIZED
    EXPECT_LT(std::chrono::abs(*report.drift), kDrift);
#endif
    // As long as the picture, and no longer.
    const double pictureEnd = std::chrono::duration<double>(pictures.back().time).count();
    EXPECT_NEAR(lengthOf(sound), pictureEnd, 0.5);
}

TEST_P(SoundOnServer, OfAServerThatIsKilledAndComesBackHasSilenceForTheHole) {
    const auto application = world_.application(with(kHeard, {"--beep-every", std::to_string(kFramesPerSecond / 2)}));
    ASSERT_TRUE(application->waitForFrame(2 * kFramesPerSecond));
    (void)application->askForFrame("start");
    ASSERT_TRUE(world_.waitForElapsed(3));
    const std::uint32_t killed = application->askForFrame("frame");
    server_->kill();
    ASSERT_TRUE(world_.waitForElapsed(5));
    const std::uint32_t cameBack = application->askForFrame("frame");
    ASSERT_TRUE(server_->start());
    // The application plays again within half a second, and the tap hears it then.
    const auto elapsed = world_.recording()["elapsedSeconds"].get<double>();
    ASSERT_TRUE(world_.waitForElapsed(elapsed + 5));
    const std::string movie = application->stop();

    const auto pictures = picturesOf(movie);
    const auto timeOf = [&](std::uint32_t frame) {
        const auto found = std::find_if(pictures.begin(), pictures.end(),
                                        [&](const auto& picture) { return picture.number && *picture.number >= frame; });
        EXPECT_NE(found, pictures.end());
        return found == pictures.end() ? nanoseconds{} : found->time;
    };
    const nanoseconds from = timeOf(killed), to = timeOf(cameBack);
    const auto sound = soundOf(movie);
    EXPECT_NEAR(lengthOf(sound), std::chrono::duration<double>(pictures.back().time).count(), 0.5);
    const auto onsets = checkers::beepOnsets(sound, kBeep);
    const auto near = [&](nanoseconds mark) {
        return std::any_of(onsets.begin(), onsets.end(),
                           [&](nanoseconds onset) { return std::chrono::abs(onset - mark) <= kInSync; });
    };
    int before = 0, after = 0;
    for (const nanoseconds mark : checkers::markTimes(pictures)) {
        if (mark > milliseconds(200) && mark < from - milliseconds(200)) {
            EXPECT_TRUE(near(mark)) << "before, at " << mark.count() / 1'000'000 << " ms";
            ++before;
        } else if (mark > to + seconds(2) && mark < pictures.back().time - milliseconds(300)) {
            EXPECT_TRUE(near(mark)) << "afterwards, at " << mark.count() / 1'000'000 << " ms";
            ++after;
        }
    }
    EXPECT_GE(before, 3);
    EXPECT_GE(after, 3);
    const auto hole = part(sound, std::chrono::duration<double>(from).count() + 0.3, std::chrono::duration<double>(to).count());
    ASSERT_GT(lengthOf(hole), 1.0);
    EXPECT_LT(loudest(hole), 1e-3);
    for (const nanoseconds onset : onsets)
        EXPECT_FALSE(onset > from + milliseconds(300) && onset < to) << "a beep in the hole";
}

TEST_P(SoundOnServer, BeginsAndEndsWithThePictureForAnApplicationThatPlaysAllTheTime) {
    const auto application = world_.application(with(kHeard, {"--tone", "700"}));
    ASSERT_TRUE(application->waitForFrame(2 * kFramesPerSecond));
    const std::string movie = record(*application, 3);
    const auto sound = soundOf(movie);
    const double pictureEnd = std::chrono::duration<double>(picturesOf(movie).back().time).count();
    EXPECT_NEAR(lengthOf(sound), pictureEnd, 0.25);
    // From the first tenth of a second to the last quarter there is no hole in it.
    for (const auto& finding :
         checkers::checkTonePresent(sound, 700, -20, {milliseconds(100), nanoseconds(static_cast<std::int64_t>((lengthOf(sound) - 0.25) * 1e9))}))
        ADD_FAILURE() << finding;
}

INSTANTIATE_TEST_SUITE_P(Real, SoundOnServer, ::testing::Values(Kind::PulseAudio, Kind::PipeWire),
                         [](const auto& kind) { return kind.param == Kind::PulseAudio ? "PulseAudio" : "PipeWire"; });

}  // namespace
}  // namespace lumacast::test
