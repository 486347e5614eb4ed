#pragma once
// What is in a stream: its frame numbers and its sound.

#include <gtest/gtest.h>

#include <optional>
#include <string>
#include <vector>

#include "tests/checkers/FrameNumberChecker.h"
#include "tests/checkers/MovieReader.h"
#include "tests/checkers/ToneChecker.h"

namespace lumacast::test {

/// The frame numbers of a movie, or of a playlist, in the order of showing.
inline std::vector<checkers::NumberedPicture> picturesOf(const std::string& path) {
    checkers::MovieReader reader(path);
    std::vector<checkers::NumberedPicture> pictures;
    EXPECT_TRUE(readFrameNumbers(reader, pictures)) << path << ": " << reader.error();
    return pictures;
}

/// Every frame from `first` to `last`, once, in order.
inline void expectFrames(const std::string& path, std::uint32_t first, std::uint32_t last) {
    const auto pictures = picturesOf(path);
    checkers::FrameExpectation wanted;
    for (std::uint32_t number = first; number <= last; ++number) wanted.expected.insert(number);
    wanted.withoutGaps = true;
    wanted.largestHole = std::chrono::milliseconds(60);
    const auto report = checkFrameNumbers(pictures, wanted);
    for (const auto& finding : report.findings) ADD_FAILURE() << path << ": " << finding.text;
    EXPECT_EQ(pictures.size(), last - first + 1u);
}

inline checkers::Sound soundOf(const std::string& path) {
    checkers::MovieReader reader(path);
    const auto sound = reader.readSound();
    EXPECT_TRUE(sound) << path << ": " << reader.error();
    return sound.value_or(checkers::Sound{48'000, {}});
}

/// The tone is there all the time, at this level at least (dB), and nothing clicks: `quiet` is a frequency that nobody
/// plays.
inline void expectUnbrokenTone(const checkers::Sound& sound, double frequency, double quiet,
                               const checkers::Stretch& stretch, double level = -20) {
    for (const std::string& finding : checkTonePresent(sound, frequency, level, stretch)) ADD_FAILURE() << finding;
    for (const std::string& finding : checkToneAbsent(sound, quiet, -55, stretch)) ADD_FAILURE() << finding;
}

}  // namespace lumacast::test
