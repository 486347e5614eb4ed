#pragma once

#include <cstdint>

#include "linux/media/mp4/BoxSink.h"
#include "linux/media/mp4/MovieLayout.h"

namespace lumacast::mp4 {

class BoxBuffer;

// How a file in fragments becomes an ordinary movie in place, at the finish and at a recovery alike. The order is what
// makes it safe: README.md lists what a reader sees after each step.

// The movie's index as it is appended, the final movie box inside a free one. False when the movie presents nothing; what
// is in `out` is of no use then.
[[nodiscard]] bool writeHiddenIndex(BoxBuffer& out, const FinalMovie& movie);

// Switches the file to the index that stands in it at `offset`, behind all of its media: size, sync, header, sync. False
// when the sink failed; the file then plays as it did, or as a finished movie.
[[nodiscard]] bool switchToIndex(BoxSink& sink, std::uint64_t offset);

// The last step alone, for a file that has the size.
[[nodiscard]] bool writeSwitchedHeader(BoxSink& sink);

inline constexpr std::uint64_t kHiddenMovieOffset = 8;  // of the movie box in the box that hides it

}  // namespace lumacast::mp4
