#include "writer/MovieSettings.h"

#include <cmath>
#include <cstdlib>

#include "platform/PreferenceKeys.h"

namespace lumacast {

namespace {

constexpr std::int64_t kBaseBitRate = 3000000;
constexpr std::int64_t kLargeBitRate = 5000000;
constexpr std::int64_t kTabletBitRate = 7000000;
constexpr double kLargeLength = 1920.0;
constexpr std::int64_t kTabletIdiom = 1;
constexpr std::int64_t kExpectedFrameRate = 60;
constexpr std::int64_t kMaximumKeyFrameInterval = 60;  // frames

constexpr std::uint32_t kStereoLayoutTag = 0x650002;
constexpr std::size_t kChannelLayoutSize = 32;

/// The integer a preference stands for; a text is read as its leading integer, anything else counts as 0.
std::int64_t integerValue(const Value& value) {
    if (const auto* number = value.as<std::int64_t>()) return *number;
    if (const auto* number = value.as<double>())
        return std::abs(*number) < 0x1p63 ? static_cast<std::int64_t>(*number) : 0;  // not a number: 0 too
    if (const auto* flag = value.as<bool>()) return *flag ? 1 : 0;
    if (const auto* text = value.as<std::string>()) return std::strtoll(text->c_str(), nullptr, 10);
    return 0;
}

/// A channel-layout record that is nothing but its tag, in host byte order.
Data stereoChannelLayout() {
    Data record(kChannelLayoutSize, 0);
    for (unsigned i = 0; i < 4; ++i) record[i] = static_cast<std::uint8_t>(kStereoLayoutTag >> (8 * i));
    return record;
}

}  // namespace

std::int64_t averageVideoBitRate(const Preferences& preferences, const DeviceInfo& device, Size windowSize) {
    std::int64_t rate = kBaseBitRate;
    if (device.userInterfaceIdiom() == kTabletIdiom)
        rate = kTabletBitRate;
    else if (windowSize.width >= kLargeLength || windowSize.height >= kLargeLength)
        rate = kLargeBitRate;
    if (const auto override = preferences.value(kPreferenceDomain, kBitRateOverrideKey)) rate = integerValue(*override);
    return rate;
}

double evenLength(double pixels) {
    const double whole = std::trunc(pixels);
    return std::fmod(whole, 2.0) == 0.0 ? whole : whole + 1.0;
}

Dictionary videoSettings(const Platform& platform, Size windowSize,
                         const std::optional<LCBroadcastConfiguration>& config) {
    const std::int64_t bitRate = averageVideoBitRate(platform.preferences, platform.deviceInfo, windowSize);
    platform.log.line("bit rate set to %ld", bitRate);
    Dictionary compression{
        {std::string(VideoSettings::kExpectedSourceFrameRate), kExpectedFrameRate},
        {std::string(VideoSettings::kMaxKeyFrameInterval), kMaximumKeyFrameInterval},
        {std::string(VideoSettings::kProfileLevel), VideoSettings::kProfileHighAutoLevel},
        {std::string(VideoSettings::kAverageBitRate), bitRate},
    };
    if (config && config->videoCompressionProperties) {
        platform.log.line("using custom video compression properties");
        for (const auto& [key, value] : config->videoCompressionProperties->entries()) compression.set(key, value);
    }
    return {
        {std::string(VideoSettings::kCodec), VideoSettings::kCodecH264},
        {std::string(VideoSettings::kWidth), evenLength(windowSize.width)},
        {std::string(VideoSettings::kHeight), evenLength(windowSize.height)},
        {std::string(VideoSettings::kCompressionProperties), std::move(compression)},
    };
}

Dictionary audioSettings() {
    return {
        {std::string(AudioSettings::kFormatID), static_cast<std::uint64_t>(kAudioFormatAAC)},
        {std::string(AudioSettings::kNumberOfChannels), std::int64_t{2}},
        {std::string(AudioSettings::kSampleRate), 44100.0},
        {std::string(AudioSettings::kChannelLayout), stereoChannelLayout()},
        {std::string(AudioSettings::kBitRate), std::int64_t{128000}},
    };
}

}  // namespace lumacast
