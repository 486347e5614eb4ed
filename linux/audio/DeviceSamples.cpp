#include "linux/audio/DeviceSamples.h"

#include <algorithm>
#include <cstddef>
#include <optional>
#include <utility>

#include "linux/audio/TapFormat.h"

namespace lumacast::sound {

namespace {

constexpr std::int32_t kRate = 44100;
/// How exactly sound is cut where the clock began or ceased to run.
constexpr std::int64_t kCutFrames = 32;
/// Roundings of both ends of a piece, in nanoseconds.
constexpr std::int64_t kRounding = 2;

/// Whether the clock ran from `begin`, which is `stamp` on it, to `end`.
bool ranThrough(const CaptureClock& clock, HostTime begin, const std::optional<MediaTime>& stamp, HostTime end) {
    const auto after = stamp ? clock.at(end) : std::nullopt;
    return after && std::abs(after->value - stamp->value - (end.nanoseconds - begin.nanoseconds)) <= kRounding;
}

SampleRef makeSample(MediaTime presentation, std::span<const float> heard) {
    const AudioFormat format = microphoneFormat();
    Data bytes(heard.size() * format.bytesPerFrame);
    writePcm(format, heard, bytes.data());
    const auto frames = static_cast<std::int64_t>(heard.size());
    return SampleBuffer::makeAudio(format, std::move(bytes), frames,
                                   {MediaTime::make(frames, kRate), presentation, kInvalidMediaTime});
}

}  // namespace

AudioFormat microphoneFormat() {
    return {.sampleRate = kRate,
            .formatID = kAudioFormatLinearPCM,
            .formatFlags = AudioFormat::kFlagSignedInteger | AudioFormat::kFlagPacked | AudioFormat::kFlagBigEndian,
            .bytesPerPacket = 2,
            .framesPerPacket = 1,
            .bytesPerFrame = 2,
            .channelsPerFrame = 1,
            .bitsPerChannel = 16,
            .reserved = 0};
}

std::vector<SampleRef> stampedSamples(const CaptureClock& clock, const SoundTimeline& timeline, std::int64_t first,
                                      std::span<const float> heard) {
    std::vector<SampleRef> samples;
    const auto count = static_cast<std::int64_t>(heard.size());
    if (count == 0) return samples;
    const auto part = [&](std::int64_t begin, std::int64_t end) {
        return heard.subspan(static_cast<std::size_t>(begin), static_cast<std::size_t>(end - begin));
    };
    const auto momentOf = [&](std::int64_t frame) { return timeline.momentOf(first + frame); };
    const auto add = [&](MediaTime stamp, std::span<const float> piece) {
        if (auto sample = makeSample(stamp, piece)) samples.push_back(std::move(sample));
    };
    const auto whole = clock.at(momentOf(0));
    if (ranThrough(clock, momentOf(0), whole, momentOf(count))) {
        add(*whole, heard);
        return samples;
    }
    std::optional<MediaTime> runStamp;
    std::int64_t runBegin = 0;
    for (std::int64_t begin = 0; begin < count; begin += kCutFrames) {
        const std::int64_t end = std::min(begin + kCutFrames, count);
        const auto stamp = clock.at(momentOf(begin));
        if (ranThrough(clock, momentOf(begin), stamp, momentOf(end))) {
            if (!runStamp) {
                runStamp = stamp;
                runBegin = begin;
            }
            continue;
        }
        if (runStamp) add(*runStamp, part(runBegin, begin));
        runStamp.reset();
    }
    if (runStamp) add(*runStamp, part(runBegin, count));
    return samples;
}

}  // namespace lumacast::sound
