#pragma once
// What the synthetic display shows and the synthetic applications play, at any moment. Pure.

#include <cstdint>
#include <span>

#include "base/Date.h"

namespace lumacast::headless {

/// A picture thirty times a second, and every half second a mark on the picture and a tone that begins with it. All of
/// it follows from the host time alone, so a machine that is late shows and plays the same, only later. A value.
class Show final {
public:
    static constexpr int kPicturesPerSecond = 30;
    static constexpr std::uint32_t kPicturesPerMark = 15;
    /// A recorder that takes fewer pictures than are shown must see the mark too.
    static constexpr std::uint32_t kMarkedPictures = 3;
    static constexpr double kTone = 1000;  ///< Hz
    static constexpr double kToneSeconds = 0.05;
    static constexpr double kAmplitude = 0.4;

    /// Picture 0 begins at `begin`.
    explicit Show(HostTime begin) : begin_(begin) {}

    /// The picture that stands at this moment, which is not before the beginning.
    std::int64_t pictureAt(HostTime moment) const;
    HostTime beginOf(std::int64_t picture) const;
    static bool isMarked(std::int64_t picture) { return picture % kPicturesPerMark < kMarkedPictures; }

    /// Adds the tones to interleaved samples, the first of which is heard at `moment`.
    void addTones(HostTime moment, double rate, std::uint32_t channels, std::span<float> interleaved) const;

private:
    HostTime begin_;
};

}  // namespace lumacast::headless
