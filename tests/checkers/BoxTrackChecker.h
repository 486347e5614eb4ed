#pragma once

#include <cstdint>
#include <vector>

#include "tests/checkers/BoxSampleTables.h"
#include "tests/checkers/Boxes.h"

namespace lumacast::checkers {

/// What a `trak` must agree with.
struct TrackContext {
    BoxShape shape = BoxShape::Finished;
    std::uint32_t movieTimescale = 0;
    const std::vector<Extent>& media;  ///< the content of each `mdat`
    std::uint64_t fileBytes = 0;
};

/// Checks one `trak`: its headers, sample entry, tables and edit list against each other. Of a file in fragments the
/// tables must be empty and nothing has a duration.
[[nodiscard]] CheckedTrack checkTrack(const Box& trak, const TrackContext& context, const Complaints& movie);

}  // namespace lumacast::checkers
