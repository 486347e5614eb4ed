#pragma once
#include <gtest/gtest.h>

#include <cstdint>
#include <optional>

#include "platform/Clock.h"
#include "tests/fakes/FakeContainerWriter.h"
#include "tests/fakes/FakeMovie.h"
#include "tests/fakes/FakePlane.h"

namespace lumacast {

/// In order, none doubled, and no hole: paused time does not exist in a movie. Each picture stands where it was
/// captured, or it would not fit its sound.
inline void judgePictures(const FakeMovie& movie) {
    constexpr std::int64_t kTwoFrames = 2 * CaptureClock::kTimescale / 60;
    for (const FakeTrack& track : movie.tracks) {
        std::optional<std::int64_t> last;
        for (const SampleRef& sample : track.samples) {
            const std::int64_t time = sample->presentationTime().value;
            if (last) {
                EXPECT_GT(time, *last);
                EXPECT_LE(time - *last, kTwoFrames);
            }
            last = time;
            const auto& image = sample->image();
            const auto* plane = image ? dynamic_cast<const FakePlane*>(image->plane().get()) : nullptr;
            if (plane && plane->capturedAt()) {
                EXPECT_EQ(time, *plane->capturedAt());
            }
        }
    }
}

/// The movie that is written there; its writer sends no picture twice.
inline void judgeRecording(const FakeRecording& recording) {
    judgePictures(recording.movie());
    EXPECT_EQ(recording.repeats(), 0u);
}

}  // namespace lumacast
