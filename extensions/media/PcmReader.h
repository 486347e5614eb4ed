#pragma once
#include <cstdint>

#include "client/extension/Samples.h"
#include "extensions/media/Av.h"
#include "extensions/media/StereoSound.h"

namespace lumacast::extensions {

/// Turns one source's sounds into stereo at one rate. Sounds follow each other; a change of format is followed.
/// Integers of 8 (signed) to 32 bits and floats, of either byte order, interleaved; of more than two channels the first
/// two. Not thread-safe.
class PcmReader final {
public:
    explicit PcmReader(int rate) : rate_(rate) {}
    /// About as long as the sound; empty for a format that can't be read.
    StereoSound read(const extension::Sound& sound);

private:
    bool prepare(const AudioFormat& format);

    const int rate_;
    AudioFormat format_;
    AvOwned<SwrContext> resampler_;
};

}  // namespace lumacast::extensions
