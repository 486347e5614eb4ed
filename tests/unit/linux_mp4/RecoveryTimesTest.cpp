// Times of recovered movies in the cases that are not plain, and how much work a long one is.

#include <gtest/gtest.h>

#include "linux/media/mp4/MovieLook.h"
#include "tests/unit/linux_mp4/Descriptions.h"
#include "tests/unit/linux_mp4/Recovery.h"
#include "tests/unit/linux_mp4/Times.h"
#include "tests/unit/linux_mp4/Tools.h"

namespace lumacast::mp4 {
namespace {

using test::Bytes;
using test::MemoryFile;
using test::MemorySink;

Bytes recovered(const Bytes& file) {
    MemoryFile movie(file);
    EXPECT_EQ(nameOf(recoverMovie(movie, movie)), nameOf(Recovery::recovered));
    return movie.bytes();
}

// Writes the same samples twice: cut off after the last flush, and finished with the last picture until `end`.
void expectAsFinished(const std::function<void(MovieBoxWriter&)>& write, std::int64_t end, const std::string& state) {
    MemorySink sink;
    MovieBoxWriter writer(sink);
    write(writer);
    ASSERT_EQ(writer.flushFragment(), MovieError::none);
    const Bytes cutOff = sink.file();
    ASSERT_EQ(writer.finish(end), MovieError::none);
    test::expectSameMovie(recovered(cutOff), sink.file(), state);
}

void add(MovieBoxWriter& writer, TrackId track, std::int64_t pts, std::uint32_t duration, std::uint32_t number) {
    ASSERT_EQ(writer.addSample(track, {pts, duration, true}, test::payload(number, 30)), MovieError::none);
}

TEST(RecoveredTimes, OfAPictureThatStandsStillAreAsLongAsItStood) {
    const auto write = [](MovieBoxWriter& writer) {
        const auto video = writer.addVideoTrack(test::videoDescription());
        ASSERT_EQ(writer.start(), MovieError::none);
        for (const std::int64_t pts : {0LL, 700'000LL, 9'000'001LL, 9'900'000LL, 60'000'000LL}) {
            add(writer, *video, pts, 0, 1);
            ASSERT_EQ(writer.flushFragment(), MovieError::none);  // each by itself, its length unknown
        }
    };
    expectAsFinished(write, 60'000'001, "rare pictures");
}

TEST(RecoveredTimes, LeaveTheLastPictureAsLongAsThereIsSound) {
    const auto write = [](MovieBoxWriter& writer) {
        const auto video = writer.addVideoTrack(test::videoDescription());
        const auto sound = writer.addAudioTrack(test::audioDescription());
        ASSERT_EQ(writer.start(), MovieError::none);
        add(writer, *video, 5 * kSecond, 0, 1);
        for (std::int64_t i = 0; i < 300; ++i) {
            add(writer, *sound, 5 * kRate - 1024 + i * 1024, 1024, 2);
        }
    };
    const std::int64_t frames = 5 * kRate + 299 * 1024;
    expectAsFinished(write, (frames * 1000 + 24) / 48, "sound after the last picture");
}

// The sound began before the first picture, and the second sound joins when it is written where the movie begins: what
// the fragments skip of it is more than its priming.
TEST(RecoveredTimes, OfASoundThatJoinsLateHideItsPrimingAndNoMore) {
    for (const std::int64_t joins : {kRate / 2, kRate, 3 * kRate + 5}) {
        const auto write = [joins](MovieBoxWriter& writer) {
            const auto video = writer.addVideoTrack(test::videoDescription());
            const auto sound = writer.addAudioTrack(test::audioDescription());
            const auto voice = writer.addAudioTrack(test::audioDescription("Microphone"));
            ASSERT_EQ(writer.start(), MovieError::none);
            for (std::int64_t i = 0; i < 60; ++i) {
                add(writer, *sound, -1024 + i * 1024, 1024, 2);
            }
            add(writer, *video, kSecond, 0, 1);
            add(writer, *video, 3 * kSecond / 2, 0, 1);
            ASSERT_EQ(writer.flushFragment(), MovieError::none);
            for (std::int64_t i = 0; i < 60; ++i) {
                add(writer, *voice, joins - 1024 + i * 1024, 1024, 3);
            }
            add(writer, *video, 5 * kSecond, 0, 1);
        };
        expectAsFinished(write, 5 * kSecond + 1, "joins at " + std::to_string(joins));
    }
}

TEST(RecoveredTimes, OfStampsThatDoNotBeginAtZeroAndSoundWithHoles) {
    const auto write = [](MovieBoxWriter& writer) {
        const auto video = writer.addVideoTrack(test::videoDescription());
        auto description = test::audioDescription();
        description.sampleRate = 44100;
        const auto sound = writer.addAudioTrack(description);
        ASSERT_EQ(writer.start(), MovieError::none);
        constexpr std::int64_t kFirst = 123'456'789;
        for (std::int64_t i = 0; i < 90; ++i) {
            add(writer, *video, kFirst + i * 33'333, 0, 1);
            if (i % 3 == 0) {
                add(writer, *sound, 5'444'444 + 2 * i * 1024, 1024, 2);
            }
        }
    };
    // The movie begins with frame 5,444,444 of the sound, to the frame.
    const std::int64_t soundFrames = 2 * 87 * 1024 + 1024;
    expectAsFinished(write, 123'456'789 + (soundFrames * 1'000'000 + 22'050) / 44'100, "odd stamps");
}

TEST(RecoveredTimes, OfAMovieOfSoundAlone) {
    const auto write = [](MovieBoxWriter& writer) {
        const auto sound = writer.addAudioTrack(test::audioDescription());
        const auto voice = writer.addAudioTrack(test::audioDescription("Microphone"));
        ASSERT_EQ(writer.start(), MovieError::none);
        for (std::int64_t i = 0; i < 100; ++i) {
            add(writer, *sound, 7 * kRate + i * 1024, 1024, 2);
            if (i >= 10) {
                add(writer, *voice, 7 * kRate + i * 1024 - 300, 1024, 3);
            }
        }
    };
    expectAsFinished(write, 0, "no pictures");
}

TEST(RecoveredTimes, HaveEverythingThatTheDescriptionsSay) {
    const auto write = [](MovieBoxWriter& writer) {
        auto description = test::videoDescription();
        description.transform = {0, 1, -1, 0, 1080, 0};
        description.pixelAspectRatio = PixelAspectRatio{4, 3};
        description.colour = ColourDescription{9, 16, 9, true};
        description.timescale = 90'000;
        description.name = "Bildschirm – äöü";
        description.pictureParameterSets.push_back(test::pictureParameterSet());
        const auto video = writer.addVideoTrack(description);
        auto sound = test::audioDescription("");
        sound.sampleRate = 96'000;
        sound.channels = 1;
        sound.primingFrames = 0;
        sound.bitRate = 0;
        ASSERT_TRUE(writer.addAudioTrack(sound).has_value());
        ASSERT_EQ(writer.start(), MovieError::none);
        add(writer, *video, 0, 0, 1);
        add(writer, *video, 90'000, 45'000, 1);
    };
    expectAsFinished(write, 135'000, "descriptions");
}

// An hour of 60 pictures a second and two sounds, of which the media are holes: nothing of it may be held, and no more be
// read than where it lies.
class Hour final : public BoxSource, public BoxSink {
public:
    bool append(std::span<const std::uint8_t> bytes) override {
        const bool isMedia = bytes.size() > 2 && bytes[0] == 0xEE && bytes[1] == 0xEE;
        if (!isMedia) {
            pieces_.emplace_back(size_, Bytes(bytes.begin(), bytes.end()));
        }
        size_ += bytes.size();
        return true;
    }
    bool overwrite(std::uint64_t offset, std::span<const std::uint8_t> bytes) override {
        auto piece = std::upper_bound(pieces_.begin(), pieces_.end(), offset,
                                      [](std::uint64_t at, const auto& one) { return at < one.first; });
        --piece;
        std::copy(bytes.begin(), bytes.end(), piece->second.begin() + static_cast<std::ptrdiff_t>(offset - piece->first));
        return true;
    }
    bool sync() override { return true; }
    std::uint64_t size() const override { return size_; }
    bool read(std::uint64_t offset, std::span<std::uint8_t> out) override {
        bytesRead += out.size();
        calls += 1;
        auto piece = std::upper_bound(pieces_.begin(), pieces_.end(), offset,
                                      [](std::uint64_t at, const auto& one) { return at < one.first; });
        --piece;
        const std::uint64_t at = offset - piece->first;
        if (at + out.size() > piece->second.size()) {
            readsMedia = true;
            return false;
        }
        std::copy_n(piece->second.begin() + static_cast<std::ptrdiff_t>(at), out.size(), out.begin());
        return true;
    }
    [[nodiscard]] Bytes lastPiece() const { return pieces_.back().second; }

    std::uint64_t bytesRead = 0;
    std::uint64_t calls = 0;
    bool readsMedia = false;

private:
    std::vector<std::pair<std::uint64_t, Bytes>> pieces_;
    std::uint64_t size_ = 0;
};

TEST(RecoveredTimes, OfAnHourTakeWorkForTheIndexAlone) {
    constexpr int kSeconds = 3600;
    Hour file;
    MovieBoxWriter writer(file);
    const auto video = writer.addVideoTrack(test::videoDescription());
    const auto sound = writer.addAudioTrack(test::audioDescription());
    const auto voice = writer.addAudioTrack(test::audioDescription("Microphone"));
    ASSERT_EQ(writer.start(), MovieError::none);
    const Bytes picture(20'000, 0xEE);
    const Bytes packet(340, 0xEE);
    std::int64_t frames = -1024;
    for (std::int64_t i = 0; i < std::int64_t{kSeconds} * 60; ++i) {
        const std::int64_t pts = i * kSecond / 60;
        for (; frames * 1000 < pts * 48; frames += 1024) {
            ASSERT_EQ(writer.addSample(*sound, {frames, 1024}, packet), MovieError::none);
            ASSERT_EQ(writer.addSample(*voice, {frames, 1024}, packet), MovieError::none);
        }
        ASSERT_EQ(writer.addSample(*video, {pts, 0, i % 60 == 0}, picture), MovieError::none);
    }
    ASSERT_EQ(writer.flushFragment(), MovieError::none);
    ASSERT_GT(file.size(), 4ULL << 30U);
    EXPECT_EQ(nameOf(recoverMovie(file, file)), nameOf(Recovery::recovered));
    EXPECT_FALSE(file.readsMedia);
    EXPECT_LT(file.bytesRead, 8U << 20U);
    EXPECT_LT(file.calls, 4U * 3 * kSeconds);
    Bytes index = file.lastPiece();
    const auto movie = test::parseBoxes(index)[0];
    ASSERT_EQ(movie.type, "free");
    const auto inside = test::parseBoxes(movie.payload);
    const auto track = test::parseTrack(*inside[0].all("trak")[0]);
    EXPECT_EQ(track.samples.size(), std::size_t{kSeconds} * 60);
    EXPECT_GT(track.samples.back().offset, 4ULL << 30U);
    const MovieLook look = lookAtMovie(file);
    EXPECT_EQ(nameOf(look.state), "recovered");
    EXPECT_NEAR(static_cast<double>(look.nanoseconds.value_or(0)) / 1e9, kSeconds, 0.1);
}

}  // namespace
}  // namespace lumacast::mp4
