#pragma once

#include <cstdint>
#include <optional>
#include <span>

#include "linux/media/mp4/MovieNote.h"
#include "linux/media/mp4/MovieTrack.h"

namespace lumacast::mp4 {

class BoxBuffer;

// The boxes around the fragments and what stands where; README.md draws the file.

inline constexpr std::uint64_t kReserveOffset =
    32;  // of the 16 reserved bytes, behind the file type; within one disk sector
inline constexpr std::uint64_t kReserveSizeOffset = kReserveOffset + 8;  // of their payload: the future 64-bit size

struct MovieHead {
    std::uint32_t timescale = 0;     // ticks per second of the movie
    std::uint64_t creationTime = 0;  // seconds since 1904 began, UTC
};

// The file type box and the reserve, a free box of 16 bytes.
void writeFileStart(BoxBuffer& out);

// When the movie begins, on the tracks' common time line: with its first picture, or without any with the first real
// sound. At least one track must have a sample.
[[nodiscard]] std::int64_t movieStartNanoseconds(std::span<const MovieTrack> tracks);

// `start` below: the same where it is not left to the tracks.

// Decides how stamps become decoding times in fragments (fragmentOffset, fragmentSkip), so that none is negative. A
// track that has no sample yet is expected not to begin before the others, or before the movie if they begin later.
void placeFragments(std::span<MovieTrack> tracks, std::optional<std::int64_t> start);

// The movie box of a file in fragments: every track declared, none with samples, and an edit list where ticks are
// skipped.
void writeInitialMovie(BoxBuffer& out, const MovieHead& head, std::span<const MovieTrack> tracks,
                       const MovieNote& note);

struct FinalMovie {
    MovieHead head;
    std::span<const MovieTrack> tracks;
    std::optional<std::int64_t> start;
    std::optional<NoteKind> note;  // in a movie that somebody else finishes
};

// The movie box of the finished file: every track that has something to present, with its complete tables. False, and
// nothing is written, when no track has.
[[nodiscard]] bool writeFinalMovie(BoxBuffer& out, const FinalMovie& movie);

// An upper bound of the bytes of the final movie box's tables.
[[nodiscard]] std::size_t finalTableBytes(std::span<const MovieTrack> tracks);

}  // namespace lumacast::mp4
