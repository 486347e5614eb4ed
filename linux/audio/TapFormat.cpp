#include "linux/audio/TapFormat.h"

#include <algorithm>
#include <bit>
#include <cmath>

namespace lumacast::sound {

namespace {

constexpr std::uint32_t kKnownFlags =
    AudioFormat::kFlagFloat | AudioFormat::kFlagBigEndian | AudioFormat::kFlagSignedInteger | AudioFormat::kFlagPacked;

}  // namespace

std::optional<AudioFormat> completed(AudioFormat format) {
    const std::uint32_t bits = format.bitsPerChannel, flags = format.formatFlags;
    const bool isFloat = (flags & AudioFormat::kFlagFloat) != 0;
    const bool isInteger = (flags & AudioFormat::kFlagSignedInteger) != 0;
    if (format.formatID != kAudioFormatLinearPCM || (flags & ~kKnownFlags) != 0 || isFloat == isInteger ||
        !(format.sampleRate >= 8'000 && format.sampleRate <= 192'000) || format.channelsPerFrame < 1 ||
        format.channelsPerFrame > 2 || (isFloat ? bits != 32 : bits != 16 && bits != 24 && bits != 32))
        return std::nullopt;
    const std::uint32_t frame = bits / 8 * format.channelsPerFrame;
    if (format.framesPerPacket == 0) format.framesPerPacket = 1;
    if (format.bytesPerFrame == 0) format.bytesPerFrame = frame;
    if (format.bytesPerPacket == 0) format.bytesPerPacket = frame;
    if (format.bytesPerFrame != frame || format.bytesPerPacket != frame || format.framesPerPacket != 1)
        return std::nullopt;
    return format;
}

void writePcm(const AudioFormat& format, std::span<const float> samples, std::uint8_t* bytes) {
    const bool isFloat = (format.formatFlags & AudioFormat::kFlagFloat) != 0;
    const bool isBigEndian = (format.formatFlags & AudioFormat::kFlagBigEndian) != 0;
    const std::uint32_t size = format.bitsPerChannel / 8;
    const double scale = std::exp2(static_cast<double>(format.bitsPerChannel) - 1);
    for (const float sample : samples) {
        // What isn't a number is silence.
        const float limited = sample == sample ? std::clamp(sample, -1.0f, 1.0f) : 0.0f;
        const std::uint32_t word =
            isFloat ? std::bit_cast<std::uint32_t>(limited)
                    : static_cast<std::uint32_t>(std::llround(std::min(limited * scale, scale - 1)));
        for (std::uint32_t place = 0; place < size; ++place)
            bytes[place] = static_cast<std::uint8_t>(word >> 8 * (isBigEndian ? size - 1 - place : place));
        bytes += size;
    }
}

}  // namespace lumacast::sound
