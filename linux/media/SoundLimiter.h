#pragma once
#include <cstddef>
#include <deque>
#include <utility>

#include "linux/media/PcmReader.h"

namespace lumacast::media {

/// Keeps sound below full scale by turning it down where it would be louder, ahead of the peak and back slowly, both
/// sides alike; what is not too loud comes out as it went in. Looks ahead: the last lookAhead() frames are held back.
class SoundLimiter final {
public:
    /// A little below full scale, as encoding adds a little to some peaks (-0.9 dB).
    static constexpr float kCeiling = 0.9f;

    explicit SoundLimiter(int sampleRate);

    /// Appends to `out` what is ready.
    void add(const StereoSound& sound, StereoSound& out);
    /// Appends what is held back. Nothing is added after it.
    void finish(StereoSound& out);
    std::size_t lookAhead() const { return lookAhead_; }

private:
    float lowestAhead(float wanted);
    void step(float left, float right, StereoSound& out);

    const std::size_t lookAhead_;
    const float recovery_;  ///< the part of what is missing to 1 that comes back with each frame
    std::deque<std::pair<float, float>> held_;
    std::deque<std::pair<std::size_t, float>> lowest_;  ///< of the gains wanted ahead: candidates, rising
    std::deque<float> gains_;                           ///< of the last lookAhead_ frames, averaged
    double gainSum_ = 0;
    float gain_ = 1;
    std::size_t position_ = 0;
};

}  // namespace lumacast::media
