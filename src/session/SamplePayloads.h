#pragma once
// Samples as byte blocks and dictionaries, the way they leave the process.

#include <cstdint>

#include "base/Value.h"
#include "writer/media/SampleBuffer.h"

namespace lumacast {

/// The sample's first timing entry, 72 bytes, native order: duration, presentation and decode time, each value int64,
/// timescale int32, flags uint32, epoch int64. A sample without one gives three invalid times.
Data timingInfoBlock(const SampleBuffer& sample);
/// The sample's audio format, 40 bytes, native order; see AudioFormat.
Data audioFormatBlock(const SampleBuffer& sample);
/// A copy of the bytes of the sample's first audio buffer; empty when it has none.
Data audioDataBlock(const SampleBuffer& sample);

/// What the extension is sent for a frame.
Dictionary videoPayload(const SampleBuffer& sample, std::int64_t sampleType, std::uint32_t orientation);
/// What the extension is sent for a run of sound.
Dictionary audioPayload(const SampleBuffer& sample, std::int64_t sampleType);

}  // namespace lumacast
