// What an application asks of the upload extensions that come with the system: the user info of its broadcast. The
// first byte says what the rest is: 0 the bytes of a dictionary, 1 the recipe of one with the keys that count (modulo
// 2).

#include <algorithm>
#include <array>
#include <cmath>
#include <string>

#include "base/Wire.h"
#include "extensions/hls-clips/HlsClips.h"
#include "extensions/live-push/PushSettings.h"
#include "fuzz/Input.h"
#include "fuzz/Property.h"
#include "fuzz/ValueRecipe.h"

namespace lumacast::fuzz {

namespace {

using extensions::HlsSettings;
using extensions::PushSettings;

void set(Dictionary& info, const char* key, const std::optional<std::string>& text) {
    if (text) info.set(key, *text);
}

void checkHls(const Dictionary& info) {
    const HlsSettings settings = HlsSettings::from(info);
    for (const auto& text : {settings.url, settings.viewURL})
        require(!text || !text->empty(), "an empty text is none");
    require(settings.directory.empty() || settings.directory.front() == '/', "a directory is absolute");
    require(settings.keep <= 100'000, "what is kept has a limit");
    require(settings.clipDuration == 0 || (settings.clipDuration >= 0.5 && settings.clipDuration <= 60),
            "a clip's length is one that can be cut, or the daemon's");
    require(!settings.compression || !settings.compression->empty(), "no properties are none");
    const std::int64_t longest = settings.longestSeconds();
    require(longest >= 6 && longest <= 61 && static_cast<double>(longest) > settings.clipDuration,
            "a segment may be as long as a clip, and not for ever");
    if (!settings.directory.empty() || settings.url) require(!settings.whereToView().empty(), "a stream is somewhere");

    Dictionary again;
    if (!settings.directory.empty()) again.set("directory", settings.directory);
    set(again, "url", settings.url);
    set(again, "viewURL", settings.viewURL);
    if (settings.keep > 0) again.set("keep", std::to_string(settings.keep));
    if (settings.clipDuration > 0) again.set("clipDuration", settings.clipDuration);
    if (settings.compression) again.set("compression", *settings.compression);
    const HlsSettings same = HlsSettings::from(again);
    require(same.directory == settings.directory && same.url == settings.url && same.viewURL == settings.viewURL &&
                same.keep == settings.keep && std::equal_to<>()(same.clipDuration, settings.clipDuration) &&
                same.compression.has_value() == settings.compression.has_value(),
            "settings that are asked for again are the same");
}

void checkPush(const Dictionary& info) {
    const auto settings = PushSettings::from(info);
    if (!settings) return;
    require(settings->url.starts_with("rtmp://") || settings->url.starts_with("rtmps://") ||
                settings->url.starts_with("srt://"),
            "there is where to push to");
    for (const int side : {settings->width, settings->height})
        require(side >= 64 && side <= 4096 && side % 2 == 0, "a picture can be encoded");
    require(settings->bitRate >= 100'000 && settings->bitRate <= 50'000'000, "a stream has a rate that can be had");
    const std::int64_t patience = settings->giveUpAfter.count();
    require(patience >= 1 && patience <= 3600, "it is given up in time");
    Dictionary again{{"url", settings->url},
                     {"width", settings->width},
                     {"height", settings->height},
                     {"bitRate", std::to_string(settings->bitRate)},
                     {"giveUpAfter", std::uint64_t(patience)}};
    set(again, "viewURL", settings->viewURL);
    const auto same = PushSettings::from(again);
    require(same && same->url == settings->url && same->viewURL == settings->viewURL &&
                same->width == settings->width && same->height == settings->height &&
                same->bitRate == settings->bitRate && same->giveUpAfter == settings->giveUpAfter,
            "settings that are asked for again are the same");
}

/// A number in one of the ways in which an application may write it.
Value numberOf(Input& in) {
    const auto whole = static_cast<std::int64_t>(in.number(in.flag() ? 1 : 8));
    switch (in.below(6)) {
        case 0: return Value(whole);
        case 1: return Value(static_cast<std::uint64_t>(whole));
        case 2: return Value(static_cast<double>(whole) / 16);
        case 3: return Value(std::to_string(whole));
        case 4: return Value(std::string(textOf(in.bytes(in.below(16)))));
        default: return valueOf(in);
    }
}

Value textFrom(Input& in) {
    constexpr std::array kBegin{"", "https://", "rtmp://", "srt://", "file:///"};
    std::string text = kBegin[in.below(kBegin.size())];
    text += textOf(in.bytes(in.below(40)));
    if (in.below(4) == 3) return Value(URL(text));
    return in.below(16) == 15 ? valueOf(in) : Value(text);
}

Dictionary infoOf(Input& in) {
    Dictionary info;
    for (const char* key : {"directory", "url", "viewURL"})
        if (in.flag()) info.set(key, textFrom(in));
    for (const char* key : {"keep", "clipDuration", "width", "height", "bitRate", "giveUpAfter"})
        if (in.flag()) info.set(key, numberOf(in));
    if (in.flag()) info.set("compression", valueOf(in));
    return info;
}

}  // namespace

void broadcastSettings(Bytes input) {
    Input in(input);
    Dictionary info;
    if (in.below(2) == 0) {
        const auto value = decode(in.rest(), {});
        if (!value || !value->as<Dictionary>()) return;
        info = *value->as<Dictionary>();
    } else {
        info = infoOf(in);
    }
    checkHls(info);
    checkPush(info);
}

}  // namespace lumacast::fuzz
