#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "linux/media/mp4/BoxSource.h"

namespace lumacast::mp4 {

enum class MovieState : std::uint8_t {
    other,           // no movie of this writer
    unfinished,      // a recording that is being written, or was cut off
    unfinishedCopy,  // the same of a copy
    finished,
    recovered,       // an ordinary movie that a recovery made of a recording that was cut off
};
[[nodiscard]] std::string_view nameOf(MovieState state);

struct MovieLook {
    MovieState state = MovieState::other;
    std::optional<std::int64_t> nanoseconds;  // what a player shows as the movie's length
};

// What can be said of a file after a glance: a handful of small reads. Pure, on the caller's lane; blocks as long as the
// source does. Safe on any bytes; what can't be read is `other`.
[[nodiscard]] MovieLook lookAtMovie(BoxSource& source);

}  // namespace lumacast::mp4
