#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <vector>

#include "linux/media/mp4/MovieLayout.h"

namespace lumacast::mp4 {

inline constexpr std::uint32_t kMaxInitialMovieBytes = 256U << 10U;  // hundred times what ours take
inline constexpr std::int64_t kMaxMovieSeconds = 1LL << 30U;  // keeps sums of nanoseconds within 64 bits

// What the movie box at the beginning of a file in fragments says.
struct InitialMovie {
    MovieHead head;
    MovieNote note;
    std::vector<MovieTrack> tracks;  // as they were declared, with priming and fragmentSkip; without samples
};

// Reads a movie box, header included. None when it isn't, to the byte, what `writeInitialMovie` writes.
[[nodiscard]] std::optional<InitialMovie> readInitialMovie(std::span<const std::uint8_t> box);

// The duration in a movie header box's payload, in nanoseconds; none when it says none.
[[nodiscard]] std::optional<std::int64_t> movieDuration(std::span<const std::uint8_t> movieHeader);

// Of a final movie box's payload: how long the media of the track are by its own account, in ticks. None without one.
[[nodiscard]] std::optional<std::uint64_t> mediaDuration(std::span<const std::uint8_t> movie, std::uint32_t trackId);

}  // namespace lumacast::mp4
