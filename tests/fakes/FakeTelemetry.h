#pragma once
#include <cerrno>
#include <mutex>
#include <vector>

#include "platform/TelemetryReporter.h"
#include "tests/fakes/FakeError.h"
#include "tests/fakes/FaultPlan.h"

namespace lumacast {

/// Keeps the events it was sent. A failing call ("TelemetryReporter.send") keeps nothing. Thread-safe.
class FakeTelemetry final : public TelemetryReporter {
public:
    struct Event {
        TelemetrySession session;
        TelemetryUser user;
        std::int64_t category = 0;
        std::int64_t type = 0;
        Dictionary payload;
    };

    explicit FakeTelemetry(FaultPlan& faults) : faults_(faults) {}

    std::optional<Error> send(const TelemetrySession& session, const TelemetryUser& user, std::int64_t category,
                              std::int64_t type, const Dictionary& payload) override {
        if (faults_.fails("TelemetryReporter.send")) return fakeSystemError(EIO);
        const std::lock_guard lock(mutex_);
        events_.push_back({session, user, category, type, payload});
        return std::nullopt;
    }

    std::vector<Event> events() const {
        const std::lock_guard lock(mutex_);
        return events_;
    }

private:
    FaultPlan& faults_;
    mutable std::mutex mutex_;
    std::vector<Event> events_;
};

}  // namespace lumacast
