#pragma once
#include <array>
#include <cstddef>
#include <cstdint>

#include "extensions/media/StereoSound.h"

namespace lumacast::extensions {

/// Lays the sounds of two sources on one time line, by their times, and adds them up. Where nobody has sound there is
/// silence. Not thread-safe.
class SoundMixer final {
public:
    static constexpr std::size_t kSources = 2;

    explicit SoundMixer(int rate) : rate_(rate) {}

    /// Adds sound that begins `start` samples after zero. Times that are off by less than 20 ms from where the source's
    /// last sound ended are jitter. What comes too late, or more than ten seconds early, is left out.
    void add(std::size_t source, const StereoSound& sound, std::int64_t start);
    /// The mix from where the last one ended, as far as it is known: up to where all sources have sound, and where one
    /// has not, up to 200 ms before `now` (samples after zero).
    StereoSound take(std::int64_t now);
    /// What is left, up to `end`.
    StereoSound takeAll(std::int64_t end) { return takeUntil(end); }
    /// Samples after zero at which the next mix begins.
    std::int64_t position() const { return position_; }

private:
    StereoSound takeUntil(std::int64_t end);

    const int rate_;
    StereoSound mixed_;  ///< from position_
    std::int64_t position_ = 0;
    std::array<std::int64_t, kSources> ends_{};  ///< where each source's sound ends
};

}  // namespace lumacast::extensions
