#pragma once
#include <cstdint>

#include "platform/TelemetryReporter.h"

namespace lumacast {

/// What is known of a recording that ran when the process was told to end.
struct EndedWithProcess {
    double seconds = 0;
    int width = 0, height = 0;
    std::uint64_t pictures = 0;
    std::uint64_t bytes = 0;
};

/// Notes it: an event of the kind kClosedAtEndEvent, with the entries of a summary that the port knows and as its end
/// reason "interrupted" (-5806). The port does not know which kind of recording it was: the service has no name.
void reportEndedWithProcess(TelemetryReporter& telemetry, const EndedWithProcess& recording);

}  // namespace lumacast
