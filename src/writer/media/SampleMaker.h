#pragma once
#include "base/Recycler.h"
#include "writer/media/SampleBuffer.h"

namespace lumacast {

/// Makes samples one after the other, in the memory of those that nobody holds any more. Samples may outlive it.
/// Thread-safe.
class SampleMaker {
public:
    /// As SampleBuffer::makeVideo.
    SampleRef video(PixelBuffer image, MediaTime presentation, MediaTime duration) const {
        return samples_.make(SampleBuffer::Key(), std::move(image), presentation, duration);
    }
    /// As SampleBuffer::makeAudio. The bytes themselves are the caller's gift, and not used again.
    SampleRef audio(const AudioFormat& format, Data data, std::int64_t sampleCount, const SampleTiming& timing) const {
        return samples_.make(SampleBuffer::Key(), format, sounds_.make(std::move(data)), sampleCount, timing);
    }

private:
    Recycler<SampleBuffer> samples_;
    Recycler<Data> sounds_;
};

}  // namespace lumacast
