#pragma once

#include <cstdint>
#include <span>

namespace lumacast::mp4 {

// Where the bytes of one movie go. The writer appends from offset 0 on, and at the very end overwrites sixteen bytes
// near the beginning. Borrowed by the writer, which calls it on the lane the writer itself is called on.
//
// A sink may carry the calls out later, on a thread of its own, as long as it keeps their order and treats `sync` as a
// barrier. What fails after such a call has answered true is then the sink's to report; it must drop all later calls,
// so that what is in the file is always a prefix of what was asked for.
class BoxSink {
public:
    virtual ~BoxSink() = default;

    // Adds the bytes at the end. The span is valid during the call only. False: some prefix of them, or nothing, was
    // added.
    [[nodiscard]] virtual bool append(std::span<const std::uint8_t> bytes) = 0;

    // Replaces bytes that were appended before; never reaches past the end.
    [[nodiscard]] virtual bool overwrite(std::uint64_t offset, std::span<const std::uint8_t> bytes) = 0;

    // A barrier: everything before it is on the disk before anything after it. Asked for once a fragment, and twice at
    // the end. A sink that answers without doing it gives up what the movie survives of a power cut, nothing else.
    [[nodiscard]] virtual bool sync() = 0;
};

}  // namespace lumacast::mp4
