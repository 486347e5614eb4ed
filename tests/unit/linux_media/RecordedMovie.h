#pragma once
// A movie written by the port for a test, and what a player makes of it.

#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "linux/media/LinuxContainerWriters.h"
#include "tests/checkers/MovieReader.h"
#include "tests/contract/MediaWorld.h"

namespace lumacast::testing {

/// One shown picture: when, and how bright it is in the middle.
struct ShownPicture {
    std::int64_t nanoseconds = 0;
    int luma = 0;
};

/// Every picture a player shows, in order. The test fails when any part can't be decoded.
inline std::vector<ShownPicture> shownPictures(const std::string& path) {
    std::vector<ShownPicture> shown;
    checkers::MovieReader reader(path);
    EXPECT_EQ(reader.error(), "");
    const bool whole = reader.readPictures([&](const checkers::DecodedPicture& picture) {
        const auto& luma = picture.luma;
        const std::size_t middle =
            static_cast<std::size_t>(luma.height / 2) * luma.stride + static_cast<std::size_t>(luma.width / 2);
        shown.push_back({picture.time.count(), luma.samples[middle]});
    });
    EXPECT_TRUE(whole) << reader.error();
    return shown;
}

inline std::int64_t movieNanoseconds(const std::string& path) { return checkers::MovieReader(path).duration().count(); }

/// BT.601, limited range.
inline int lumaOfGrey(int grey) { return static_cast<int>(std::lround(16 + grey * 219.0 / 255.0)); }

/// A writer with one picture track and two sound tracks in a world of its own.
class RecordedMovie {
public:
    explicit RecordedMovie(int width = 128, int height = 96, std::int64_t bitRate = 2'000'000,
                           std::shared_ptr<media::MovieFiles> files = std::make_shared<media::PosixMovieFiles>())
        : width_(width), height_(height), writers_(clock, std::move(files)) {
        clock.startCaptureClock();
        auto made = writers_.make(URL::file(path()), ContainerType::Mpeg4);
        if (auto* const ready = std::get_if<0>(&made)) writer = std::move(*ready);
        if (!writer) return;
        video = writer->addVideoInput(videoSettings(width, height, bitRate));
        sound = writer->addAudioInput(audioSettings());
        microphone = writer->addAudioInput(audioSettings());
    }

    std::string path() const { return directory_.path("movie.mp4"); }
    LinuxContainerWriters& writers() { return writers_; }

    void start(std::int64_t nanoseconds = 0) {
        ASSERT_TRUE(writer->startWriting());
        writer->startSession(atNanoseconds(nanoseconds));
        clock.captureClock()->run();
    }
    /// Waits for room, then appends.
    bool append(const SampleRef& sample) {
        EXPECT_TRUE(eventually([&] { return video->isReadyForMoreMediaData(); }));
        return video->append(sample);
    }
    bool appendGrey(int grey, std::int64_t nanoseconds) {
        return append(
            greyPicture(width_, height_, ++number_, static_cast<std::uint8_t>(grey), atNanoseconds(nanoseconds)));
    }
    ContainerStatus finish() {
        Happening done;
        writer->finishWriting([&] { done.happen(); });
        EXPECT_TRUE(done.waitFor());
        return writer->status();
    }

    HandClock clock;
    std::unique_ptr<ContainerWriter> writer;
    std::shared_ptr<TrackInput> video, sound, microphone;

private:
    ScratchDirectory directory_;
    int width_, height_;
    std::uint64_t number_ = 0;
    LinuxContainerWriters writers_;
};

}  // namespace lumacast::testing
