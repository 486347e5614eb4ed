#pragma once
#include <array>
#include <cstdint>
#include <optional>
#include <span>
#include <vector>

#include "writer/media/AudioFormat.h"

namespace lumacast::media {

/// Sound as the encoder takes it: one plane of floats, -1 to 1, for left and one for right.
struct StereoSound {
    std::array<std::vector<float>, 2> planes;

    std::size_t frames() const { return planes[0].size(); }
    void clear() {
        for (auto& plane : planes) plane.clear();
    }
    void appendSilence(std::size_t count) {
        for (auto& plane : planes) plane.resize(plane.size() + count);
    }
    void dropFirst(std::size_t count) {
        for (auto& plane : planes) plane.erase(plane.begin(), plane.begin() + static_cast<std::ptrdiff_t>(count));
    }
};

/// Whether PcmReader can read buffers of this format: linear PCM, whole or float, of either byte order, 8 to 64 bits in
/// whole bytes, 1 to 16 channels, interleaved, 4 to 384 kHz.
bool isReadable(const AudioFormat& format);

/// Appends up to `frameCount` frames of `bytes` to `out`; a frame that is not all there is left out. One channel goes
/// to both sides; of more than two the first two are taken. The format must be readable.
void readPcm(const AudioFormat& format, std::span<const std::uint8_t> bytes, std::size_t frameCount, StereoSound& out);

}  // namespace lumacast::media
