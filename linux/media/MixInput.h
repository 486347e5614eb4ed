#pragma once
#include <cstdint>
#include <deque>
#include <memory>
#include <optional>

#include "linux/media/PcmReader.h"
#include "linux/media/TrackDecoder.h"

namespace lumacast::media {

/// One sound track on its way into a mix: decoded, at the mix's rate, laid out by its stamps. What it holds in memory
/// is what was asked for and a packet more, wherever the track's sound lies. Belongs to one thread.
class MixInput final {
public:
    /// `zero` is the mix's beginning, nanoseconds of the movie.
    MixInput(std::unique_ptr<TrackDecoder> decoder, float volume, int sampleRate, std::int64_t zero);

    /// Adds the track's sound from frame `position` of the mix on to `mix`, which decides how much. Positions only go
    /// on.
    std::optional<Error> addTo(StereoSound& mix, std::int64_t position);
    /// Whether the track has no sound after what it was asked for.
    bool hasEnded() const { return isAtEnd_ && runs_.empty(); }

private:
    /// Sound without a hole.
    struct Run {
        std::int64_t start = 0;
        StereoSound sound;
        std::int64_t end() const { return start + static_cast<std::int64_t>(sound.frames()); }
    };
    std::optional<Error> decodeUpTo(std::int64_t end);
    std::optional<Error> take(const AVFrame& packet);
    std::optional<Error> adopt(const AVFrame& packet);
    void resample(const AVFrame* packet);

    const std::unique_ptr<TrackDecoder> decoder_;
    const float volume_;
    const int sampleRate_;
    const std::int64_t zero_;
    AvOwned<SwrContext> resampler_;
    int rate_ = 0, channels_ = 0, format_ = -1;
    std::deque<Run> runs_;
    bool isAtEnd_ = false;
};

}  // namespace lumacast::media
