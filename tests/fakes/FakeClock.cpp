#include "tests/fakes/FakeClock.h"

#include <cmath>

namespace lumacast {

HostTime FakeClock::hostTime() const {
    const HostTime base = source_ ? source_() : HostTime{};
    const std::lock_guard lock(mutex_);
    return {base.nanoseconds + advanced_};
}

Date FakeClock::now() const {
    const double elapsed = static_cast<double>(hostTime().nanoseconds) / 1e9;
    const std::lock_guard lock(mutex_);
    return {wallAtZero_ + elapsed};
}

CalendarFields FakeClock::localCalendar(Date date) const {
    std::int64_t seconds = static_cast<std::int64_t>(std::floor(date.secondsSince1970));
    {
        const std::lock_guard lock(mutex_);
        seconds += secondsEast_;
    }
    constexpr std::int64_t kDay = 86400;
    const std::int64_t day = seconds >= 0 ? seconds / kDay : -((-seconds + kDay - 1) / kDay);
    const std::int64_t rest = seconds - day * kDay;
    // Days since 0000-03-01, then 400-year eras: the leap day is the last day of such a year.
    const std::int64_t shifted = day + 719468;
    const std::int64_t era = (shifted >= 0 ? shifted : shifted - 146096) / 146097;
    const std::int64_t dayOfEra = shifted - era * 146097;
    const std::int64_t yearOfEra = (dayOfEra - dayOfEra / 1460 + dayOfEra / 36524 - dayOfEra / 146096) / 365;
    const std::int64_t dayOfYear = dayOfEra - (365 * yearOfEra + yearOfEra / 4 - yearOfEra / 100);
    const std::int64_t monthFromMarch = (5 * dayOfYear + 2) / 153;
    CalendarFields fields;
    fields.day = static_cast<int>(dayOfYear - (153 * monthFromMarch + 2) / 5 + 1);
    fields.month = static_cast<int>(monthFromMarch < 10 ? monthFromMarch + 3 : monthFromMarch - 9);
    fields.year = static_cast<int>(yearOfEra + era * 400 + (fields.month <= 2 ? 1 : 0));
    fields.hour = static_cast<int>(rest / 3600);
    fields.minute = static_cast<int>(rest / 60 % 60);
    fields.second = static_cast<int>(rest % 60);
    return fields;
}

void FakeClock::startCaptureClock() {
    auto made = std::make_shared<CaptureClock>([this] { return hostTime(); });
    const std::lock_guard lock(mutex_);
    captureClock_.swap(made);
}

std::shared_ptr<CaptureClock> FakeClock::captureClock() const {
    const std::lock_guard lock(mutex_);
    return captureClock_;
}

void FakeClock::advance(std::chrono::nanoseconds duration) {
    const std::lock_guard lock(mutex_);
    advanced_ += duration.count();
}

void FakeClock::setWallTime(Date date) {
    const double difference = date.secondsSince1970 - now().secondsSince1970;
    const std::lock_guard lock(mutex_);
    wallAtZero_ += difference;
}

void FakeClock::setTimeZone(std::int64_t secondsEast) {
    const std::lock_guard lock(mutex_);
    secondsEast_ = secondsEast;
}

}  // namespace lumacast
