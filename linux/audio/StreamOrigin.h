#pragma once
// When a stream began to be heard, from accounts that are late now and then.

#include <cstdint>
#include <optional>

#include "base/Date.h"

namespace lumacast::sound {

/// What a server said of a recording at one moment.
struct StreamAccount {
    HostTime now;              ///< the moment at which it is looked at
    std::uint64_t age = 0;     ///< how long before that it was said; microseconds, as the following
    std::int64_t frames = 0;   ///< that had been counted by then; more than are ever recorded is taken for nonsense
    std::uint64_t latency = 0; ///< how long before that the last of them had been heard
    std::uint64_t delay = 0;   ///< how long after that the last of them is heard
};

/// When the recording's first frame was heard, by that account; whatever it says, within some years of now.
HostTime originBy(const StreamAccount& account, double rate);
/// When frame `frame` is heard of a stream with that origin, under the same limits.
HostTime momentOf(HostTime origin, std::int64_t frame, double rate);

/// Keeps the moment at which the first frame of a stream was heard. Each account of it may be late, by how long the
/// answer took and by how much was heard but not counted yet, and none is early: so the earliest one of the last
/// seconds is the best. Not thread-safe.
class StreamOrigin final {
public:
    /// An account, made at `now`.
    void take(HostTime now, HostTime origin);
    /// What was said up to now is no longer true: the stream was interrupted.
    void forget() { earliest_ = earliestBefore_ = std::nullopt; }
    /// None when nothing was said yet.
    std::optional<HostTime> origin() const;

private:
    /// Accounts count for so many nanoseconds, and for twice as many at most: the clocks drift.
    static constexpr std::int64_t kWindow = 1'000'000'000;

    std::optional<HostTime> earliest_, earliestBefore_;
    HostTime windowBegan_;
};

}  // namespace lumacast::sound
