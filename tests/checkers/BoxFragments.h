#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "tests/checkers/BoxSampleTables.h"
#include "tests/checkers/Boxes.h"

namespace lumacast::checkers {

/// Checks `mvex` in the boxes of `moov`, and the movie fragments among the file's boxes, in order. Adds the fragments'
/// samples to the tracks, which are those of `moov`. Answers how many fragments there are.
[[nodiscard]] std::size_t checkFragments(const std::vector<Box>& moov, const std::vector<Box>& file,
                                         std::uint64_t fileBytes, std::vector<CheckedTrack>& tracks,
                                         Findings& findings);

}  // namespace lumacast::checkers
