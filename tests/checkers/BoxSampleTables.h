#pragma once

#include <cstdint>
#include <vector>

#include "tests/checkers/BoxChecker.h"
#include "tests/checkers/Boxes.h"

namespace lumacast::checkers {

/// Where one sample's bytes are, in decoding order.
struct MediaSample {
    std::uint64_t offset = 0;
    std::uint32_t size = 0;
    bool isSync = false;
};

/// What the boxes tell of a track.
struct CheckedTrack {
    BoxTrack track;
    std::uint8_t nalLengthBytes = 0;  ///< 0 where samples are no NAL units
    std::vector<MediaSample> samples;
    std::uint64_t latestComposition = 0;  ///< how much later than decoded a sample may be shown, ticks of the track
};

/// Checks the sample tables in the boxes of `stbl` against each other and adds what they say to `track`. `fileBytes` is
/// how long the file is: no more samples are believed in than it could hold.
void checkSampleTables(const std::vector<Box>& stbl, const std::vector<Extent>& media, std::uint64_t fileBytes,
                       CheckedTrack& track, const Complaints& complaints);

/// Checks that a file in fragments has tables, and that nothing is in them.
void checkEmptySampleTables(const std::vector<Box>& stbl, const Complaints& complaints);

}  // namespace lumacast::checkers
