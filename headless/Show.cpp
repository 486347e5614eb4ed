#include "headless/Show.h"

#include <algorithm>
#include <cmath>
#include <numbers>

namespace lumacast::headless {

namespace {

constexpr std::int64_t kSecond = 1'000'000'000;
constexpr std::int64_t kBetweenTones = kSecond * Show::kPicturesPerMark / Show::kPicturesPerSecond;
constexpr double kFadeSeconds = 0.002;  // only at the end: a tone begins sharply

/// The tone, `seconds` after it began.
double toneAt(double seconds) {
    if (seconds < 0 || seconds >= Show::kToneSeconds) return 0;
    const double fade = std::min(1.0, (Show::kToneSeconds - seconds) / kFadeSeconds);
    return Show::kAmplitude * fade * std::sin(2 * std::numbers::pi * Show::kTone * seconds);
}

}  // namespace

std::int64_t Show::pictureAt(HostTime moment) const {
    return std::max<std::int64_t>(0, moment.nanoseconds - begin_.nanoseconds) * kPicturesPerSecond / kSecond;
}

HostTime Show::beginOf(std::int64_t picture) const {
    // Rounded up, so that the picture does stand at the moment at which it begins.
    return HostTime{begin_.nanoseconds + (picture * kSecond + kPicturesPerSecond - 1) / kPicturesPerSecond};
}

void Show::addTones(HostTime moment, double rate, std::uint32_t channels, std::span<float> interleaved) const {
    const std::int64_t since = std::max<std::int64_t>(0, moment.nanoseconds - begin_.nanoseconds) % kBetweenTones;
    constexpr double kBetween = static_cast<double>(kBetweenTones) / kSecond;
    const std::size_t frames = interleaved.size() / channels;
    for (std::size_t frame = 0; frame < frames; ++frame) {
        const double seconds = static_cast<double>(since) / kSecond + static_cast<double>(frame) / rate;
        const auto sample = static_cast<float>(toneAt(std::fmod(seconds, kBetween)));
        for (std::uint32_t channel = 0; channel < channels; ++channel)
            interleaved[frame * channels + channel] += sample;
    }
}

}  // namespace lumacast::headless
