#pragma once

#include <chrono>
#include <cstddef>
#include <optional>
#include <vector>

#include "tests/checkers/Finding.h"
#include "tests/checkers/FrameNumberChecker.h"

namespace lumacast::checkers {

struct SyncExpectation {
    /// How far a beep may begin from the picture it belongs to.
    std::chrono::nanoseconds tolerance = std::chrono::milliseconds(20);
    /// Numbers drawn while the recording was paused, as for the frames: a mark or beep that such a cut may have severed
    /// from the other need not have one. The same holds at either end of the movie.
    std::vector<NumberRange> forbidden;
    /// More such cuts, by their times: where the clips of a stream meet.
    std::vector<std::chrono::nanoseconds> cuts = {};
    /// How many marks there must be, each with its beep, for the movie to say anything.
    std::size_t leastPairs = 1;
};

/// A mark and the beep that belongs to it.
struct SyncPair {
    std::chrono::nanoseconds mark{};  ///< when the first picture with it is shown
    std::chrono::nanoseconds late{};  ///< how much later the beep begins; below zero: earlier
};

struct SyncReport {
    std::vector<SyncPair> pairs;
    std::chrono::nanoseconds worst{};  ///< the largest distance, with its sign
    /// The median distance of the last fifth of the pairs less that of the first (at least three pairs each); none with
    /// fewer than six.
    std::optional<std::chrono::nanoseconds> drift;
    Findings findings;
};

/// When marks appear: the first picture of each run of marked ones. A movie that begins marked has no such moment for
/// that run.
[[nodiscard]] std::vector<std::chrono::nanoseconds> markTimes(const std::vector<NumberedPicture>& pictures);

/// Judges whether the beeps (see beepOnsets) begin when the marked pictures appear. Pictures in the order of showing.
[[nodiscard]] SyncReport checkBeepsAtMarks(const std::vector<NumberedPicture>& pictures,
                                           const std::vector<std::chrono::nanoseconds>& onsets,
                                           const SyncExpectation& expectation);

}  // namespace lumacast::checkers
