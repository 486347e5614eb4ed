#pragma once
#include <algorithm>
#include <cstdint>

#include "linux/media/VideoEncoder.h"

namespace lumacast::media {

/// What was spent ahead of a bit rate: it drains at that rate by the stamps. Once a second's worth is spent ahead
/// there is no room. What goes beyond that, with one picture, or with key frames, which are coded whether there is room
/// or not, is paid back before the next picture. A value; belongs to the encoder's thread.
class RateCeiling final {
public:
    explicit RateCeiling(std::int64_t bitsPerSecond) : bitsPerSecond_(bitsPerSecond) {}

    /// Whether a picture of this stamp may be coded. Stamps (ticks of VideoEncoder::kTimescale) rise.
    bool hasRoom(std::int64_t stamp) {
        const double seconds = static_cast<double>(stamp - stamp_) / VideoEncoder::kTimescale;
        ahead_ = std::max(0.0, ahead_ - seconds * static_cast<double>(bitsPerSecond_));
        stamp_ = stamp;
        return ahead_ < static_cast<double>(bitsPerSecond_);
    }
    /// The size of what was coded for the stamp that was asked about last.
    void spend(std::size_t bytes) { ahead_ += 8.0 * static_cast<double>(bytes); }

private:
    std::int64_t bitsPerSecond_;
    std::int64_t stamp_ = 0;
    double ahead_ = 0;  ///< bits
};

}  // namespace lumacast::media
