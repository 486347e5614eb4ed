#pragma once
// Tones to append, and how they are found again.

#include <gtest/gtest.h>

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstdint>
#include <numbers>
#include <utility>

#include "tests/checkers/Sound.h"
#include "tests/contract/MediaWorld.h"

namespace lumacast::testing {

/// `frames` of a sine in the format, from `first` on (frames since the tone began); -6 dB.
inline Data tone(const AudioFormat& format, double hertz, std::int64_t first, std::int64_t frames) {
    Data bytes;
    const unsigned width = format.bitsPerChannel / 8;
    for (std::int64_t i = first; i < first + frames; ++i) {
        const double value = 0.5 * std::sin(2 * std::numbers::pi * hertz * static_cast<double>(i) / format.sampleRate);
        std::uint64_t word = 0;
        if (format.formatFlags & AudioFormat::kFlagFloat) {
            word = width == 4 ? std::bit_cast<std::uint32_t>(static_cast<float>(value))
                              : std::bit_cast<std::uint64_t>(value);
        } else {
            word = static_cast<std::uint64_t>(
                static_cast<std::int64_t>(value * std::ldexp(1, static_cast<int>(width) * 8 - 1)));
            if (!(format.formatFlags & AudioFormat::kFlagSignedInteger)) word += 1ULL << (width * 8 - 1);
        }
        for (unsigned channel = 0; channel < format.channelsPerFrame; ++channel) {
            for (unsigned b = 0; b < width; ++b) {
                const unsigned shift = format.formatFlags & AudioFormat::kFlagBigEndian ? 8 * (width - 1 - b) : 8 * b;
                bytes.push_back(static_cast<std::uint8_t>(word >> shift));
            }
        }
    }
    return bytes;
}

inline SampleRef soundBuffer(const AudioFormat& format, Data data, std::int64_t frames, std::int64_t nanoseconds) {
    const MediaTime length = MediaTime::make(frames, static_cast<std::int32_t>(format.sampleRate));
    return SampleBuffer::makeAudio(format, std::move(data), frames,
                                   {length, atNanoseconds(nanoseconds), kInvalidMediaTime});
}

inline AudioFormat formatOf(double rate, unsigned bits, unsigned channels, std::uint32_t flags) {
    AudioFormat format = tapFormat();
    format.sampleRate = rate;
    format.bitsPerChannel = bits;
    format.channelsPerFrame = channels;
    format.bytesPerFrame = format.bytesPerPacket = channels * bits / 8;
    format.formatFlags = flags | AudioFormat::kFlagPacked;
    return format;
}

/// Appends `frames` of the tone in buffers of 20 ms, or of so many.
inline void appendTone(TrackInput& input, const AudioFormat& format, std::int64_t zero, std::int64_t firstFrame,
                std::int64_t frames, double hertz = 441, int milliseconds = 20) {
    const auto block = static_cast<std::int64_t>(format.sampleRate * milliseconds / 1000);
    for (std::int64_t at = firstFrame; at < firstFrame + frames; at += block) {
        const std::int64_t length = std::min(block, firstFrame + frames - at);
        const auto stamp = zero + static_cast<std::int64_t>(static_cast<double>(at) * 1e9 / format.sampleRate);
        ASSERT_TRUE(eventually([&] { return input.isReadyForMoreMediaData(); }));
        ASSERT_TRUE(input.append(soundBuffer(format, tone(format, hertz, at, length), length, stamp)));
    }
}

/// Root of the mean square between two times.
inline double loudness(const checkers::Sound& sound, double from, double to) {
    double sum = 0;
    const auto first = static_cast<std::size_t>(from * sound.rate), last = static_cast<std::size_t>(to * sound.rate);
    if (last > sound.samples.size() || last <= first) return -1;
    for (std::size_t i = first; i < last; ++i) sum += static_cast<double>(sound.samples[i]) * sound.samples[i];
    return std::sqrt(sum / static_cast<double>(last - first));
}

/// By how many milliseconds the tone is heard later than it should be, found by its phase (a period is 2.27 ms).
inline double phaseDelay(const checkers::Sound& sound, double from, double to, double hertz = 441) {
    double sine = 0, cosine = 0;
    for (auto i = static_cast<std::size_t>(from * sound.rate); i < static_cast<std::size_t>(to * sound.rate); ++i) {
        const double angle = 2 * std::numbers::pi * hertz * static_cast<double>(i) / sound.rate;
        sine += sound.samples[i] * std::sin(angle);
        cosine += sound.samples[i] * std::cos(angle);
    }
    return -std::atan2(cosine, sine) / (2 * std::numbers::pi * hertz) * 1000;
}

inline constexpr double kToneLoudness = 0.3536;  // half of the square root of a half

}  // namespace lumacast::testing
