#pragma once
#include <cstdint>

namespace lumacast {

/// The kinds of events in the telemetry's files. A session sends its summary when its recording stops.
inline constexpr std::int64_t kSummaryEvent = 1;
/// The port itself notes a movie that was being recorded when the process was told to end: nothing stops such a
/// recording, so no session has sent its summary. It tells what the movie tells.
inline constexpr std::int64_t kClosedAtEndEvent = 2;

}  // namespace lumacast
