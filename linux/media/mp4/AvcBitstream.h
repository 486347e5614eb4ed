#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <vector>

namespace lumacast::mp4 {

// Pure functions on H.264 bytes, safe on any input.

// The NAL units of an Annex B byte stream (ISO/IEC 14496-10 clause B.1), without start codes and trailing zeros. The
// spans point into `stream`. Empty when there is no start code.
[[nodiscard]] std::vector<std::span<const std::uint8_t>> splitAnnexB(std::span<const std::uint8_t> stream);

// Parameter sets found in an Annex B byte stream, such as an encoder's global header or its first key frame.
struct ParameterSets {
    std::vector<std::vector<std::uint8_t>> sequence;
    std::vector<std::vector<std::uint8_t>> picture;
};
[[nodiscard]] ParameterSets parameterSetsOf(std::span<const std::uint8_t> annexB);

// Appends to `sample` the NAL units of an Annex B access unit, each with a 4-byte length (ISO/IEC 14496-15
// clause 5.3.2). Access unit delimiters, and parameter sets, which stand in the sample entry, are left out
// (clause 5.3.2: `avc1`). False, with `sample` as it was, when no slice is in it.
[[nodiscard]] bool appendLengthPrefixed(std::span<const std::uint8_t> annexB, std::vector<std::uint8_t>& sample);

// What the configuration record needs from a sequence parameter set (ISO/IEC 14496-10 clause 7.3.2.1.1).
struct SequenceInfo {
    std::uint8_t profile = 0;
    std::uint8_t compatibility = 0;
    std::uint8_t level = 0;
    bool hasChromaFields = false;  // the profile carries the three fields below
    std::uint8_t chromaFormat = 1;
    std::uint8_t bitDepthLumaMinus8 = 0;
    std::uint8_t bitDepthChromaMinus8 = 0;
};
// None when the NAL unit is not a readable sequence parameter set.
[[nodiscard]] std::optional<SequenceInfo> parseSequenceParameterSet(std::span<const std::uint8_t> nal);

}  // namespace lumacast::mp4
