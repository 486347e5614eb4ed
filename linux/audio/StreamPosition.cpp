#include "linux/audio/StreamPosition.h"

#include <algorithm>
#include <cmath>

namespace lumacast::sound {

namespace {

/// How much of a new error counts.
constexpr double kSmoothing = 0.05;
/// A stream goes back only when it was seen there so many times: what was heard once is not heard again.
constexpr int kSeenBefore = 4;
/// Shorter pieces aren't stretched.
constexpr std::int64_t kLeastFrames = 64;

}  // namespace

StreamPosition::Piece StreamPosition::place(std::int64_t estimate, std::int64_t frames) {
    const double error = static_cast<double>(estimate - next_);
    const bool isFar = std::abs(error) > kInterruption * rate_;
    strayed_ = isFar ? strayed_ + 1 : 0;
    const bool isSettling = placed_ < kSettling && std::abs(error) > kGoodEnough * rate_;
    if (isSettling || placed_ == 0 || (isFar && (error > 0 || strayed_ >= kSeenBefore))) {
        placed_ = std::min(placed_ + 1, kSettling);
        strayed_ = 0;
        smoothedError_ = 0;
        isCorrecting_ = false;
        next_ = estimate + frames;
        return {estimate, frames};
    }
    placed_ = std::min(placed_ + 1, kSettling);
    Piece piece{next_, frames};
    if (!isFar) smoothedError_ += (error - smoothedError_) * kSmoothing;
    if (std::abs(smoothedError_) > kTolerance * rate_) isCorrecting_ = true;
    if (std::abs(smoothedError_) < kGoodEnough * rate_) isCorrecting_ = false;
    if (isCorrecting_ && frames >= kLeastFrames) {
        const int step = smoothedError_ > 0 ? 1 : -1;
        piece.frames += step;
        smoothedError_ -= step;
    }
    next_ += piece.frames;
    return piece;
}

}  // namespace lumacast::sound
