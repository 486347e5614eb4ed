#pragma once

#include <cstddef>

namespace lumacast::mp4 {

class BoxBuffer;
class SampleIndex;

// The tables of a sample table box that follow its sample descriptions: stts, stss (video with pictures that are no key
// frames), stsc, stsz, and stco, or co64 where an offset needs more than 32 bits. An empty index gives the empty tables
// of a fragmented movie.
void writeSampleTables(BoxBuffer& out, const SampleIndex& index);

// An upper bound of the bytes they take.
[[nodiscard]] std::size_t sampleTableBytes(const SampleIndex& index);

}  // namespace lumacast::mp4
