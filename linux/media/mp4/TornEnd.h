#pragma once

#include <cstdint>
#include <optional>
#include <vector>

namespace lumacast::mp4 {

class BoxBuffer;

// What a writer that was stopped anywhere left behind the last whole box of a file.
struct TornEnd {
    std::vector<std::uint8_t> header;  // the first bytes of a box's header, less than eight; mostly none
    // Where a reader looks for the next box: the file's size where all boxes are whole, more where one was torn. None:
    // nowhere, since the last box reaches to the end of the file whatever its length, or is none.
    std::optional<std::uint64_t> nextBox;
};

// Writes what must follow a file of `fileBytes` with this end before a box of `appended` bytes, so that a reader of the
// file sees no box begin in the middle of that one: the rest of the header, as one of a free box, and zeros up to where
// the next box is looked for. Less than `appended` bytes and eight, or, behind three bytes of a header, 64 KiB.
void writeBridge(BoxBuffer& out, const TornEnd& end, std::uint64_t fileBytes, std::uint64_t appended);

}  // namespace lumacast::mp4
