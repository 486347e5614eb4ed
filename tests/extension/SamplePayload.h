#pragma once
// Payloads as the daemon sends them.

#include <cstring>
#include <memory>
#include <string>
#include <utility>

#include "broadcast/PayloadKeys.h"
#include "tests/contract/MediaWorld.h"
#include "writer/media/SampleBuffer.h"

namespace lumacast::test {

template <class Record>
Data bytesOf(const Record& record) {
    Data bytes(sizeof record);
    std::memcpy(bytes.data(), &record, sizeof record);
    return bytes;
}

inline SampleTiming timingAt(double seconds) {
    return {kInvalidMediaTime, MediaTime::fromSeconds(seconds, 1'000'000'000), kInvalidMediaTime};
}

inline Dictionary actionPayload(std::int64_t action, Value userInfo = {}) {
    Dictionary payload{{std::string(kPayloadActionType), action}};
    if (!userInfo.isNull()) payload.set(std::string(kPayloadUserInfo), std::move(userInfo));
    return payload;
}

inline Dictionary videoPayload(std::shared_ptr<SharedPlane> plane, double seconds, std::uint32_t orientation = 1) {
    return {{std::string(kPayloadVideoOrientation), orientation},
            {std::string(kPayloadSampleType), std::int64_t{1}},
            {std::string(kPayloadSharedPlane), Value(std::move(plane))},
            {std::string(kPayloadTimingInfo), bytesOf(timingAt(seconds))}};
}

inline std::shared_ptr<testing::PaintedPlane> greyPlane(std::uint8_t grey, std::int32_t width = 64, std::int32_t height = 48) {
    auto plane = std::make_shared<testing::PaintedPlane>(width, height, 1);
    plane->fill({0, 0, width, height}, grey);
    return plane;
}

/// `type`: 2 the application's, 3 the microphone's.
inline Dictionary soundPayload(std::int64_t type, Data bytes, std::int64_t frames, double seconds,
                               const AudioFormat& format = testing::tapFormat()) {
    return {{std::string(kPayloadSampleType), type},
            {std::string(kPayloadAudioBufferList), std::move(bytes)},
            {std::string(kPayloadAudioFormat), bytesOf(format)},
            {std::string(kPayloadTimingInfo), bytesOf(timingAt(seconds))},
            {std::string(kPayloadNumSamples), frames}};
}

}  // namespace lumacast::test
