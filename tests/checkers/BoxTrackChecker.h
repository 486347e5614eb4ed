#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <vector>

#include "tests/checkers/BoxChecker.h"

namespace lumacast::checkers {

/// A box and where its content begins in the file.
struct Box {
    std::string type;
    std::uint64_t offset = 0;  ///< of the content
    std::span<const std::uint8_t> content;
};

/// A run of bytes in the file.
struct Extent {
    std::uint64_t begin = 0;
    std::uint64_t end = 0;
};

/// The boxes that fill `bytes`, the first at file offset `offset`. What doesn't nest exactly becomes a finding about
/// `inside`.
[[nodiscard]] std::vector<Box> boxesIn(std::span<const std::uint8_t> bytes, std::uint64_t offset,
                                       const std::string& inside, Findings& findings);

/// The only box of this type; none or several is a finding about `inside` and gives nothing.
[[nodiscard]] const Box* onlyBox(const std::vector<Box>& boxes, const std::string& type, const std::string& inside,
                                 Findings& findings);

/// Checks one `trak`. Chunks must lie within `media`; all of them are added to `chunks`.
[[nodiscard]] BoxTrack checkTrack(const Box& trak, std::uint32_t movieTimescale, const std::vector<Extent>& media,
                                  std::vector<Extent>& chunks, Findings& findings);

}  // namespace lumacast::checkers
