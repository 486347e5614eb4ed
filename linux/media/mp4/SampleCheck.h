#pragma once

#include <cstdint>

namespace lumacast::mp4 {

class BoxSource;

enum class SampleKind : std::uint8_t { video, sound };

// Whether the sample's bytes are in the file and are what was written: for samples that nobody has synced. A power cut
// leaves zeros, in whole sectors, for what did not reach the disk. So a sample is in doubt, and the answer false, when
//  - it is a picture whose NAL units don't fill it exactly, have no slice, end in zero or have three bytes in a row of
//    which two are zero and the third is below 3: no NAL unit has any (ISO/IEC 14496-10 clause 7.4.1). A sector of zeros
//    can't hide there, wherever it begins;
//  - it is sound that has nothing but zeros in one of its sectors, or ends in zero, where an access unit has ones
//    (ID_END, ISO/IEC 14496-3 clause 4.4.2.1).
// Reads piece by piece, however large the sample is.
[[nodiscard]] bool carriesData(BoxSource& source, std::uint64_t offset, std::uint32_t size, SampleKind kind);

}  // namespace lumacast::mp4
