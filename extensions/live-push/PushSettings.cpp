#include "extensions/live-push/PushSettings.h"

#include <algorithm>

#include "extensions/media/Settings.h"

namespace lumacast::extensions {

namespace {

bool isPushable(const std::string& url) {
    return url.starts_with("rtmp://") || url.starts_with("rtmps://") || url.starts_with("srt://");
}

/// Between the two, `usual` where the application says nothing.
double within(const Dictionary& info, std::string_view key, double least, double most, double usual) {
    return std::clamp(numberIn(info, key).value_or(usual), least, most);
}

int evenWithin(const Dictionary& info, std::string_view key, int least, int most, int usual) {
    return static_cast<int>(within(info, key, least, most, usual)) / 2 * 2;
}

}  // namespace

std::optional<PushSettings> PushSettings::from(const Dictionary& info) {
    PushSettings settings;
    settings.url = textIn(info, "url").value_or("");
    if (!isPushable(settings.url)) return std::nullopt;
    settings.viewURL = textIn(info, "viewURL");
    settings.width = evenWithin(info, "width", 64, 4096, settings.width);
    settings.height = evenWithin(info, "height", 64, 4096, settings.height);
    settings.bitRate = static_cast<std::int64_t>(within(info, "bitRate", 100e3, 50e6, 4e6));
    settings.giveUpAfter = std::chrono::seconds(static_cast<std::int64_t>(within(info, "giveUpAfter", 1, 3600, 60)));
    return settings;
}

const char* PushSettings::formatName() const {
    return url.starts_with("srt://") ? "mpegts" : "flv";
}

}  // namespace lumacast::extensions
