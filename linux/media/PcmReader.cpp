#include "linux/media/PcmReader.h"

#include <algorithm>
#include <bit>
#include <cmath>

namespace lumacast::media {

namespace {

/// One sample of `Bytes` bytes as an unsigned number, most significant byte first or last.
template <unsigned Bytes, bool BigEndian>
std::uint64_t word(const std::uint8_t* at) {
    std::uint64_t value = 0;
    for (unsigned i = 0; i < Bytes; ++i) value = value << 8u | at[BigEndian ? i : Bytes - 1 - i];
    return value;
}

using ReadSample = float (*)(const std::uint8_t* at);

template <unsigned Bytes, bool BigEndian>
float readSigned(const std::uint8_t* at) {
    const auto high = static_cast<std::int64_t>(word<Bytes, BigEndian>(at) << (64 - 8 * Bytes));
    return static_cast<float>(static_cast<double>(high) / 9223372036854775808.0);  // 2^63
}

template <unsigned Bytes, bool BigEndian>
float readUnsigned(const std::uint8_t* at) {
    const std::uint64_t high = word<Bytes, BigEndian>(at) << (64 - 8 * Bytes);
    return static_cast<float>(static_cast<double>(high) / 9223372036854775808.0 - 1.0);
}

/// Foreign floats are kept within the range and away from what is not a number.
float bounded(float value) { return std::isfinite(value) ? std::clamp(value, -1.0f, 1.0f) : 0.0f; }

template <unsigned Bytes, bool BigEndian>
float readFloat(const std::uint8_t* at) {
    if constexpr (Bytes == 4) return bounded(std::bit_cast<float>(static_cast<std::uint32_t>(word<4, BigEndian>(at))));
    else return bounded(static_cast<float>(std::bit_cast<double>(word<8, BigEndian>(at))));
}

template <bool BigEndian>
ReadSample readerOf(const AudioFormat& format, unsigned bytes) {
    if (format.formatFlags & AudioFormat::kFlagFloat) {
        return bytes == 4 ? readFloat<4, BigEndian> : bytes == 8 ? readFloat<8, BigEndian> : nullptr;
    }
    const bool isSigned = (format.formatFlags & AudioFormat::kFlagSignedInteger) != 0;
    switch (bytes) {
        case 1: return isSigned ? readSigned<1, BigEndian> : readUnsigned<1, BigEndian>;
        case 2: return isSigned ? readSigned<2, BigEndian> : readUnsigned<2, BigEndian>;
        case 3: return isSigned ? readSigned<3, BigEndian> : readUnsigned<3, BigEndian>;
        case 4: return isSigned ? readSigned<4, BigEndian> : readUnsigned<4, BigEndian>;
        default: return nullptr;
    }
}

ReadSample readerOf(const AudioFormat& format) {
    if (format.bitsPerChannel % 8 != 0) return nullptr;
    const unsigned bytes = format.bitsPerChannel / 8;
    return format.formatFlags & AudioFormat::kFlagBigEndian ? readerOf<true>(format, bytes)
                                                            : readerOf<false>(format, bytes);
}

}  // namespace

bool isReadable(const AudioFormat& format) {
    const bool rateIsSane = format.sampleRate >= 4000 && format.sampleRate <= 384'000;
    return format.formatID == kAudioFormatLinearPCM && rateIsSane && format.channelsPerFrame >= 1 &&
           format.channelsPerFrame <= 16 && readerOf(format) != nullptr &&
           format.bytesPerFrame == format.channelsPerFrame * (format.bitsPerChannel / 8);
}

void readPcm(const AudioFormat& format, std::span<const std::uint8_t> bytes, std::size_t frameCount, StereoSound& out) {
    const ReadSample read = readerOf(format);
    const std::size_t frames = std::min(frameCount, bytes.size() / format.bytesPerFrame);
    const std::size_t right = format.channelsPerFrame > 1 ? format.bitsPerChannel / 8 : 0;
    const std::uint8_t* at = bytes.data();
    for (std::size_t i = 0; i < frames; ++i, at += format.bytesPerFrame) {
        out.planes[0].push_back(read(at));
        out.planes[1].push_back(read(at + right));
    }
}

}  // namespace lumacast::media
