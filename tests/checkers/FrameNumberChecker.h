#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "tests/checkers/FramesLog.h"

namespace lumacast::checkers {

class MovieReader;

/// A picture of the movie and the number found in it.
struct NumberedPicture {
    std::chrono::nanoseconds time{};
    std::optional<std::uint32_t> number;
    bool isMarked = false;  ///< it has the scene's mark
};

/// Numbers from `first` to `last`, both included.
struct NumberRange {
    std::uint32_t first = 0;
    std::uint32_t last = 0;
};

struct FrameExpectation {
    /// Each of these is in the movie.
    std::set<std::uint32_t> expected;
    /// No number between the movie's lowest and highest is missing, but for the forbidden ones. With a log only numbers
    /// in the log count.
    bool withoutGaps = false;
    /// Numbers drawn while the recording was paused: none of them is in the movie. Each range parts the movie into
    /// stretches with a time line of their own.
    std::vector<NumberRange> forbidden;
    /// How often a number may be repeated, over the whole movie. A picture delivered again because nothing changed is a
    /// repeat.
    std::size_t allowedRepeats = 0;
    std::size_t allowedUnreadable = 0;
    /// How many numbers may be missing, each between two that are there.
    std::size_t allowedMissing = 0;
    /// No two consecutive pictures are further apart.
    std::optional<std::chrono::nanoseconds> largestHole;
    /// When each frame was drawn: the pictures must keep that time line.
    std::optional<FramesLog> drawn;
    /// How far a picture may be from its place on the time line.
    std::chrono::nanoseconds lateness = std::chrono::milliseconds(25);
};

struct FrameFinding {
    enum class Kind {
        NoPictures,
        Unreadable,
        TimesNotRising,
        OutOfOrder,
        Doubled,
        Missing,
        Forbidden,
        Hole,
        Unlogged,
        Late
    };
    Kind kind;
    std::string text;
};

struct FrameReport {
    std::size_t pictures = 0;
    std::size_t unreadable = 0;
    std::size_t repeats = 0;
    std::optional<std::uint32_t> first;  ///< in the order of showing
    std::optional<std::uint32_t> last;
    bool orderOk = true;
    std::vector<std::uint32_t> missing;
    std::vector<std::uint32_t> forbidden;
    std::chrono::nanoseconds largestHole{};
    /// The farthest any picture is from its place on the time line of the log; none without a log.
    std::optional<std::chrono::nanoseconds> largestLateness;
    std::vector<FrameFinding> findings;

    [[nodiscard]] bool has(FrameFinding::Kind kind) const;
};

/// Judges pictures given in the order of showing.
///
/// The time line: in each stretch between two forbidden ranges the movie's clock and the host's may differ by any
/// constant. The constant is the median difference of the stretch; a picture is late (or early) by what remains. Only
/// the first picture of a number is judged, since a repeat is shown later than it was drawn.
[[nodiscard]] FrameReport checkFrameNumbers(const std::vector<NumberedPicture>& pictures,
                                            const FrameExpectation& expectation);

/// Reads the number and the mark of every picture; `quarterTurns` is how far the pictures were turned clockwise. False, with the
/// reason in the reader, when the movie can't be decoded to its end.
[[nodiscard]] bool readFrameNumbers(MovieReader& reader, std::vector<NumberedPicture>& pictures, int quarterTurns = 0);

}  // namespace lumacast::checkers
