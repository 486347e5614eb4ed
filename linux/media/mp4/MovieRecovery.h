#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "linux/media/mp4/BoxSink.h"
#include "linux/media/mp4/BoxSource.h"

namespace lumacast::mp4 {

enum class Recovery : std::uint8_t {
    recovered,       // it has its index now: all that its fragments have
    completed,       // it only had to be switched to an index that stood in it already
    finished,        // it is an ordinary movie; nothing to do
    unfinishedCopy,  // a copy of another movie, which was to be written to its end or not at all
    notOurs,         // no file of this writer
    nothingWhole,    // no whole fragment
    damaged,         // a file of this writer with something in it that no crash leaves
    tooLong,         // its index would take more memory than that is worth
    sourceFailed,    // it can't be read
    sinkFailed,      // it plays as it did before
};
[[nodiscard]] std::string_view nameOf(Recovery result);

// Writes the index of a movie whose recording was cut off, so that it becomes an ordinary movie, in the same file and
// without touching its media (README.md tells how, and what is taken). The sink appends to what the source reads. Only
// recovered, completed and sinkFailed have written anything.
//
// Cut off in turn, at any byte, the file plays as it did before, and can be given to this function again.
//
// Pure, on the caller's lane; blocks as long as source and sink do. Time and memory grow with the number of samples: 8
// bytes each, and 20 for a moment. Safe on any bytes.
[[nodiscard]] Recovery recoverMovie(BoxSource& source, BoxSink& sink);

}  // namespace lumacast::mp4
