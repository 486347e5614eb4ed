#include "linux/system/ClosedMovieEvent.h"

#include <cmath>

#include "base/RecordingErrorCodes.h"
#include "linux/system/UsageEvents.h"

namespace lumacast {

void reportEndedWithProcess(TelemetryReporter& telemetry, const EndedWithProcess& recording) {
    // As a session's summary is sent, so that the lines are alike.
    constexpr std::int64_t kClientType = 23, kClientVersion = 1, kCategory = 2;
    const Dictionary payload{{"ActiveDuration", static_cast<std::int64_t>(std::llround(recording.seconds))},
                             {"VideoCaptureWidth", std::int64_t{recording.width}},
                             {"VideoCaptureHeight", std::int64_t{recording.height}},
                             {"VideoFrameCount", recording.pictures},
                             {"RecordedFileSize", recording.bytes},
                             {"EndReason", static_cast<std::int64_t>(RecordingErrorCode::Interrupted)}};
    // Nobody is left to be told when it can't be noted.
    (void)telemetry.send({kClientType, kClientVersion, 0, true, true}, {"Lumacast", ""}, kCategory, kClosedAtEndEvent,
                         payload);
}

}  // namespace lumacast
