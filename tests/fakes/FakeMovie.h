#pragma once
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/Value.h"
#include "writer/media/SampleBuffer.h"

namespace lumacast {

/// One track of a movie in memory: its settings and its samples, their stamps as they were appended.
struct FakeTrack {
    MediaType type = MediaType::Video;
    Dictionary settings;
    std::vector<SampleRef> samples;
};

/// A movie in memory. The movie's zero is `start` on the samples' clock.
struct FakeMovie {
    std::vector<FakeTrack> tracks;
    MediaTime start = kInvalidMediaTime;  ///< invalid while no session was started
    MediaTime end = kInvalidMediaTime;    ///< where the last picture ends; invalid while it is being written
    bool finished = false;

    /// From the start to the end, or to the last stamp while it is being written. Zero for a movie without samples.
    MediaTime duration() const;
};

}  // namespace lumacast
