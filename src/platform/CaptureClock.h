#pragma once
// The clock of one recording.

#include <array>
#include <cstddef>
#include <functional>
#include <mutex>
#include <optional>
#include <utility>

#include "base/Date.h"
#include "writer/media/MediaTime.h"

namespace lumacast {

/// Stamps the pictures and the sound of one recording. It starts at zero and stands; it runs from the first picture
/// delivered after a start of the capture source until the capture gate closes, so paused time does not exist on it.
/// Thread-safe (a leaf lock).
class CaptureClock final {
public:
    /// Ticks a second of every stamp of a recording, picture or sound.
    static constexpr std::int32_t kTimescale = 1'000'000'000;

    /// `hostTime` answers the machine's monotonic clock; callable from any lane.
    explicit CaptureClock(std::function<HostTime()> hostTime) : hostTime_(std::move(hostTime)) {}

    /// Lets the clock run, if it stands.
    void run() {
        const std::lock_guard lock(mutex_);
        if (running_) return;
        running_ = true;
        runningSince_ = hostTime_();
    }

    /// Stops the clock where it is, if it runs.
    void stand() {
        const std::lock_guard lock(mutex_);
        if (!running_) return;
        const HostTime until = hostTime_();
        ended_[nextEnded_] = Run{runningSince_, until, elapsed_};
        nextEnded_ = (nextEnded_ + 1) % ended_.size();
        elapsed_ += until.nanoseconds - runningSince_.nanoseconds;
        running_ = false;
    }

    bool isRunning() const {
        const std::lock_guard lock(mutex_);
        return running_;
    }

    /// The time on this clock.
    MediaTime now() const {
        const std::lock_guard lock(mutex_);
        const std::int64_t since = running_ ? hostTime_().nanoseconds - runningSince_.nanoseconds : 0;
        return MediaTime::make(elapsed_ + since, kTimescale);
    }

    /// The time on this clock at a moment up to now; none when it stood then, or where that is further back than the
    /// last four times it ran. For what is heard and arrives a little later.
    std::optional<MediaTime> at(HostTime moment) const {
        const std::lock_guard lock(mutex_);
        if (running_ && moment >= runningSince_)
            return MediaTime::make(elapsed_ + moment.nanoseconds - runningSince_.nanoseconds, kTimescale);
        for (const Run& run : ended_)
            if (moment >= run.since && moment < run.until)
                return MediaTime::make(run.elapsedBefore + moment.nanoseconds - run.since.nanoseconds, kTimescale);
        return std::nullopt;
    }

private:
    struct Run {
        HostTime since, until;
        std::int64_t elapsedBefore = 0;
    };

    const std::function<HostTime()> hostTime_;
    mutable std::mutex mutex_;
    bool running_ = false;
    std::int64_t elapsed_ = 0;
    HostTime runningSince_;
    std::array<Run, 4> ended_{};
    std::size_t nextEnded_ = 0;
};

}  // namespace lumacast
