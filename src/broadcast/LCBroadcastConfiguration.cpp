#include "broadcast/LCBroadcastConfiguration.h"

namespace lumacast {

namespace {

constexpr std::string_view kClipDurationKey = "clipDuration";
constexpr std::string_view kVideoCompressionPropertiesKey = "videoCompressionProperties";

/// The double value of a number object; none for anything else.
std::optional<double> numberIn(const Value& value) {
    if (const double* number = value.as<double>()) return *number;
    if (const bool* truth = value.as<bool>()) return *truth ? 1.0 : 0.0;
    if (const auto* number = value.as<std::int64_t>()) return static_cast<double>(*number);
    if (const auto* number = value.as<std::uint64_t>()) return static_cast<double>(*number);
    return std::nullopt;
}

}  // namespace

void LCBroadcastConfiguration::encodeWithCoder(Coder& coder) const {
    coder.encodeObject(clipDuration, kClipDurationKey);
    if (videoCompressionProperties && !videoCompressionProperties->empty())
        coder.encodeObject(*videoCompressionProperties, kVideoCompressionPropertiesKey);
}

std::optional<LCBroadcastConfiguration> LCBroadcastConfiguration::initWithCoder(const Coder& coder) {
    LCBroadcastConfiguration configuration;
    if (const Value duration = coder.decodeObject(kClipDurationKey); !duration.isNull()) {
        const auto seconds = numberIn(duration);
        if (!seconds) return std::nullopt;
        configuration.clipDuration = *seconds;
    }
    if (const Value properties = coder.decodeObject(kVideoCompressionPropertiesKey); !properties.isNull()) {
        const Dictionary* entries = properties.as<Dictionary>();
        if (!entries) return std::nullopt;
        configuration.videoCompressionProperties = *entries;
    }
    return configuration;
}

}  // namespace lumacast
