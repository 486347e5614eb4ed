#pragma once
#include <chrono>
#include <cstdint>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "base/Log.h"

namespace lumacast {

/// Folds a log line that comes again and again without another in between: it is written once, and then how often it
/// came. Holds one line at most. Thread-safe; nothing waits.
class RepeatedLines final {
public:
    using Moment = std::chrono::steady_clock::time_point;
    /// A line that is said once in so long is not folded, and a run that goes on is told of so often.
    static constexpr std::chrono::seconds kTellEvery{10};

    struct Line {
        LogLevel level = LogLevel::Default;
        std::string text;
    };
    struct Folded {
        std::optional<Line> before;   ///< what is to be written first: the end of a run
        bool isWritten = true;        ///< whether the line itself is to be written
    };

    /// What becomes of this line.
    Folded take(LogLevel level, std::string_view text, Moment now);
    /// What is still to be told of a run, which ends with that.
    std::optional<Line> end();

private:
    std::optional<Line> tellLocked();

    std::mutex mutex_;  // guards the rest
    std::optional<Line> line_;
    std::uint64_t repeats_ = 0;  ///< that nobody has been told of
    Moment told_{};
};

}  // namespace lumacast
