#pragma once

#include <cstdint>
#include <span>
#include <string>

namespace lumacast::mp4::test {

// A file as text: each box with what it is, its own bytes as hexadecimal numbers of four bytes, those of its header first,
// and the boxes in it further to the right. All bytes are there, so equal texts are equal files. `before` is a part of the
// file that is left out where it appears in an mdat, and named instead: what was recorded, in the finished movie.
[[nodiscard]] std::string dumpOf(std::span<const std::uint8_t> file, std::span<const std::uint8_t> before = {});

}  // namespace lumacast::mp4::test
