#pragma once
#include <gtest/gtest.h>

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/Clock.h"
#include "tests/fakes/FakeContainerWriter.h"
#include "tests/fakes/FakeMovie.h"
#include "tests/fakes/FakePlane.h"

namespace lumacast {

/// In order, none doubled, and no hole: paused time does not exist in a movie. Each picture stands where it was
/// captured, or it would not fit its sound; or all of them are late by the same, which is answered (0 for no pictures).
/// Whether they may be is what judgeRecordings knows.
inline std::int64_t judgePictures(const FakeMovie& movie) {
    constexpr std::int64_t kTwoFrames = 2 * CaptureClock::kTimescale / 60;
    std::optional<std::int64_t> late;
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
            if (!plane || !plane->capturedAt()) continue;
            if (!late) late = time - *plane->capturedAt();
            EXPECT_EQ(time, *plane->capturedAt() + *late) << "not where it was captured";
        }
    }
    return late.value_or(0);
}

/// How late the pictures of an application's next recording may be, from its recordings before. Only a finish forgets
/// the times of a recording, and nothing but a picture ends a resume: that is deliberate (FramePipeline's unit tests).
/// So after a recording that was not finished, the first picture after a resume that none had followed takes the place
/// of that recording's last one, as it does after a pause, and what was late stays so.
class AllowedLateness {
public:
    void judge(const FakeRecording& recording) {
        const FakeMovie movie = recording.movie();
        const std::int64_t late = judgePictures(movie);
        const std::vector<std::int64_t> captured = whenCaptured(movie);
        if (captured.empty()) return;
        if (!isUnknown_) {
            EXPECT_TRUE(allowed_.contains(late)) << "the pictures of " << recording.outputURL().path() << " are "
                                                 << static_cast<double>(late) / CaptureClock::kTimescale << " s late";
        }
        if (recording.status() == ContainerStatus::Completed) {
            *this = {};
            return;
        }
        // The picture that ends a resume leaves the last time as it was.
        if (captured.size() > 1) lasts_.clear();
        lasts_.insert(captured.back());
        allowed_ = {0, late};
        for (const std::int64_t last : lasts_) allowed_.insert(late + last);
        // One that could not be written has had pictures that are in no movie.
        isUnknown_ |= recording.status() == ContainerStatus::Failed;
    }

private:
    static std::vector<std::int64_t> whenCaptured(const FakeMovie& movie) {
        std::vector<std::int64_t> times;
        for (const FakeTrack& track : movie.tracks)
            for (const SampleRef& sample : track.samples) {
                const auto& image = sample->image();
                const auto* plane = image ? dynamic_cast<const FakePlane*>(image->plane().get()) : nullptr;
                if (plane && plane->capturedAt()) times.push_back(*plane->capturedAt());
            }
        return times;
    }

    std::set<std::int64_t> allowed_{0}, lasts_;
    bool isUnknown_ = false;
};

/// The movies that were written, in the order in which they were begun; their writer sends no picture twice. Those of
/// the whole display are all one application's, `ofTheWholeDisplay`.
inline void judgeRecordings(const std::vector<std::shared_ptr<FakeRecording>>& recordings,
                            const std::string& ofTheWholeDisplay = "") {
    std::map<std::string, AllowedLateness> applications;
    for (const auto& recording : recordings) {
        const std::string path = recording->outputURL().path();
        const std::string name = path.substr(path.rfind('/') + 1);
        applications[name.starts_with("ScreenRecording_") ? ofTheWholeDisplay + ".mp4" : name].judge(*recording);
        EXPECT_EQ(recording->repeats(), 0u);
    }
}

}  // namespace lumacast
