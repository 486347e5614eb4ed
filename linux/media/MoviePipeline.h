#pragma once
#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "linux/media/DiskWriter.h"
#include "linux/media/FlushPace.h"
#include "linux/media/PictureTrack.h"
#include "linux/media/SoundTrack.h"

namespace lumacast::media {

/// What a track input was asked for.
struct TrackPlan {
    std::variant<VideoTrackSettings, AudioTrackSettings> settings;
    AffineTransform transform;  ///< video only
    bool isVideo() const { return std::holds_alternative<VideoTrackSettings>(settings); }
};

/// From samples to the movie file: conversion, encoders and box writer of one movie. Belongs to its encoder thread.
class MoviePipeline final {
public:
    using SteadyTime = FlushPace::Moment;

    /// Opens the encoders and begins the file. `disk` must outlive it.
    static std::variant<std::unique_ptr<MoviePipeline>, Error> open(const std::vector<TrackPlan>& tracks,
                                                                    EncoderChoice& choice, DiskWriter& disk);

    /// Adds a sample of the track with this number that begins at `nanoseconds` after the movie's zero.
    std::optional<Error> add(std::size_t track, SampleRef sample, std::int64_t nanoseconds);

    /// When flush must be called next; none while nothing waits. Keeps a killed movie playable up to its last second,
    /// however rare the pictures are.
    std::optional<SteadyTime> flushTime() const { return pace_.due(); }
    std::optional<Error> flush();

    /// When a movie ends, nanoseconds after its zero.
    struct End {
        std::optional<std::int64_t>
            lastPicture;  ///< until when the last picture lasts; none: as long as it says itself
        std::optional<std::int64_t> cut;          ///< what is later is not in the movie
    };
    /// Encodes the rest and writes the index. Not yet on the disk when it returns.
    std::optional<Error> finish(const End& end);

private:
    explicit MoviePipeline(DiskWriter& disk);

    DiskWriter& disk_;
    mp4::MovieBoxWriter movie_;
    std::vector<std::variant<std::unique_ptr<PictureTrack>, std::unique_ptr<SoundTrack>>> tracks_;
    FlushPace pace_;
};

}  // namespace lumacast::media
