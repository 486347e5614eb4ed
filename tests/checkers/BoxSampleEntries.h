#pragma once

#include <cstdint>
#include <string>

#include "tests/checkers/Boxes.h"

namespace lumacast::checkers {

/// What the sample entry must agree with.
struct EntryContext {
    std::string handler;
    std::uint32_t timescale = 0;
    std::uint64_t dataReferences = 0;  ///< entries of `dref`
};

struct SampleEntry {
    std::string codec;                ///< "avc1", "mp4a"; empty when there is none
    std::uint8_t nalLengthBytes = 0;  ///< of a NAL unit's length in a sample; 0 where samples are no NAL units
};

/// Checks `stsd`: one entry, whose configuration agrees with itself: the decoder's record with the sequence parameter
/// set, the picture's size and colours with it, the sound's rate and channels with its AudioSpecificConfig.
[[nodiscard]] SampleEntry checkSampleEntries(const Box& stsd, const EntryContext& context, const Complaints& complaints);

}  // namespace lumacast::checkers
