#pragma once

#include <cstddef>
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
    std::uint64_t chunks = 0;       ///< of a file in fragments: its runs
    std::uint64_t bytes = 0;
};

struct BoxReport {
    std::vector<std::string> topLevel;  ///< the types of the file's boxes in order
    std::uint32_t timescale = 0;
    std::uint64_t duration = 0;
    std::size_t fragments = 0;
    std::uint64_t cutOff = 0;  ///< bytes at the end that are no whole box; of a file in fragments alone
    std::vector<BoxTrack> tracks;
    Findings findings;
};

/// What kind of file it is to be.
enum class BoxShape {
    Finished,   ///< an ordinary movie with a complete index
    Fragmented  ///< one that is still recorded, or whose recorder died: fragments, the last box perhaps cut off
};

/// Walks the boxes of an MP4 file strictly, without libav; every finding that breaks the standard names the clause (of
/// ISO/IEC 14496-12:2015, 14496-14:2003, 14496-15:2017, 14496-1:2010, 14496-3, 14496-10).
///
/// Both shapes: sizes nest exactly and fill the file; `ftyp` is first and its brands agree; there is exactly one `moov`;
/// each header and table has the size that its fields say; a track's sample entry agrees with the sequence parameter set or
/// the AudioSpecificConfig in it; every sample lies within an `mdat`, no two overlap; the NAL units of a picture fill its
/// sample, and its being a sync sample agrees with what they are.
///
/// Finished: nothing of a fragmented file can be reached; the sample tables agree with each other and with the durations
/// of media, edits, track and movie; edits lie within the media and hide the sound's priming.
///
/// Fragmented: nothing in `moov` has a duration or samples; each fragment's number is higher than that before it, each
/// run's decoding time continues where its track's last run ended (a picture may be lengthened), the samples fill the
/// fragment's `mdat`. The last box may be cut off, unless it is one that a reader needs whole.
///
/// Any lane; blocks on the file, which must not become shorter meanwhile.
[[nodiscard]] BoxReport checkBoxes(const std::string& path, BoxShape shape = BoxShape::Finished);

}  // namespace lumacast::checkers
