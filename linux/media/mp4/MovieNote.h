#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <vector>

#include "linux/media/mp4/MovieTrack.h"

namespace lumacast::mp4 {

class BoxBuffer;

// What this writer notes in a movie box for itself: a box of a type of its own (`uuid`, ISO/IEC 14496-12 clause 11.1),
// which every reader passes over, always the last one of the movie box. Its payload, behind the type's 16 bytes:
// u8 version (1), u8 kind, u16 flags, then for a movie that is still being written a u32 for each track, the priming.
enum class NoteKind : std::uint8_t {
    recording = 1,  // in the movie box at the beginning: what stands here can't be had again
    copy = 2,       // the same of a movie that is made of another one and can be made again
    recovered = 3,  // in the final movie box: whoever wrote this movie did not finish it
};

struct MovieNote {
    NoteKind kind = NoteKind::recording;
    bool hasOwnStart = false;             // the movie's beginning was given, not left to its tracks
    std::vector<std::uint32_t> primings;  // ticks, of each track in order; none in a final movie box
};

void writeNote(BoxBuffer& out, const MovieNote& note);
[[nodiscard]] MovieNote noteOf(NoteKind kind, bool hasOwnStart, std::span<const MovieTrack> tracks);

// Of the box's payload; none when it is not such a note.
[[nodiscard]] std::optional<MovieNote> readNote(std::span<const std::uint8_t> payload);

// The length of the whole box of a note without primings.
inline constexpr std::uint32_t kShortNoteBytes = 8 + 16 + 4;

}  // namespace lumacast::mp4
