#pragma once

#include <chrono>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <vector>

#include "tests/checkers/Finding.h"
#include "tests/checkers/FrameNumberChecker.h"
#include "tests/checkers/SyncChecker.h"

namespace lumacast::checkers {

/// What the command line asks of a movie.
struct MovieCheckOptions {
    std::string movie;
    std::string contactSheet;  ///< PNG to write; empty: none
    bool unfinished = false;   ///< a recording cut off in the middle: the box structure isn't judged
    bool fragmented = false;   ///< a recording under way, or left by a crash: its boxes are judged as such
    bool readNumbers = true;   ///< false for movies of something else than the scene
    int turnedDegrees = 0;     ///< how far clockwise the pictures were turned
    FrameExpectation frames;
    std::optional<double> leastSeconds, mostSeconds;
    std::optional<std::size_t> videoTracks, audioTracks;  ///< how many there are
    std::size_t audioTrack = 0;
    std::vector<double> tones;    ///< each heard from beginning to end
    std::vector<double> noTones;  ///< none of them heard anywhere
    std::optional<double> beeps;  ///< frequency of beeps to report
    std::optional<double> beepsAtMarks;  ///< frequency of beeps that begin when a marked frame is shown
    SyncExpectation sync;                ///< of those; `forbidden` is taken from `frames`
    double leastLevel = -40;      ///< dB
    double mostLevel = -60;       ///< dB
    double marginSeconds = 0.1;   ///< not judged at either end of the sound
};

struct MovieCheckResult {
    nlohmann::json report;
    Findings findings;      ///< empty: the movie passed
    bool readable = false;  ///< false: not even a movie
};

/// Runs every check that was asked for; one that fails doesn't keep the others from running. Blocks.
[[nodiscard]] MovieCheckResult checkMovie(const MovieCheckOptions& options);

}  // namespace lumacast::checkers
