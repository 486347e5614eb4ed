#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "examples/scene/Mark.h"
#include "tests/checkers/Luma.h"

namespace lumacast::checkers {

/// A picture to be put into a movie: the scene's frame `number`, shown at `time`.
struct PlannedPicture {
    std::uint32_t number = 0;
    std::chrono::nanoseconds time{};
    bool isMarked = false;
};

/// What a test wants in a movie. The defaults are the hard case: half size and a low bit rate.
struct MoviePlan {
    int width = 320;  ///< of the scene; the movie has half of it, made even
    int height = 180;
    bool halfSize = true;
    std::int64_t bitRate = 120'000;
    bool reordered = false;  ///< with B pictures
    std::vector<PlannedPicture> pictures;
    double soundSeconds = 0;                     ///< no audio track when 0
    std::function<float(double seconds)> sound;  ///< amplitude up to 1
    std::vector<std::function<float(double seconds)>> moreSounds;  ///< of further audio tracks
};

/// Consecutive numbers from `first`, at a steady rate from time zero.
[[nodiscard]] std::vector<PlannedPicture> steadyPictures(std::uint32_t first, int count, int framesPerSecond);

/// Encodes the plan as H.264 and AAC into an MP4 file. The reason when that fails, else empty.
[[nodiscard]] std::string makeMovie(const MoviePlan& plan, const std::string& path);

/// The luma of the scene as a movie would hold it, not encoded.
[[nodiscard]] LumaPlane sceneLuma(int width, int height, std::uint32_t number,
                                  scene::Mark mark = scene::Mark::None);

}  // namespace lumacast::checkers
