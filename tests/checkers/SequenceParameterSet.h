#pragma once

#include <cstdint>
#include <optional>
#include <span>

namespace lumacast::checkers {

/// Code points of ISO/IEC 23091-2.
struct ColourCodes {
    std::uint32_t primaries = 0;
    std::uint32_t transfer = 0;
    std::uint32_t matrix = 0;
    bool operator==(const ColourCodes&) const = default;
};

/// What a sequence parameter set says of the pictures (ISO/IEC 14496-10, 7.3.2.1.1 and E.1.1).
struct SequenceFormat {
    std::uint8_t profile = 0;
    std::uint8_t compatibility = 0;
    std::uint8_t level = 0;
    bool hasChromaFields = false;  ///< the profile carries the three fields below
    std::uint32_t chromaFormat = 1;
    std::uint32_t lumaDepth = 8;
    std::uint32_t chromaDepth = 8;
    std::uint32_t width = 0;  ///< pixels, cropped
    std::uint32_t height = 0;
    std::optional<bool> fullRange;
    std::optional<ColourCodes> colour;
};

/// Of a NAL unit with its header byte; none when it is not a readable sequence parameter set.
[[nodiscard]] std::optional<SequenceFormat> readSequenceParameterSet(std::span<const std::uint8_t> nal);

}  // namespace lumacast::checkers
