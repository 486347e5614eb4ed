#include "linux/media/SoundLimiter.h"

#include <algorithm>
#include <cmath>

namespace lumacast::media {

namespace {

constexpr double kLookAheadSeconds = 0.005;
/// Slow against the periods of what is heard and against the beat of two tones, so that nothing is heard of it.
constexpr double kRecoverySeconds = 0.8;

}  // namespace

SoundLimiter::SoundLimiter(int sampleRate)
    : lookAhead_(static_cast<std::size_t>(std::max(1.0, kLookAheadSeconds * sampleRate))),
      recovery_(static_cast<float>(1 / (kRecoverySeconds * sampleRate))), gains_(lookAhead_, 1.0f),
      gainSum_(static_cast<double>(lookAhead_)) {}

void SoundLimiter::add(const StereoSound& sound, StereoSound& out) {
    for (std::size_t i = 0; i < sound.frames(); ++i) step(sound.planes[0][i], sound.planes[1][i], out);
}

void SoundLimiter::finish(StereoSound& out) {
    const std::size_t rest = held_.size();
    for (std::size_t i = 0; i < rest; ++i) step(0, 0, out);
    held_.clear();
}

/// The least gain that any of the frames held back wants, the newest included.
float SoundLimiter::lowestAhead(float wanted) {
    while (!lowest_.empty() && lowest_.back().second >= wanted) lowest_.pop_back();
    lowest_.emplace_back(position_, wanted);
    while (lowest_.front().first + lookAhead_ <= position_) lowest_.pop_front();
    return lowest_.front().second;
}

/// A frame leaves when lookAhead_ - 1 others have come after it. The gain it leaves with is the average of as many
/// gains, none of which was higher than what the frame wants: so it is never too loud, and the gain never jumps.
void SoundLimiter::step(float left, float right, StereoSound& out) {
    held_.emplace_back(left, right);
    const float peak = std::max(std::abs(left), std::abs(right));
    const float lowest = lowestAhead(peak > kCeiling ? kCeiling / peak : 1.0f);
    gain_ = std::min(lowest, gain_ + (1 - gain_) * recovery_);
    if (gain_ > 0.9999f && lowest >= 1) gain_ = 1;  // else it would approach 1 for ever
    gainSum_ += gain_ - gains_.front();
    gains_.pop_front();
    gains_.push_back(gain_);
    ++position_;
    if (held_.size() < lookAhead_) return;
    const auto [l, r] = held_.front();
    held_.pop_front();
    const auto gain = static_cast<float>(gainSum_ / static_cast<double>(lookAhead_));
    out.planes[0].push_back(std::clamp(l * gain, -1.0f, 1.0f));
    out.planes[1].push_back(std::clamp(r * gain, -1.0f, 1.0f));
}

}  // namespace lumacast::media
