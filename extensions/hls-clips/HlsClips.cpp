#include "extensions/hls-clips/HlsClips.h"

#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <utility>

#include "extensions/media/Settings.h"

namespace lumacast::extensions {

namespace {

constexpr double kDaemonsOwnDuration = 5, kShortestClip = 0.5, kLongestClip = 60;
constexpr double kMostKept = 100'000;
constexpr std::string_view kErrorDomain = "org.lumacast.hls-clips";
enum class ErrorCode : std::int64_t { NoDestination = 1, Unreadable = 2 };

/// Extensions are at home in a folder that is theirs.
std::string absolute(const std::string& directory) {
    if (directory.starts_with('/')) return directory;
    const char* home = std::getenv("HOME");
    return home && *home == '/' ? std::string(home) + "/" + directory : std::string();
}

Error errorOf(ErrorCode code, std::string text) {
    return Error(std::string(kErrorDomain), static_cast<std::int64_t>(code),
                 {{std::string(kLocalizedDescriptionKey), std::move(text)}});
}

}  // namespace

HlsSettings HlsSettings::from(const Dictionary& info) {
    HlsSettings settings;
    settings.directory = absolute(textIn(info, "directory").value_or("live"));
    settings.url = textIn(info, "url");
    settings.viewURL = textIn(info, "viewURL");
    if (const auto keep = numberIn(info, "keep"); keep && *keep >= 1 && *keep <= kMostKept)
        settings.keep = static_cast<std::size_t>(*keep);
    if (const auto seconds = numberIn(info, "clipDuration");
        seconds && *seconds >= kShortestClip && *seconds <= kLongestClip)
        settings.clipDuration = *seconds;
    const Value* compression = info.find("compression");
    if (const auto* properties = compression ? compression->as<Dictionary>() : nullptr;
        properties && !properties->empty())
        settings.compression = *properties;
    return settings;
}

std::int64_t HlsSettings::longestSeconds() const {
    // A cut comes with the first sound after the limit: a clip is a little longer than that.
    return static_cast<std::int64_t>(std::ceil(std::max(clipDuration, kDaemonsOwnDuration))) + 1;
}

std::string HlsSettings::whereToView() const {
    if (viewURL) return *viewURL;
    if (url) return *url + (url->ends_with('/') ? "" : "/") + Publisher::kPlaylistName;
    return URL::file(directory + "/" + Publisher::kPlaylistName).text();
}

bool HlsClips::begin(const Dictionary& info) {
    const HlsSettings settings = HlsSettings::from(info);
    if (!settings.url && settings.directory.empty()) return false;
    Publisher::Options options;
    using std::chrono::system_clock, std::chrono::milliseconds;
    const auto now = std::chrono::duration_cast<milliseconds>(system_clock::now().time_since_epoch());
    options.streamName = "clip-" + std::to_string(now.count());
    options.targetSeconds = settings.longestSeconds();
    options.keep = settings.keep;
    stream_.reset(new Stream{
        settings, Segmenter(settings.longestSeconds()), {options, [&](std::function<bool()> isGivenUp) {
                                                             return settings.url ? makeUpload(*settings.url,
                                                                                              std::move(isGivenUp))
                                                                                 : makeFolder(settings.directory);
                                                         }}});
    return true;
}

void HlsClips::clip(extension::Clip clip) {
    if (!stream_ && !begin(clip.userInfo.value_or(Dictionary()))) {
        std::fputs("hls-clips: there is neither a \"url\" nor a home for its \"directory\"\n", stderr);
        return clip.answer.fail(errorOf(ErrorCode::NoDestination, "The broadcast has no destination."));
    }
    std::string error;
    for (Segment& segment : stream_->segmenter.add(clip.movie, clip.isLast, error))
        stream_->publisher.submit(std::move(segment));
    if (!error.empty()) {
        std::fprintf(stderr, "hls-clips: clip %llu: %s\n", static_cast<unsigned long long>(clip.number), error.c_str());
        clip.answer.fail(errorOf(ErrorCode::Unreadable, error));
    }
    const HlsSettings& settings = stream_->settings;
    const bool isStalled = stream_->publisher.state().isStalled;
    if (std::exchange(stream_->isFirst, false)) {
        if (settings.clipDuration > 0 || settings.compression)
            clip.answer.setConfiguration({settings.clipDuration, settings.compression});
        report(clip.answer, "live");
    } else if (clip.isLast) {
        stream_->publisher.finish(patience_);
        report(clip.answer, "ended");
    } else if (std::exchange(stream_->wasStalled, isStalled) != isStalled) {
        report(clip.answer, isStalled ? "stalled" : "live");
    }
    if (clip.isLast) end();
}

void HlsClips::clipMissed(bool isLast) {
    if (!stream_) return;
    stream_->segmenter.leaveOut();
    if (isLast) end();
}

void HlsClips::ended() {
    end();
}

void HlsClips::report(extension::ClipAnswer& answer, const char* state) const {
    const Publisher::State now = stream_->publisher.state();
    answer.setServiceInfo({{"state", state},
                           {"viewURL", stream_->settings.whereToView()},
                           {"segments", now.published},
                           {"lostSegments", now.lost}});
}

/// The playlist says that nothing follows; the next clip begins another stream.
void HlsClips::end() {
    if (stream_) stream_->publisher.finish(patience_);
    stream_ = nullptr;
}

}  // namespace lumacast::extensions
