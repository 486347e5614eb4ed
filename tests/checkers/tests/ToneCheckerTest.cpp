#include "tests/checkers/ToneChecker.h"

#include <gtest/gtest.h>

#include <cmath>
#include <numbers>

#include "tests/checkers/MovieReader.h"
#include "tests/checkers/tests/MovieMaker.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::checkers {
namespace {

using namespace std::chrono_literals;

float sine(double seconds, double frequency, double amplitude = 0.25) {
    return static_cast<float>(amplitude * std::sin(2 * std::numbers::pi * frequency * seconds));
}

// Beeps of 80 ms at these times.
std::function<float(double)> beeps(std::vector<double> times, double frequency) {
    return [times, frequency](double seconds) {
        for (const double time : times)
            if (seconds >= time && seconds < time + 0.08) return sine(seconds - time, frequency);
        return 0.0F;
    };
}

class ToneInAMovie : public ::testing::Test {
protected:
    // The sound as it comes out of an encoded movie of three seconds.
    Sound movieWith(const std::function<float(double)>& sound) {
        MoviePlan plan;
        plan.pictures = steadyPictures(1, 90, 30);
        plan.soundSeconds = 3;
        plan.sound = sound;
        const std::string path = folder_.path("movie.mp4");
        EXPECT_EQ(makeMovie(plan, path), "");
        MovieReader reader(path);
        const auto read = reader.readSound();
        EXPECT_TRUE(read) << reader.error();
        return read.value_or(Sound{});
    }

    ScratchDirectory folder_;
};

TEST(ToneLevel, IsTheAmplitudeOfTheToneAndNothingElse) {
    Sound sound{48000, {}};
    for (int place = 0; place < 4800; ++place)
        sound.samples.push_back(sine(place / 48000.0, 440, 0.5) + sine(place / 48000.0, 1000, 0.05));
    EXPECT_NEAR(toneLevel(sound.samples, 48000, 440), -6.02, 0.05);
    EXPECT_NEAR(toneLevel(sound.samples, 48000, 1000), -26.02, 0.1);
    EXPECT_LT(toneLevel(sound.samples, 48000, 660), -70);
    EXPECT_EQ(toneLevel({}, 48000, 440), -200);
    EXPECT_EQ(toneLevel(std::vector<float>(4800, 0.0F), 48000, 440), -200);
}

TEST_F(ToneInAMovie, AcceptsTheRightToneForTheWholeMovie) {
    const Sound sound = movieWith([](double seconds) { return sine(seconds, 440); });
    EXPECT_NEAR(static_cast<double>(sound.samples.size()) / sound.rate, 3.0, 0.03);
    const Stretch most{50ms, 2900ms};
    EXPECT_EQ(checkTonePresent(sound, 440, -14, most), Findings{});
    EXPECT_EQ(checkToneAbsent(sound, 880, -60, most), Findings{});
}

TEST_F(ToneInAMovie, RejectsAWrongTone) {
    const Sound sound = movieWith([](double seconds) { return sine(seconds, 880); });
    const Stretch most{50ms, 2900ms};
    EXPECT_EQ(checkTonePresent(sound, 440, -14, most).size(), 29U);
    EXPECT_EQ(checkToneAbsent(sound, 880, -60, most).size(), 29U);
}

TEST_F(ToneInAMovie, RejectsAToneWithAHoleAndAnotherToneThatLeaksInBriefly) {
    const Sound sound = movieWith([](double seconds) {
        const bool hole = seconds > 1.0 && seconds < 1.1;
        return hole ? sine(seconds, 880, 0.1) : sine(seconds, 440);
    });
    const Stretch most{0ms, 2900ms};
    EXPECT_GE(checkTonePresent(sound, 440, -14, most).size(), 1U);
    EXPECT_GE(checkToneAbsent(sound, 880, -60, most).size(), 1U);
    EXPECT_LE(checkTonePresent(sound, 440, -14, most).size(), 2U);
}

TEST_F(ToneInAMovie, RejectsASoundThatEndsTooEarly) {
    const Sound sound = movieWith([](double seconds) { return sine(seconds, 440); });
    EXPECT_EQ(checkTonePresent(sound, 440, -14, {0ms, 4000ms}).size(), 1U);
    EXPECT_EQ(checkTonePresent({}, 440, -14, {0ms, 1000ms}).size(), 1U);
    EXPECT_EQ(wholeOf(Sound{1000, std::vector<float>(500)}).to, 500ms);
}

TEST_F(ToneInAMovie, FindsBeepsToAboutAMillisecond) {
    const auto onsets = beepOnsets(movieWith(beeps({0.0, 0.5, 1.2345, 2.7}, 1000)), 1000);
    const std::vector<std::chrono::nanoseconds> expected{0ms, 500ms, 1234500us, 2700ms};
    EXPECT_EQ(checkBeeps(onsets, expected, 2ms), Findings{});
    ASSERT_EQ(onsets.size(), 4U);
    for (std::size_t place = 0; place < 4; ++place)
        EXPECT_LT(std::chrono::abs(onsets[place] - expected[place]), 1500us) << onsets[place].count();
}

TEST_F(ToneInAMovie, RejectsAMissingBeepOneTooManyAndALateOne) {
    const std::vector<std::chrono::nanoseconds> expected{500ms, 1000ms, 1500ms};
    const auto judge = [&](std::vector<double> times) {
        return checkBeeps(beepOnsets(movieWith(beeps(std::move(times), 1000)), 1000), expected, 20ms);
    };
    EXPECT_EQ(judge({0.5, 1.0, 1.5}), Findings{});
    EXPECT_EQ(judge({0.5, 1.5}).size(), 1U);
    EXPECT_EQ(judge({0.5, 1.0, 1.5, 2.0}).size(), 1U);
    EXPECT_EQ(judge({0.5, 1.04, 1.5}).size(), 2U);  // one missing, one where none belongs
}

TEST_F(ToneInAMovie, DoesNotTakeAnotherToneOrAClickForABeep) {
    EXPECT_TRUE(beepOnsets(movieWith(beeps({0.5, 1.0}, 2500)), 1000).empty());
    EXPECT_TRUE(
        beepOnsets(movieWith([](double seconds) { return seconds > 1 && seconds < 1.0005 ? 0.9F : 0.0F; }), 1000)
            .empty());
    EXPECT_TRUE(beepOnsets({}, 1000).empty());
}

TEST_F(ToneInAMovie, AMissingAudioTrackIsAnError) {
    MoviePlan plan;
    plan.pictures = steadyPictures(1, 5, 30);
    const std::string path = folder_.path("movie.mp4");
    ASSERT_EQ(makeMovie(plan, path), "");
    MovieReader reader(path);
    EXPECT_FALSE(reader.readSound());
    EXPECT_NE(reader.error(), "");
}

}  // namespace
}  // namespace lumacast::checkers
