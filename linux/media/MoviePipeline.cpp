#include "linux/media/MoviePipeline.h"

#include <algorithm>
#include <cerrno>
#include <ctime>
#include <utility>

namespace lumacast::media {

namespace {

/// Players show these.
constexpr const char* kSoundNames[] = {"Application audio", "Microphone"};

mp4::MovieOptions options() {
    constexpr std::uint64_t kFrom1904To1970 = 2'082'844'800;
    mp4::MovieOptions options;
    options.creationTime = kFrom1904To1970 + static_cast<std::uint64_t>(std::time(nullptr));
    return options;
}

}  // namespace

MoviePipeline::MoviePipeline(DiskWriter& disk) : disk_(disk), movie_(disk, options()) {}

std::variant<std::unique_ptr<MoviePipeline>, Error> MoviePipeline::open(const std::vector<TrackPlan>& tracks,
                                                                        EncoderChoice& choice, DiskWriter& disk) {
    std::unique_ptr<MoviePipeline> pipeline(new MoviePipeline(disk));
    std::size_t sounds = 0;
    for (const TrackPlan& plan : tracks) {
        if (const auto* const video = std::get_if<VideoTrackSettings>(&plan.settings)) {
            auto opened = PictureTrack::open(*video, plan.transform, choice, pipeline->movie_);
            if (auto* const error = std::get_if<Error>(&opened)) return *error;
            pipeline->tracks_.emplace_back(std::move(std::get<0>(opened)));
        } else {
            const char* const name = kSoundNames[std::min(sounds++, std::size(kSoundNames) - 1)];
            auto opened = SoundTrack::open(std::get<AudioTrackSettings>(plan.settings), name, pipeline->movie_);
            if (auto* const error = std::get_if<Error>(&opened)) return *error;
            pipeline->tracks_.emplace_back(std::move(std::get<0>(opened)));
        }
    }
    if (const auto error = movieError(pipeline->movie_.start())) return *error;
    return pipeline;
}

std::optional<Error> MoviePipeline::add(std::size_t track, SampleRef sample, std::int64_t nanoseconds) {
    using Content = FlushPace::Content;
    std::optional<Error> error;
    if (auto* const pictures = std::get_if<std::unique_ptr<PictureTrack>>(&tracks_[track])) {
        error = (*pictures)->add(std::move(sample), nanoseconds);
        pace_.added((*pictures)->hasNews() ? Content::News : Content::Repeat);
    } else {
        const auto& sound = std::get<std::unique_ptr<SoundTrack>>(tracks_[track]);
        error = sound->add(*sample, nanoseconds);
        pace_.added(sound->isSilent() ? Content::Silence : Content::News);
    }
    return error;
}

std::optional<Error> MoviePipeline::flush() {
    const bool isUnsure = pace_.newsIsUnsure();
    pace_.flushed(std::chrono::steady_clock::now());
    const std::uint32_t fragments = movie_.fragmentCount();
    if (const auto error = movieError(movie_.flushFragment())) return error;
    // What shows a fragment is on the disk with the sync behind it. With news there is another one soon, or this is it;
    // the next one after a repeat would be too late.
    const bool isNew = movie_.fragmentCount() != fragments;
    const bool needsSync = isNew ? !pace_.newsIsUnsure() : isUnsure;
    return needsSync && !disk_.sync() ? std::optional(systemError(EIO)) : std::nullopt;
}

std::optional<Error> MoviePipeline::finish(const End& end) {
    std::int64_t lastPictureEnd = 0;
    for (auto& track : tracks_) {
        std::optional<Error> error;
        if (auto* const pictures = std::get_if<std::unique_ptr<PictureTrack>>(&track)) {
            error = (*pictures)->finish();
            lastPictureEnd = (end.lastPicture.value_or((*pictures)->naturalEnd()) + 500) / 1000;
        } else {
            error = std::get<std::unique_ptr<SoundTrack>>(track)->finish(end.lastPicture);
        }
        if (error) return error;
    }
    return movieError(movie_.finish(lastPictureEnd, end.cut));
}

}  // namespace lumacast::media
