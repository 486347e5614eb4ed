#pragma once
#include <algorithm>
#include <chrono>
#include <mutex>

namespace lumacast {

/// How many lines may be written: a burst, and so many a second for ever (a token bucket). A peer that comes and goes as
/// fast as it can has a few lines of the log each time; without a limit it fills the disk. Thread-safe; nothing waits.
class LineQuota final {
public:
    using Moment = std::chrono::steady_clock::time_point;
    /// What a busy day's worst minute has, several times over.
    static constexpr double kBurst = 2000;
    static constexpr double kPerSecond = 50;

    /// Whether one more line may be written now; if so it counts.
    bool take(Moment now) {
        const std::lock_guard lock(mutex_);
        const std::chrono::duration<double> passed = now - last_;
        last_ = now;
        left_ = std::min(kBurst, left_ + std::max(0.0, passed.count()) * kPerSecond);
        if (left_ < 1) return false;
        left_ -= 1;
        return true;
    }

private:
    std::mutex mutex_;
    Moment last_{};
    double left_ = kBurst;
};

}  // namespace lumacast
