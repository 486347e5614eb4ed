#include "linux/audio/TapMix.h"

#include <algorithm>
#include <cmath>

namespace lumacast::sound {

namespace {

/// What a lane holds: the longest delay, and sound that is known before it is heard.
constexpr double kLaneSeconds = 1.5;
/// What the delay grows by beyond what was too late.
constexpr std::int64_t kMargin = 5'000'000;
/// Applications play one sound after the other, each as a stream of its own.
constexpr double kQuietAfterSeconds = 2;

}  // namespace

TapMix::TapMix(double rate, std::uint32_t channels, HostTime start)
    : rate_(rate), channels_(channels), start_(start), laneFrames_(static_cast<std::size_t>(rate * kLaneSeconds)) {}

HostTime TapMix::momentOf(std::int64_t frame) const {
    return HostTime{start_.nanoseconds + std::llround(static_cast<double>(frame) / rate_ * 1e9)};
}

std::int64_t TapMix::frameAt(HostTime moment) const {
    return static_cast<std::int64_t>(
        std::floor(static_cast<double>(moment.nanoseconds - start_.nanoseconds) * rate_ / 1e9));
}

std::shared_ptr<SoundLane> TapMix::addLane() {
    auto lane = std::make_shared<SoundLane>(laneFrames_);
    {
        const std::lock_guard lock(mutex_);
        lanes_.push_back(lane);
    }
    if (streamComes_) streamComes_();
    return lane;
}

std::shared_ptr<SoundLane> TapMix::addComputedLane(SoundLane::Computed computed) {
    auto lane = std::make_shared<SoundLane>(0, std::move(computed));
    lane->isTrusted_ = true;
    const std::lock_guard lock(mutex_);
    lanes_.push_back(lane);
    return lane;
}

void TapMix::trust(SoundLane& lane) {
    const std::lock_guard lock(mutex_);
    lane.isTrusted_ = true;
}

void TapMix::closeLane(const std::shared_ptr<SoundLane>& lane) {
    const std::lock_guard lock(mutex_);
    lane->isClosed_ = true;
    if (!lane->isTrusted_ || lane->end_ <= position_) std::erase(lanes_, lane);
}

void TapMix::discardLane(const std::shared_ptr<SoundLane>& lane) {
    const std::lock_guard lock(mutex_);
    lane->isClosed_ = true;
    lane->isTrusted_ = false;
    std::erase(lanes_, lane);
}

void TapMix::forgetLocked(SoundLane& lane, std::int64_t before) {
    lane.begin_ = std::max(lane.begin_, std::min(before, lane.end_));
}

void TapMix::write(SoundLane& lane, std::int64_t frame, std::span<const float> interleaved) {
    const std::lock_guard lock(mutex_);
    if (lane.isClosed_) return;
    const auto capacity = static_cast<std::int64_t>(lane.frames_);
    auto count = static_cast<std::int64_t>(interleaved.size() / channels_);
    const float* from = interleaved.data();
    if (frame < position_) {
        // Too late by so much; once there was a hole, there needn't be another.
        const std::int64_t late = position_ - frame;
        const auto nanoseconds = static_cast<std::int64_t>(static_cast<double>(late) / rate_ * 1e9);
        if (lane.isTrusted_ && nanoseconds < kLongestDelay)
            delay_ = std::min(delay_ + nanoseconds + kMargin, kLongestDelay);
        if (late >= count) return;
        from += late * channels_;
        frame += late;
        count -= late;
    }
    // Further ahead than anything that is played soon: no sound of this time.
    if (frame + count > position_ + capacity) return;
    if (lane.samples_.empty()) lane.samples_.resize(lane.frames_ * channels_);
    forgetLocked(lane, position_);
    if (lane.begin_ == lane.end_) lane.begin_ = lane.end_ = frame;
    const auto place = [&](std::int64_t at) { return static_cast<std::size_t>(at % capacity) * channels_; };
    for (std::int64_t hole = lane.end_; hole < frame; ++hole)
        std::fill_n(lane.samples_.begin() + static_cast<std::ptrdiff_t>(place(hole)), channels_, 0.0f);
    // Going back: what lies between is written anew or silence.
    for (std::int64_t hole = frame + count; hole < lane.begin_; ++hole)
        std::fill_n(lane.samples_.begin() + static_cast<std::ptrdiff_t>(place(hole)), channels_, 0.0f);
    lane.begin_ = std::min(lane.begin_, frame);
    for (std::int64_t done = 0; done < count; ++done)
        std::copy_n(from + done * channels_, channels_,
                    lane.samples_.begin() + static_cast<std::ptrdiff_t>(place(frame + done)));
    lane.end_ = std::max(lane.end_, frame + count);
}

bool TapMix::isQuiet() const {
    const std::lock_guard lock(mutex_);
    return lanes_.empty() && static_cast<double>(position_ - lastWithStream_) >= kQuietAfterSeconds * rate_;
}

std::int64_t TapMix::position() const {
    const std::lock_guard lock(mutex_);
    return position_;
}

std::int64_t TapMix::readable(HostTime now) const {
    const std::lock_guard lock(mutex_);
    return std::max<std::int64_t>(0, frameAt(HostTime{now.nanoseconds - delay_}) - position_);
}

HostTime TapMix::readableFrom(std::int64_t frames) const {
    const std::lock_guard lock(mutex_);
    // One nanosecond more, so that rounding never makes it a frame less.
    return HostTime{momentOf(position_ + frames).nanoseconds + delay_ + 1};
}

void TapMix::read(std::span<float> interleaved) {
    const auto count = static_cast<std::int64_t>(interleaved.size() / channels_);
    std::fill(interleaved.begin(), interleaved.end(), 0.0f);
    const std::lock_guard lock(mutex_);
    for (const auto& lane : lanes_) {
        if (lane->isTrusted_ && lane->computed_) lane->computed_(momentOf(position_), interleaved);
        if (!lane->isTrusted_ || lane->samples_.empty()) continue;
        const std::int64_t from = std::max(position_, lane->begin_), to = std::min(position_ + count, lane->end_);
        for (std::int64_t frame = from; frame < to; ++frame) {
            const float* const sample =
                lane->samples_.data() + static_cast<std::size_t>(frame % static_cast<std::int64_t>(lane->frames_)) * channels_;
            float* const sum = interleaved.data() + (frame - position_) * channels_;
            for (std::uint32_t channel = 0; channel < channels_; ++channel) sum[channel] += sample[channel];
        }
    }
    position_ += count;
    if (!lanes_.empty()) lastWithStream_ = position_;
    std::erase_if(lanes_, [this](const auto& lane) { return lane->isClosed_ && lane->end_ <= position_; });
}

void TapMix::skipTo(std::int64_t frame) {
    const std::lock_guard lock(mutex_);
    position_ = std::max(position_, frame);
}

}  // namespace lumacast::sound
