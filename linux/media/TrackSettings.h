#pragma once
#include <cstdint>
#include <optional>

#include "base/Value.h"

namespace lumacast::media {

/// What a video track's settings dictionary asks for (keys: VideoSettings).
struct VideoTrackSettings {
    int width = 0;   ///< pixels, even
    int height = 0;  ///< pixels, even
    std::int64_t bitRate = 5'000'000;  ///< bits per second on average
    int frameRate = 60;                ///< pictures a second that are expected at most
    int maxKeyFrameInterval = 60;      ///< pictures; a second of media time is the limit whatever this says

    /// None when no encoder can take them: another codec than H.264, a profile of another codec, a size that is odd or
    /// out of range, a number that is no number. Absent compression properties have the defaults above; numbers are
    /// taken from any numeric kind and kept within what an encoder can do.
    static std::optional<VideoTrackSettings> parse(const Dictionary& settings);
};

/// What an audio track's settings dictionary asks for (keys: AudioSettings).
struct AudioTrackSettings {
    int sampleRate = 44100;         ///< frames per second
    int channels = 2;               ///< 1 or 2
    std::int64_t bitRate = 128000;  ///< bits per second

    /// None when the format is not AAC or the numbers are not ones that it knows.
    static std::optional<AudioTrackSettings> parse(const Dictionary& settings);
};

}  // namespace lumacast::media
