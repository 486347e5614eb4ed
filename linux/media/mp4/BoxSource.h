#pragma once

#include <cstdint>
#include <span>

namespace lumacast::mp4 {

// Where the bytes of a movie that is there already come from. Borrowed by who reads it, which calls it on its own lane.
// What it holds may be anybody's: nothing that is read is trusted.
class BoxSource {
public:
    virtual ~BoxSource() = default;

    // Bytes in the file.
    [[nodiscard]] virtual std::uint64_t size() const = 0;

    // Fills `bytes` from `offset` on. False: that many are not there, or they can't be read; `bytes` then holds anything.
    [[nodiscard]] virtual bool read(std::uint64_t offset, std::span<std::uint8_t> bytes) = 0;
};

}  // namespace lumacast::mp4
