#pragma once

#include <cstdint>
#include <optional>
#include <variant>

#include "linux/media/mp4/InitialMovie.h"
#include "linux/media/mp4/TornEnd.h"

namespace lumacast::mp4 {

class BoxSource;

// Why a file in fragments can't be read back.
enum class UnreadableMovie : std::uint8_t {
    sourceFailed,
    notOurs,       // the movie box is not one that this writer writes
    copy,          // no recording
    nothingWhole,  // it has no whole fragment
    damaged,       // fragments that players show can't be read, or there is more than a crash leaves
    tooLong,       // more samples than are worth the memory of an index
};

// A movie that was not finished, read back from its fragments.
struct UnfinishedMovie {
    InitialMovie initial;  // its tracks with their samples, on a time line on which the fragments' movie begins at 0
    std::uint32_t fragments = 0;
    std::uint64_t fileBytes = 0;
    TornEnd end;
    // Where an index that somebody appended begins, if one fills the file's end.
    std::optional<std::uint64_t> hiddenIndex;

    // The beginning that was given to it. None: its tracks decide.
    [[nodiscard]] std::optional<std::int64_t> start() const {
        return initial.note.hasOwnStart ? std::optional<std::int64_t>(0) : std::nullopt;
    }
    [[nodiscard]] FinalMovie withIndex(std::optional<NoteKind> note) const {
        return {initial.head, initial.tracks, start(), note};
    }
};

// Just its movie box: for a look.
[[nodiscard]] std::variant<InitialMovie, UnreadableMovie> readInitialMovie(BoxSource& source);

// Reads the whole file whose reserve is still one. Takes every sample of every fragment that is shown to players; of
// newer ones, which are not shown yet, those that are surely there (SampleCheck.h), as far as each track has no hole.
// Time and memory grow with the number of samples, not with their bytes.
[[nodiscard]] std::variant<UnfinishedMovie, UnreadableMovie> readUnfinishedMovie(BoxSource& source);

}  // namespace lumacast::mp4
