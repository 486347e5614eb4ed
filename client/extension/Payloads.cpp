#include "client/extension/Payloads.h"

#include <cmath>
#include <cstring>

#include "broadcast/PayloadKeys.h"

namespace lumacast::extension {

namespace {

constexpr std::int64_t kVideo = 1, kApplicationSound = 2, kMicrophone = 3;
constexpr std::uint32_t kLastOrientation = 8;
constexpr std::uint32_t kMostChannels = 64;
constexpr double kLowestRate = 1000, kHighestRate = 768'000;
/// A tap hands over a fraction of a second at a time. Bytes that claim to last for hours would fill the memory when
/// they are brought to another rate.
constexpr double kLongestSeconds = 10;

template <class T>
const T* memberOf(const Dictionary& payload, std::string_view key) {
    const Value* value = payload.find(key);
    return value ? value->as<T>() : nullptr;
}

/// A record as it was sent, byte for byte; none when the bytes are not its size.
template <class Record>
std::optional<Record> recordIn(const Dictionary& payload, std::string_view key) {
    const Data* bytes = memberOf<Data>(payload, key);
    if (!bytes || bytes->size() != sizeof(Record)) return std::nullopt;
    Record record;
    std::memcpy(static_cast<void*>(&record), bytes->data(), sizeof record);
    return record;
}

std::optional<SampleTiming> timingIn(const Dictionary& payload) {
    const auto timing = recordIn<SampleTiming>(payload, kPayloadTimingInfo);
    // Arithmetic on these times divides by their scale.
    if (!timing || !timing->presentation.isValid() || timing->presentation.timescale <= 0) return std::nullopt;
    return timing;
}

std::optional<Payload> frameIn(const Dictionary& payload) {
    const auto timing = timingIn(payload);
    const auto* orientation = memberOf<std::uint64_t>(payload, kPayloadVideoOrientation);
    if (!timing || !orientation || *orientation < 1 || *orientation > kLastOrientation) return std::nullopt;
    const Value* held = payload.find(kPayloadSharedPlane);
    if (!held || held->isNull()) return UnknownPayload{};
    const auto* plane = held->as<Value::PlaneRef>();
    if (!plane || !*plane) return std::nullopt;
    const SharedPlane& picture = **plane;
    if (picture.width() <= 0 || picture.height() <= 0) return std::nullopt;
    const auto width = static_cast<std::size_t>(picture.width()), height = static_cast<std::size_t>(picture.height());
    if (picture.stride() < width * 4 || picture.pixels().size() / picture.stride() < height) return std::nullopt;
    return Frame{*plane, static_cast<std::uint32_t>(*orientation), *timing, nullptr};
}

bool makesSense(const AudioFormat& format) {
    if (format.formatID != kAudioFormatLinearPCM) return false;
    if (!std::isfinite(format.sampleRate) || format.sampleRate < kLowestRate || format.sampleRate > kHighestRate)
        return false;
    if (format.channelsPerFrame < 1 || format.channelsPerFrame > kMostChannels) return false;
    if (format.bitsPerChannel != 8 && format.bitsPerChannel != 16 && format.bitsPerChannel != 24 &&
        format.bitsPerChannel != 32 && format.bitsPerChannel != 64)
        return false;
    return format.bytesPerFrame == format.bitsPerChannel / 8 * format.channelsPerFrame;
}

std::optional<Payload> soundIn(const Dictionary& payload, Sound::Source source) {
    const auto timing = timingIn(payload);
    const auto format = recordIn<AudioFormat>(payload, kPayloadAudioFormat);
    const auto* bytes = memberOf<Data>(payload, kPayloadAudioBufferList);
    const auto* frames = memberOf<std::int64_t>(payload, kPayloadNumSamples);
    if (!timing || !format || !bytes || !frames || !makesSense(*format) || *frames < 0) return std::nullopt;
    if (static_cast<std::uint64_t>(*frames) > bytes->size() / format->bytesPerFrame) return std::nullopt;
    if (static_cast<double>(*frames) > format->sampleRate * kLongestSeconds) return std::nullopt;
    return Sound{source, *format, *bytes, *frames, *timing, nullptr};
}

std::optional<Payload> actionIn(const Dictionary& payload) {
    const auto* action = memberOf<std::int64_t>(payload, kPayloadActionType);
    if (!action) return std::nullopt;
    if (*action < static_cast<std::int64_t>(Action::Start) || *action > static_cast<std::int64_t>(Action::Finish))
        return UnknownPayload{};
    const Value* info = payload.find(kPayloadUserInfo);
    const auto* userInfo = info ? info->as<Dictionary>() : nullptr;
    if (info && !info->isNull() && !userInfo) return std::nullopt;
    return ActionPayload{static_cast<Action>(*action), userInfo ? std::optional(*userInfo) : std::nullopt};
}

}  // namespace

std::optional<Payload> payloadIn(const Dictionary& payload) {
    if (payload.find(kPayloadActionType)) return actionIn(payload);
    if (payload.find(kPayloadFrontmostApp)) {
        const auto* identifier = memberOf<std::string>(payload, kPayloadFrontmostApp);
        return identifier ? std::optional<Payload>(BundleIdentifier(*identifier)) : std::nullopt;
    }
    if (!payload.find(kPayloadSampleType)) return UnknownPayload{};
    const auto* type = memberOf<std::int64_t>(payload, kPayloadSampleType);
    if (!type) return std::nullopt;
    switch (*type) {
        case kVideo: return frameIn(payload);
        case kApplicationSound: return soundIn(payload, Sound::Source::Application);
        case kMicrophone: return soundIn(payload, Sound::Source::Microphone);
        default: return UnknownPayload{};
    }
}

}  // namespace lumacast::extension
