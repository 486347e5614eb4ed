#pragma once
#include <cstdint>
#include <optional>

#include "base/Value.h"

namespace lumacast {

/// Who reports, as the telemetry service wants it.
struct TelemetrySession {
    std::int64_t clientType = 0;
    std::int64_t clientVersion = 0;
    std::int64_t sessionIdentifier = 0;
    bool batchEvent = false;
    bool requireUserInfo = false;
};

struct TelemetryUser {
    std::string clientName;
    std::string serviceName;
};

/// One-shot sending of usage events to the device's telemetry. Callable from any lane; must not block on the receiver.
class TelemetryReporter {
public:
    virtual ~TelemetryReporter() = default;
    /// The error when the event could not be handed over.
    virtual std::optional<Error> send(const TelemetrySession& session, const TelemetryUser& user, std::int64_t category,
                                      std::int64_t type, const Dictionary& payload) = 0;
};

}  // namespace lumacast
