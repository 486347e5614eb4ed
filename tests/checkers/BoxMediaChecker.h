#pragma once

#include <cstdint>
#include <span>
#include <vector>

#include "tests/checkers/BoxSampleTables.h"
#include "tests/checkers/Boxes.h"

namespace lumacast::checkers {

/// Checks where the samples of all tracks are, in a file of these bytes and with these contents of `mdat` boxes, and, of
/// H.264, that the NAL units in them are what the boxes say.
void checkMedia(std::span<const std::uint8_t> file, const std::vector<Extent>& media,
                const std::vector<CheckedTrack>& tracks, Findings& findings);

}  // namespace lumacast::checkers
