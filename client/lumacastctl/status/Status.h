#pragma once
// What the daemon says of itself, as its administrator reads it.

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace lumacast::ctl {

/// A recording that goes on. What the daemon does not say is absent.
struct RunningRecording {
    bool paused = false;
    double elapsedSeconds = 0;  ///< without the pauses
    std::optional<std::string> path;
    std::optional<double> width, height;  ///< of the movie, pixels
    std::optional<std::uint64_t> bytes;   ///< written to the file up to now
    std::optional<std::uint64_t> frames;    ///< that the recording took from the capture
    std::optional<std::uint64_t> recorded;  ///< of them, those that are in the movie
    std::optional<std::uint64_t> delivered, dropped;  ///< by the capture
    std::optional<std::string> extension;             ///< that carries it as a broadcast
    std::optional<std::uint64_t> leftOut;             ///< frames that the extension was too slow for
};

/// An application the daemon knows.
struct ApplicationSession {
    std::string application;  ///< its bundle identifier
    std::optional<std::int64_t> pid;
    bool connected = false;
    bool wholeDisplay = false;  ///< its last recording is one of the whole display
    std::optional<RunningRecording> recording;
};

struct DaemonStatus {
    std::string temporaryDirectory;
    std::uint64_t freeBytes = 0;  ///< where the temporary directory is; 0 when the daemon can't tell
    std::vector<ApplicationSession> sessions;
};

/// Reads the admin service's answer to `status`. Else why it is none, for people: the daemon's own error, or that the
/// answer can't be understood. Pure; entries that are unknown are passed over.
std::variant<DaemonStatus, std::string> readStatus(std::string_view answer);

/// The status for people, several lines with a newline each: the running recording, the applications, the free space.
std::string statusText(const DaemonStatus& status);

/// The running recordings as a table, a line each: application, state, elapsed time, size of the file, frames recorded
/// and frames dropped ("-" for what the daemon does not say); or one line that says that there is none.
std::string recordingsTable(const DaemonStatus& status);

}  // namespace lumacast::ctl
