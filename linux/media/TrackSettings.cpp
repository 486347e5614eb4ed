#include "linux/media/TrackSettings.h"

#include <algorithm>
#include <array>
#include <cmath>

#include "platform/ContainerWriter.h"
#include "writer/media/AudioFormat.h"

namespace lumacast::media {

namespace {

constexpr double kLargestSide = 8192;
constexpr double kSmallestBitRate = 10'000, kLargestBitRate = 400'000'000;

/// The entry as a number; `otherwise` when it is absent; none when it is no number.
std::optional<double> numberIn(const Dictionary& settings, std::string_view key, std::optional<double> otherwise) {
    const Value* const value = settings.find(key);
    if (!value) return otherwise;
    std::optional<double> number;
    if (const auto* const real = value->as<double>()) number = *real;
    if (const auto* const integer = value->as<std::int64_t>()) number = static_cast<double>(*integer);
    if (const auto* const natural = value->as<std::uint64_t>()) number = static_cast<double>(*natural);
    return number && std::isfinite(*number) ? number : std::nullopt;
}

bool isText(const Dictionary& settings, std::string_view key, std::string_view prefix) {
    const Value* const value = settings.find(key);
    const auto* const text = value ? value->as<std::string>() : nullptr;
    return text && text->starts_with(prefix);
}

bool isEvenSide(double side) { return side >= 2 && side <= kLargestSide && std::fmod(side, 2.0) == 0; }

}  // namespace

std::optional<VideoTrackSettings> VideoTrackSettings::parse(const Dictionary& settings) {
    if (!isText(settings, VideoSettings::kCodec, VideoSettings::kCodecH264)) return std::nullopt;
    const auto width = numberIn(settings, VideoSettings::kWidth, std::nullopt);
    const auto height = numberIn(settings, VideoSettings::kHeight, std::nullopt);
    if (!width || !height || !isEvenSide(*width) || !isEvenSide(*height)) return std::nullopt;

    const Value* const properties = settings.find(VideoSettings::kCompressionProperties);
    const auto* const given = properties ? properties->as<Dictionary>() : nullptr;
    if (properties && !given) return std::nullopt;
    const Dictionary compression = given ? *given : Dictionary();
    if (compression.find(VideoSettings::kProfileLevel) && !isText(compression, VideoSettings::kProfileLevel, "H264_")) {
        return std::nullopt;
    }

    VideoTrackSettings parsed;
    const auto bitRate = numberIn(compression, VideoSettings::kAverageBitRate, static_cast<double>(parsed.bitRate));
    const auto frameRate = numberIn(compression, VideoSettings::kExpectedSourceFrameRate, parsed.frameRate);
    const auto interval = numberIn(compression, VideoSettings::kMaxKeyFrameInterval, parsed.maxKeyFrameInterval);
    if (!bitRate || !frameRate || !interval) return std::nullopt;
    parsed.width = static_cast<int>(*width);
    parsed.height = static_cast<int>(*height);
    parsed.bitRate = static_cast<std::int64_t>(std::clamp(*bitRate, kSmallestBitRate, kLargestBitRate));
    parsed.frameRate = static_cast<int>(std::clamp(*frameRate, 1.0, 240.0));
    parsed.maxKeyFrameInterval = static_cast<int>(std::clamp(*interval, 1.0, 1000.0));
    return parsed;
}

std::optional<AudioTrackSettings> AudioTrackSettings::parse(const Dictionary& settings) {
    static constexpr std::array kRates{8000,  11025, 12000, 16000, 22050, 24000,
                                       32000, 44100, 48000, 64000, 88200, 96000};
    const auto format = numberIn(settings, AudioSettings::kFormatID, std::nullopt);
    if (!format || *format != static_cast<double>(kAudioFormatAAC)) return std::nullopt;
    AudioTrackSettings parsed;
    const auto rate = numberIn(settings, AudioSettings::kSampleRate, parsed.sampleRate);
    const auto channels = numberIn(settings, AudioSettings::kNumberOfChannels, parsed.channels);
    const auto bitRate = numberIn(settings, AudioSettings::kBitRate, static_cast<double>(parsed.bitRate));
    if (!rate || !channels || !bitRate) return std::nullopt;
    if (std::find(kRates.begin(), kRates.end(), *rate) == kRates.end()) return std::nullopt;
    if (*channels != 1 && *channels != 2) return std::nullopt;
    parsed.sampleRate = static_cast<int>(*rate);
    parsed.channels = static_cast<int>(*channels);
    parsed.bitRate = static_cast<std::int64_t>(std::clamp(*bitRate, 16'000.0, 512'000.0));
    return parsed;
}

}  // namespace lumacast::media
