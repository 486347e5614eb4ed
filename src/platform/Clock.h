#pragma once
#include <memory>

#include "base/Date.h"
#include "platform/CaptureClock.h"

namespace lumacast {

/// Wall time, the machine's monotonic time, and the capture clock of the current recording. Callable from any lane;
/// never blocks.
class Clock {
public:
    virtual ~Clock() = default;

    virtual Date now() const = 0;
    /// `date` in the local time zone, Gregorian calendar.
    virtual CalendarFields localCalendar(Date date) const = 0;
    virtual HostTime hostTime() const = 0;

    /// Makes a new capture clock, at zero and standing, the current one. Called when a recording starts.
    virtual void startCaptureClock() = 0;
    /// The current capture clock; null before the first recording. Capture sources take it when their gate opens and
    /// container writers when they are made, and keep it: a later recording's clock does not touch them.
    virtual std::shared_ptr<CaptureClock> captureClock() const = 0;
};

}  // namespace lumacast
