#pragma once
#include <mutex>

#include "platform/Clock.h"

namespace lumacast {

/// The machine's clocks: wall time from CLOCK_REALTIME, host time from CLOCK_MONOTONIC, the calendar of the zone the
/// user has set now (a change of zone counts from the next question on).
class LinuxClock final : public Clock {
public:
    Date now() const override;
    CalendarFields localCalendar(Date date) const override;
    HostTime hostTime() const override;
    void startCaptureClock() override;
    std::shared_ptr<CaptureClock> captureClock() const override;

    /// Host time without an object, for the port's other parts.
    static HostTime currentHostTime();

private:
    mutable std::mutex mutex_;
    std::shared_ptr<CaptureClock> captureClock_;
};

}  // namespace lumacast
