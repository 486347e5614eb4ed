#include "extensions/media/PcmReader.h"

#include <bit>
#include <cmath>
#include <cstring>
#include <limits>

namespace lumacast::extensions {

namespace {

/// The bits of one sample, most significant first in the answer, whatever their order in memory.
std::uint64_t bitsAt(const std::uint8_t* bytes, unsigned count, bool isBigEndian) {
    std::uint64_t bits = 0;
    for (unsigned at = 0; at < count; ++at) bits = bits << 8 | bytes[isBigEndian ? at : count - 1 - at];
    return bits;
}

float sampleAt(const std::uint8_t* bytes, const AudioFormat& format) {
    const unsigned count = format.bitsPerChannel / 8;
    const std::uint64_t bits = bitsAt(bytes, count, (format.formatFlags & AudioFormat::kFlagBigEndian) != 0);
    if (format.formatFlags & AudioFormat::kFlagFloat) {
        const double value = count == 8 ? std::bit_cast<double>(bits)
                                        : static_cast<double>(std::bit_cast<float>(static_cast<std::uint32_t>(bits)));
        // Encoders take nothing that is not a number; a double may be one that a float is not.
        return std::abs(value) <= std::numeric_limits<float>::max() ? static_cast<float>(value) : 0.0F;
    }
    const auto sign = static_cast<std::int64_t>(bits << (64 - 8 * count));
    return static_cast<float>(std::ldexp(static_cast<double>(sign), -63));
}

bool isReadable(const AudioFormat& format) {
    if (format.formatFlags & AudioFormat::kFlagFloat) return format.bitsPerChannel == 32 || format.bitsPerChannel == 64;
    return (format.formatFlags & AudioFormat::kFlagSignedInteger) && format.bitsPerChannel <= 32;
}

}  // namespace

StereoSound PcmReader::read(const extension::Sound& sound) {
    StereoSound read;
    if (!(sound.format == format_) && !prepare(sound.format)) return read;
    const auto frames = static_cast<std::size_t>(sound.frames);
    read.resize(frames);
    const std::size_t second = format_.channelsPerFrame > 1 ? format_.bitsPerChannel / 8 : 0;
    for (std::size_t at = 0; at < frames; ++at) {
        const std::uint8_t* const frame = sound.bytes.data() + at * format_.bytesPerFrame;
        read.channels[0][at] = sampleAt(frame, format_);
        read.channels[1][at] = sampleAt(frame + second, format_);
    }
    if (!resampler_) return read;
    const int room = swr_get_out_samples(resampler_.get(), static_cast<int>(frames));
    StereoSound resampled;
    resampled.resize(static_cast<std::size_t>(std::max(0, room)));
    std::uint8_t* out[]{reinterpret_cast<std::uint8_t*>(resampled.channels[0].data()),
                        reinterpret_cast<std::uint8_t*>(resampled.channels[1].data())};
    const std::uint8_t* in[]{reinterpret_cast<const std::uint8_t*>(read.channels[0].data()),
                             reinterpret_cast<const std::uint8_t*>(read.channels[1].data())};
    const int made = swr_convert(resampler_.get(), out, room, in, static_cast<int>(frames));
    resampled.resize(static_cast<std::size_t>(std::max(0, made)));
    return resampled;
}

bool PcmReader::prepare(const AudioFormat& format) {
    resampler_.reset();
    format_ = {};
    if (!isReadable(format)) return false;
    const int rate = static_cast<int>(std::lround(format.sampleRate));
    if (rate != rate_) {
        AVChannelLayout stereo = AV_CHANNEL_LAYOUT_STEREO;
        SwrContext* raw = nullptr;
        swr_alloc_set_opts2(&raw, &stereo, AV_SAMPLE_FMT_FLTP, rate_, &stereo, AV_SAMPLE_FMT_FLTP, rate, 0, nullptr);
        resampler_.reset(raw);
        if (!resampler_ || swr_init(resampler_.get()) < 0) return false;
    }
    format_ = format;
    return true;
}

}  // namespace lumacast::extensions
