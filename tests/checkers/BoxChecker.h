#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "tests/checkers/Finding.h"

namespace lumacast::checkers {

struct BoxTrack {
    std::uint32_t identifier = 0;
    std::string handler;  ///< "vide", "soun"
    std::string codec;    ///< the sample entry: "avc1", "mp4a"
    std::uint32_t timescale = 0;
    std::uint64_t mediaDuration = 0;  ///< in units of `timescale`
    std::uint64_t duration = 0;       ///< as presented, in units of the movie's time scale
    std::uint64_t samples = 0;
    std::uint64_t syncSamples = 0;  ///< all of them when the track lists none
    std::uint64_t chunks = 0;
    std::uint64_t bytes = 0;
};

struct BoxReport {
    std::vector<std::string> topLevel;  ///< the types of the file's boxes in order
    std::uint32_t timescale = 0;
    std::uint64_t duration = 0;
    std::vector<BoxTrack> tracks;
    Findings findings;
};

/// Walks the boxes of a finished MP4 file strictly (ISO/IEC 14496-12): sizes nest exactly and fill the file; `ftyp` is
/// first; there is exactly one `moov`; nothing of a fragmented file (`moof`, `mvex`, `sidx`, `mfra`) can be reached; in
/// each track the sample tables agree with each other and with the durations, every chunk lies within an `mdat`, and no
/// two chunks overlap. Any lane; blocks on the file.
[[nodiscard]] BoxReport checkBoxes(const std::string& path);

}  // namespace lumacast::checkers
