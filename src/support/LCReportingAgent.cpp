#include "support/LCReportingAgent.h"

#include <cmath>

#include "base/Log.h"

namespace lumacast {

namespace {

/// The agent does not measure audio rates; these two are deliberately fixed.
constexpr std::int64_t kAppAudioCaptureRate = 2;
constexpr std::int64_t kMicCaptureRate = 43;

constexpr TelemetrySession kSession{23, 1, 0, true, true};
constexpr std::int64_t kCategory = 2;

/// To single precision and then to the nearest whole number.
std::int64_t rounded(double value) {
    const float single = static_cast<float>(value);
    return std::abs(single) < 0x1p63F ? std::llround(single) : 0;  // what no whole number is near counts as 0
}

}  // namespace

UsageMetrics LCReportingAgent::metrics() const {
    const std::lock_guard lock(mutex_);
    return metrics_;
}

Dictionary LCReportingAgent::collectSummaryEventMetrics() const {
    const UsageMetrics m = metrics();
    return {
        {"ActiveDuration", rounded(m.activeDuration)},
        {"VideoCaptureWidth", rounded(m.videoCaptureSize.width)},
        {"VideoCaptureHeight", rounded(m.videoCaptureSize.height)},
        {"VideoCaptureRate", m.videoCaptureRate},
        {"VideoFrameCount", m.videoFrameCount},
        {"AppAudioCaptureRate", kAppAudioCaptureRate},
        {"AppAudioFrameCount", m.appAudioFrameCount},
        {"MicCaptureRate", kMicCaptureRate},
        {"MicFrameCount", m.micFrameCount},
        {"FrontCameraUsed", m.frontCameraUsed},
        {"BackCameraUsed", m.backCameraUsed},
        {"RecordedFileSize", m.recordedFileSize},
        // Deliberately always empty: which application or extension was recorded is not reported.
        {"BroadcastExtensionBundleID", ""},
        {"ClientAppBundleID", ""},
        {"EndReason", m.endReason},
    };
}

void LCReportingAgent::reportEventWithType(std::int64_t type, const std::optional<Dictionary>& dictionary) {
    if (!dictionary) {
        log_.error("LCReportingAgent: payloadDict cannot be null!");
        return;
    }
    log_.print("LCReportingAgent: reportingEvent:%d payload:%@", type, describe(Value(*dictionary)));
    const TelemetryUser user{"Lumacast", serviceName_};
    if (const auto error = telemetry_.send(kSession, user, kCategory, type, *dictionary))
        log_.error("eventType:%d error code %d.", type, error->code());
}

}  // namespace lumacast
