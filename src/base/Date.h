#pragma once
// Wall-clock dates and their calendar fields.

#include <compare>
#include <cstdint>

namespace lumacast {

/// A moment of wall time: seconds since 1970-01-01 00:00:00 UTC, with fractions. It may jump when the clock is set.
struct Date {
    double secondsSince1970 = 0;
    auto operator<=>(const Date&) const = default;
};

/// Seconds from `from` to `to`; negative when the clock was set back meanwhile.
inline double secondsBetween(Date from, Date to) { return to.secondsSince1970 - from.secondsSince1970; }

/// A date in the local time zone's Gregorian calendar.
struct CalendarFields {
    int year = 1970, month = 1, day = 1;       ///< month 1..12, day 1..31
    int hour = 0, minute = 0, second = 0;      ///< hour 0..23
};

/// A moment on the machine's monotonic clock, in nanoseconds. Not comparable between machines or across a reboot.
struct HostTime {
    std::int64_t nanoseconds = 0;
    auto operator<=>(const HostTime&) const = default;
};

}  // namespace lumacast
