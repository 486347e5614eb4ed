#pragma once
// The usage record of one recording.

#include <cstdint>
#include <mutex>
#include <optional>
#include <string>

#include "base/Identifiers.h"
#include "base/Value.h"
#include "platform/TelemetryReporter.h"

namespace lumacast {

class Log;

/// What one recording counts.
struct UsageMetrics {
    double activeDuration = 0;  ///< seconds of active capture
    Size videoCaptureSize;
    std::int64_t videoCaptureRate = 0;  ///< frames per second
    std::int64_t videoFrameCount = 0;
    std::int64_t appAudioFrameCount = 0;
    std::int64_t micFrameCount = 0;
    bool frontCameraUsed = false;
    bool backCameraUsed = false;
    std::uint64_t recordedFileSize = 0;  ///< bytes
    std::int64_t endReason = 0;
};

/// Collects the counters of one recording and sends them as one event; keeps no history. Thread-safe (a leaf lock
/// around the counters): frames, sound and requests count from their own lanes.
class LCReportingAgent {
public:
    /// `initWithServiceName:` — all counters zero, all flags false.
    LCReportingAgent(Log& log, TelemetryReporter& telemetry, std::string serviceName)
        : log_(log), telemetry_(telemetry), serviceName_(std::move(serviceName)) {}

    const std::string& serviceName() const { return serviceName_; }
    UsageMetrics metrics() const;
    /// Changes counters in place; `change` must not call out.
    template <class Change>
    void update(Change change) {
        const std::lock_guard lock(mutex_);
        change(metrics_);
    }

    /// `collectSummaryEventMetrics` — the 15 entries of the summary.
    Dictionary collectSummaryEventMetrics() const;

    /// `reportEventWithType:dictionary:` — prints and sends one event; a missing payload is logged and sends nothing, a
    /// failure to send is only logged.
    void reportEventWithType(std::int64_t type, const std::optional<Dictionary>& dictionary);

    /// The type of the summary event.
    static constexpr std::int64_t kSummaryEvent = 1;

private:
    Log& log_;
    TelemetryReporter& telemetry_;
    const std::string serviceName_;
    mutable std::mutex mutex_;
    UsageMetrics metrics_;
};

}  // namespace lumacast
