#pragma once
#include <chrono>
#include <cstdio>
#include <functional>
#include <optional>
#include <string>

#include "base/Identifiers.h"
#include "client/Answers.h"
#include "client/lumacastctl/Form.h"
#include "client/lumacastctl/status/Status.h"

namespace lumacast::ctl {

struct RecordRequest {
    Size size;                       ///< of the display, pixels
    std::chrono::milliseconds duration{0};  ///< how long to record; 0 until the user stops it
    bool microphone = false;
    std::string output;              ///< where the movie goes, absolute; empty for the user's library
    /// Where it is broadcast instead; none: it is recorded.
    std::optional<client::BroadcastSetup> broadcast = std::nullopt;
};

/// The recording of the whole display in the daemon's status, if there is one.
std::optional<RunningRecording> displayRecording(const DaemonStatus& status);

/// "0:05.0   1.2 MB   300 frames": a line without its end.
std::string recordLine(const RunningRecording& recording);

/// Moves a movie to another place, on another file system too, never over a file that is there. Why it can't be, for
/// people; then the movie stays where it is.
std::optional<std::string> moveMovie(const std::string& from, const std::string& to);

/// What there is to tell of a broadcast's service information: its "viewURL", or an empty text.
std::string viewURLIn(const Value& serviceInfo);

/// `lumacastctl record --display` and `lumacastctl broadcast --display`: has the daemon whose sockets are in this directory record the whole display until
/// `stopWished` answers true or the duration is over, shows on `complaints` how far it is (a line that changes where that
/// is a terminal), and prints to `out` where the movie is, or where the broadcast
/// can be watched as soon as its extension says so. `stopWished` waits at most that long for a wish. `save` saves
/// the movie to the library and answers the exit status. Answers the process's exit status. Blocks meanwhile.
int recordDisplay(const std::string& runtimeDirectory, const RecordRequest& request, Screen progress, std::FILE* out,
                  std::FILE* complaints, const std::function<bool(std::chrono::milliseconds)>& stopWished,
                  const std::function<int(const std::string& movie)>& save);

}  // namespace lumacast::ctl
