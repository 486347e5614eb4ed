#include "session/SamplePayloads.h"

#include <cstring>

#include "broadcast/PayloadKeys.h"
#include "session/LCSharedPlaneObject.h"

namespace lumacast {

namespace {

/// Plain data without padding, byte for byte.
template <class Record>
Data bytesOf(const Record& record) {
    Data bytes(sizeof record);
    std::memcpy(bytes.data(), &record, sizeof record);
    return bytes;
}

}  // namespace

Data timingInfoBlock(const SampleBuffer& sample) {
    const auto entries = sample.timing();
    return bytesOf(entries.empty() ? SampleTiming{} : entries.front());
}

Data audioFormatBlock(const SampleBuffer& sample) { return bytesOf(sample.format().audio); }

Data audioDataBlock(const SampleBuffer& sample) {
    const auto data = sample.data();
    return data ? *data : Data();
}

Dictionary videoPayload(const SampleBuffer& sample, std::int64_t sampleType, std::uint32_t orientation) {
    const auto& image = sample.image();
    const LCSharedPlaneObject plane(image ? image->plane() : nullptr);
    Dictionary payload;
    payload.addNew(std::string(kPayloadVideoOrientation), orientation);
    payload.addNew(std::string(kPayloadSampleType), sampleType);
    payload.addNew(std::string(kPayloadSharedPlane), plane.messageForm());
    payload.addNew(std::string(kPayloadTimingInfo), timingInfoBlock(sample));
    return payload;
}

Dictionary audioPayload(const SampleBuffer& sample, std::int64_t sampleType) {
    Dictionary payload;
    payload.addNew(std::string(kPayloadSampleType), sampleType);
    payload.addNew(std::string(kPayloadAudioBufferList), audioDataBlock(sample));
    payload.addNew(std::string(kPayloadAudioFormat), audioFormatBlock(sample));
    payload.addNew(std::string(kPayloadTimingInfo), timingInfoBlock(sample));
    payload.addNew(std::string(kPayloadNumSamples), sample.sampleCount());
    return payload;
}

}  // namespace lumacast
