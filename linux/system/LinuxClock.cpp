#include "linux/system/LinuxClock.h"

#include <time.h>

#include <algorithm>
#include <cmath>

namespace lumacast {

HostTime LinuxClock::currentHostTime() {
    timespec time{};
    ::clock_gettime(CLOCK_MONOTONIC, &time);
    return HostTime{static_cast<std::int64_t>(time.tv_sec) * 1'000'000'000 + time.tv_nsec};
}

Date LinuxClock::now() const {
    timespec time{};
    ::clock_gettime(CLOCK_REALTIME, &time);
    return Date{static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9};
}

CalendarFields LinuxClock::localCalendar(Date date) const {
    // Beyond some ten thousand years the calendar's fields make no sense; such a date counts as the nearest that does.
    constexpr double kFarthest = 253'402'214'400;  // 9999-12-31
    const double seconds = std::isnan(date.secondsSince1970) ? 0 : date.secondsSince1970;
    const auto moment = static_cast<time_t>(std::floor(std::clamp(seconds, -kFarthest / 5, kFarthest)));
    ::tzset();  // localtime_r alone would keep the zone of its first call for ever
    tm fields{};
    if (!::localtime_r(&moment, &fields)) return {};
    return CalendarFields{fields.tm_year + 1900, fields.tm_mon + 1, fields.tm_mday,
                          fields.tm_hour,        fields.tm_min,     std::min(fields.tm_sec, 59)};
}

HostTime LinuxClock::hostTime() const { return currentHostTime(); }

void LinuxClock::startCaptureClock() {
    auto clock = std::make_shared<CaptureClock>(&LinuxClock::currentHostTime);
    const std::lock_guard lock(mutex_);
    captureClock_ = std::move(clock);
}

std::shared_ptr<CaptureClock> LinuxClock::captureClock() const {
    const std::lock_guard lock(mutex_);
    return captureClock_;
}

}  // namespace lumacast
