#include "extensions/media/SoundMixer.h"

#include <algorithm>
#include <cstdlib>

namespace lumacast::extensions {

void SoundMixer::add(std::size_t source, const StereoSound& sound, std::int64_t start) {
    std::int64_t& end = ends_[source];
    if (std::abs(start - end) < rate_ / 50) start = end;
    const std::int64_t stop = start + static_cast<std::int64_t>(sound.size());
    if (stop <= position_ || start > position_ + 10 * static_cast<std::int64_t>(rate_)) return;
    const std::int64_t from = std::max({start, position_, std::min(end, stop)});
    if (mixed_.size() < static_cast<std::size_t>(stop - position_))
        mixed_.resize(static_cast<std::size_t>(stop - position_));
    for (std::size_t channel = 0; channel < 2; ++channel)
        for (std::int64_t at = from; at < stop; ++at) {
            float& sample = mixed_.channels[channel][static_cast<std::size_t>(at - position_)];
            sample = std::clamp(sample + sound.channels[channel][static_cast<std::size_t>(at - start)], -1.0F, 1.0F);
        }
    end = std::max(end, stop);
}

StereoSound SoundMixer::take(std::int64_t now) {
    const std::int64_t everybody = std::ranges::min(ends_);
    return takeUntil(std::max(everybody, now - rate_ / 5));
}

StereoSound SoundMixer::takeUntil(std::int64_t end) {
    StereoSound taken;
    if (end <= position_) return taken;
    const auto count = static_cast<std::size_t>(end - position_);
    if (mixed_.size() < count) mixed_.resize(count);
    for (std::size_t channel = 0; channel < 2; ++channel)
        taken.channels[channel].assign(mixed_.channels[channel].begin(),
                                       mixed_.channels[channel].begin() + static_cast<std::ptrdiff_t>(count));
    mixed_.dropFront(count);
    position_ = end;
    return taken;
}

}  // namespace lumacast::extensions
