#pragma once
// Clips as the daemon cuts them: frame numbers and tones go on from one to the next.

#include <fcntl.h>

#include <cmath>
#include <numbers>
#include <string>

#include "linux/ipc/Fd.h"
#include "tests/checkers/tests/MovieMaker.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::test {

inline constexpr int kClipRate = 30;  ///< pictures a second
inline constexpr double kApplicationTone = 440, kMicrophoneTone = 1000, kQuietTone = 3100;

struct ClipPlan {
    int frames = 45;
    bool hasSound = true;
    bool hasMicrophone = true;
    int width = 320, height = 180;
};

/// Makes clip after clip in a folder.
class TestClips final {
public:
    explicit TestClips(const ScratchDirectory& folder) : folder_(folder) {}

    Fd next(const ClipPlan& plan = {}) { return Fd(::open(nextFile(plan).c_str(), O_RDONLY | O_CLOEXEC)); }
    std::string nextFile(const ClipPlan& plan = {}) {
        const double start = static_cast<double>(frames_) / kClipRate;
        const auto tone = [start](double frequency) {
            return [start, frequency](double seconds) {
                return static_cast<float>(0.3 * std::sin(2 * std::numbers::pi * frequency * (start + seconds)));
            };
        };
        checkers::MoviePlan movie;
        movie.width = plan.width;
        movie.height = plan.height;
        movie.halfSize = false;
        movie.bitRate = 600'000;
        movie.pictures = checkers::steadyPictures(frames_, plan.frames, kClipRate);
        if (plan.hasSound) {
            movie.soundSeconds = static_cast<double>(plan.frames) / kClipRate;
            movie.sound = tone(kApplicationTone);
            if (plan.hasMicrophone) movie.moreSounds = {tone(kMicrophoneTone)};
        }
        frames_ += static_cast<std::uint32_t>(plan.frames);
        const std::string path = folder_.path("source-" + std::to_string(++clips_) + ".mp4");
        EXPECT_EQ(makeMovie(movie, path), "");
        return path;
    }
    /// Frames in all clips so far; the next one's first number.
    std::uint32_t frames() const { return frames_; }

private:
    const ScratchDirectory& folder_;
    std::uint32_t frames_ = 0;
    int clips_ = 0;
};

}  // namespace lumacast::test
