#pragma once

#include <cstdint>
#include <functional>
#include <vector>

#include "linux/media/mp4/MovieBoxWriter.h"
#include "tests/unit/linux_mp4/MemorySink.h"

namespace lumacast::mp4::test {

struct MediaSample {
    SampleInfo info;
    Bytes bytes;
};

// Real H.264: every picture shows its number as bright and dark blocks, so that each depends on its key frame.
struct EncodedVideo {
    VideoTrackDescription description;
    std::vector<MediaSample> samples;
};
// Pictures at the given stamps (microseconds), a key frame whenever a second has passed since the last. `bright` says
// which are white all over.
[[nodiscard]] EncodedVideo encodeVideo(const std::vector<std::int64_t>& stamps,
                                       const std::function<bool(std::int64_t)>& bright = nullptr);

// Real AAC at 48 kHz, stereo: silence, with a tone where `loud` says so for a time in frames. Begins at `start`.
struct EncodedAudio {
    AudioTrackDescription description;
    std::vector<MediaSample> samples;
};
[[nodiscard]] EncodedAudio encodeAudio(std::int64_t start, std::int64_t frames,
                                       const std::function<bool(std::int64_t)>& loud, const std::string& name);

[[nodiscard]] std::vector<std::int64_t> steadyStamps(int count, int perSecond, std::int64_t first = 0);

// Declares the tracks, starts the writer and adds all samples in the order of their times. The movie is not finished.
[[nodiscard]] MovieError writeMovie(MovieBoxWriter& writer, const EncodedVideo& video,
                                    const std::vector<const EncodedAudio*>& sounds);

}  // namespace lumacast::mp4::test
