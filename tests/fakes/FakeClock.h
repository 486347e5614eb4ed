#pragma once
#include <chrono>
#include <functional>
#include <mutex>

#include "platform/Clock.h"
#include "tests/fakes/SimScheduler.h"

namespace lumacast {

/// A clock that stands until the test moves it, or that follows another clock's host time. Wall time follows host time,
/// from 2026-01-15 12:00:00 UTC on; it can be set, host time can't go back. Thread-safe.
class FakeClock final : public Clock {
public:
    FakeClock() = default;
    /// Follows `hostTime`; advance adds to it.
    explicit FakeClock(std::function<HostTime()> hostTime) : source_(std::move(hostTime)) {}

    Date now() const override;
    CalendarFields localCalendar(Date date) const override;
    HostTime hostTime() const override;
    void startCaptureClock() override;
    std::shared_ptr<CaptureClock> captureClock() const override;

    void advance(std::chrono::nanoseconds duration);
    /// Sets the wall clock, as an administrator might; host time and capture clocks don't notice.
    void setWallTime(Date date);
    /// Seconds east of UTC; 0 at first.
    void setTimeZone(std::int64_t secondsEast);

private:
    static constexpr double kFirstDate = 1'768'478'400;

    const std::function<HostTime()> source_;
    mutable std::mutex mutex_;
    std::int64_t advanced_ = 0;
    double wallAtZero_ = kFirstDate;
    std::int64_t secondsEast_ = 0;
    std::shared_ptr<CaptureClock> captureClock_;
};

/// The clock of a simulation: follows its virtual time. The scheduler outlives the clock and its capture clocks.
inline std::unique_ptr<FakeClock> makeSimClock(const SimScheduler& scheduler) {
    return std::make_unique<FakeClock>([&scheduler] { return scheduler.now(); });
}

}  // namespace lumacast
