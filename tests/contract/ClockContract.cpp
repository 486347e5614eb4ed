#include <gtest/gtest.h>
#include <stdlib.h>
#include <time.h>

#include <functional>

#include "linux/system/LinuxClock.h"
#include "tests/fakes/FakeClock.h"

namespace lumacast {
namespace {

class ClockWorld {
public:
    virtual ~ClockWorld() = default;
    virtual Clock& clock() = 0;
    /// Lets at least a millisecond pass on the machine's clock.
    virtual void passTime() = 0;
    /// The user lives two hours east of Greenwich, summer and winter.
    virtual void moveEast() = 0;
};

class FakeClockWorld final : public ClockWorld {
public:
    Clock& clock() override { return clock_; }
    void passTime() override { clock_.advance(std::chrono::milliseconds(3)); }
    void moveEast() override { clock_.setTimeZone(7200); }

private:
    FakeClock clock_;
};

class PortClockWorld final : public ClockWorld {
public:
    PortClockWorld() {
        if (const char* zone = ::getenv("TZ")) before_ = zone;
        ::setenv("TZ", "UTC0", 1);
    }
    ~PortClockWorld() override {
        if (before_)
            ::setenv("TZ", before_->c_str(), 1);
        else
            ::unsetenv("TZ");
        ::tzset();
    }
    Clock& clock() override { return clock_; }
    void passTime() override {
        const auto begin = std::chrono::steady_clock::now();
        while (std::chrono::steady_clock::now() - begin < std::chrono::milliseconds(1)) {}
    }
    void moveEast() override { ::setenv("TZ", "XYZ-2", 1); }

private:
    std::optional<std::string> before_;
    LinuxClock clock_;
};

using Maker = std::function<std::unique_ptr<ClockWorld>()>;

class ClockContract : public ::testing::TestWithParam<Maker> {
protected:
    static std::string text(const CalendarFields& f) {
        char buffer[80];
        std::snprintf(buffer, sizeof buffer, "%04d-%02d-%02d %02d:%02d:%02d", f.year, f.month, f.day, f.hour, f.minute,
                      f.second);
        return buffer;
    }
    std::unique_ptr<ClockWorld> world_ = GetParam()();
    Clock& clock_ = world_->clock();
};

TEST_P(ClockContract, HostTimeAndWallTimeGoOn) {
    const HostTime host = clock_.hostTime();
    const Date date = clock_.now();
    world_->passTime();
    EXPECT_GE(clock_.hostTime().nanoseconds - host.nanoseconds, 1'000'000);
    EXPECT_GT(secondsBetween(date, clock_.now()), 0);
}

TEST_P(ClockContract, TheDateIsOfThisCentury) {
    EXPECT_GE(clock_.localCalendar(clock_.now()).year, 2026);
    EXPECT_LT(clock_.localCalendar(clock_.now()).year, 2100);
}

TEST_P(ClockContract, DatesHaveTheirCalendarFields) {
    EXPECT_EQ(text(clock_.localCalendar(Date{0})), "1970-01-01 00:00:00");
    EXPECT_EQ(text(clock_.localCalendar(Date{1763270000})), "2025-11-16 05:13:20");
    EXPECT_EQ(text(clock_.localCalendar(Date{951782399})), "2000-02-28 23:59:59");
    EXPECT_EQ(text(clock_.localCalendar(Date{951782400})), "2000-02-29 00:00:00");
    EXPECT_EQ(text(clock_.localCalendar(Date{-1})), "1969-12-31 23:59:59");
}

TEST_P(ClockContract, FractionsBelongToTheSecondThatHasBegun) {
    EXPECT_EQ(text(clock_.localCalendar(Date{59.999})), "1970-01-01 00:00:59");
    EXPECT_EQ(text(clock_.localCalendar(Date{-0.5})), "1969-12-31 23:59:59");
}

TEST_P(ClockContract, TheCalendarIsTheUsers) {
    world_->moveEast();
    EXPECT_EQ(text(clock_.localCalendar(Date{0})), "1970-01-01 02:00:00");
    EXPECT_EQ(text(clock_.localCalendar(Date{79'200})), "1970-01-02 00:00:00");
}

TEST_P(ClockContract, BeforeTheFirstRecordingThereIsNoCaptureClock) { EXPECT_FALSE(clock_.captureClock()); }

TEST_P(ClockContract, ANewCaptureClockStandsAtZero) {
    clock_.startCaptureClock();
    const auto capture = clock_.captureClock();
    ASSERT_TRUE(capture);
    world_->passTime();
    EXPECT_FALSE(capture->isRunning());
    EXPECT_EQ(capture->now().seconds(), 0);
    EXPECT_EQ(capture->now().timescale, CaptureClock::kTimescale);
}

TEST_P(ClockContract, ACaptureClockCountsOnlyWhileItRuns) {
    clock_.startCaptureClock();
    const auto capture = clock_.captureClock();
    capture->run();
    world_->passTime();
    capture->stand();
    const double ran = capture->now().seconds();
    EXPECT_GE(ran, 0.001);
    world_->passTime();
    EXPECT_EQ(capture->now().seconds(), ran);
    capture->run();
    world_->passTime();
    EXPECT_GT(capture->now().seconds(), ran);
}

TEST_P(ClockContract, ALaterRecordingLeavesTheEarlierClockAlone) {
    clock_.startCaptureClock();
    const auto first = clock_.captureClock();
    first->run();
    world_->passTime();
    clock_.startCaptureClock();
    const auto second = clock_.captureClock();
    EXPECT_NE(first, second);
    EXPECT_TRUE(first->isRunning());
    EXPECT_FALSE(second->isRunning());
    EXPECT_EQ(clock_.captureClock(), second);
}

INSTANTIATE_TEST_SUITE_P(Fake, ClockContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeClockWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, ClockContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortClockWorld>(); })));

}  // namespace
}  // namespace lumacast
