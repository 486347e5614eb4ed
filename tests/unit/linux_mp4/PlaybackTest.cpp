#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstring>

#include "tests/unit/linux_mp4/BoxParser.h"
#include "tests/unit/linux_mp4/Media.h"
#include "tests/unit/linux_mp4/Times.h"
#include "tests/unit/linux_mp4/Tools.h"

namespace lumacast::mp4 {
namespace {

using test::MemorySink;

// Times at which the decoded sound sets in after silence, in frames from the beginning of the movie, sound of that
// stream alone.
std::vector<std::int64_t> onsets(const std::filesystem::path& movie) {
    const auto result =
        test::runTool({"ffmpeg", "-nostdin", "-v", "error", "-copyts", "-i", movie.string(), "-map", "0:a:0", "-af",
                       "aresample=async=1:first_pts=0", "-ac", "1", "-f", "f32le", "-"});
    std::vector<float> values(result.output.size() / sizeof(float));
    std::memcpy(values.data(), result.output.data(), values.size() * sizeof(float));
    std::vector<std::int64_t> found;
    std::int64_t lastLoud = -kRate;
    for (std::size_t i = 0; i < values.size(); ++i) {
        if (std::fabs(values[i]) < 0.1F) {
            continue;
        }
        const auto at = static_cast<std::int64_t>(i);
        if (at - lastLoud > kRate / 10) {
            found.push_back(at);
        }
        lastLoud = at;
    }
    return found;
}

// Stamps of the pictures that are white.
std::vector<std::int64_t> flashes(const std::filesystem::path& movie) {
    const auto frames = test::playStrictly(movie).pictures;
    const auto result =
        test::runTool({"ffmpeg", "-nostdin", "-v", "error", "-i", movie.string(), "-map", "0:v:0", "-vf", "scale=1:1",
                       "-pix_fmt", "gray", "-vsync", "passthrough", "-f", "rawvideo", "-"});
    std::vector<std::int64_t> found;
    for (std::size_t i = 0; i < frames.size() && i < result.output.size(); ++i) {
        if (static_cast<std::uint8_t>(result.output[i]) > 200) {
            found.push_back(frames[i]);
        }
    }
    return found;
}

bool isLoud(std::int64_t frame) {
    return frame % kRate >= kRate / 2 && frame % kRate < kRate / 2 + kRate / 10;
}
bool isBright(std::int64_t stamp) {
    return stamp % kSecond >= kSecond / 2 && stamp % kSecond < kSecond / 2 + 50'000;
}

class Playback : public ::testing::Test {
protected:
    test::TemporaryDirectory directory;
    MemorySink sink;

    // Decodes every track without an error and shows exactly these pictures.
    static void expectClean(const std::filesystem::path& movie, const std::vector<std::int64_t>& stamps) {
        const auto played = test::playStrictly(movie);
        EXPECT_EQ(played.status, 0) << movie;
        EXPECT_EQ(played.errors, "") << movie;
        EXPECT_EQ(played.pictures, stamps) << movie;
    }
};

TEST_F(Playback, OfAFinishedMovieIsCleanAndCompletelyDescribed) {
    const auto stamps = test::steadyStamps(150, 30);
    const auto video = test::encodeVideo(stamps);
    const auto sound = test::encodeAudio(0, 5 * kRate, isLoud, "Application audio");
    const auto voice = test::encodeAudio(0, 5 * kRate, isLoud, "Microphone");
    MovieBoxWriter writer(sink);
    ASSERT_EQ(test::writeMovie(writer, video, {&sound, &voice}), MovieError::none);
    ASSERT_EQ(writer.finish(5 * kSecond), MovieError::none);
    const auto movie = directory.write("movie.mp4", sink.file());
    expectClean(movie, stamps);
    const auto lines = test::probe(movie,
                                   "stream=codec_name,width,height,color_range,color_space,color_transfer,"
                                   "color_primaries,sample_rate,channels,nb_frames,start_time,duration:"
                                   "stream_tags=handler_name:format=duration,start_time");
    const std::vector<std::string> expected{
        "codec_name=h264|width=320|height=176|color_range=tv|color_space=smpte170m|color_transfer=smpte170m|"
        "color_primaries=smpte170m|start_time=0.000000|duration=5.000000|nb_frames=150|tag:handler_name=Screen",
        "codec_name=aac|sample_rate=48000|channels=2|start_time=0.000000|duration=5.000000|nb_frames=236|"
        "tag:handler_name=Application audio",
        "codec_name=aac|sample_rate=48000|channels=2|start_time=0.000000|duration=5.000000|nb_frames=236|"
        "tag:handler_name=Microphone",
        "start_time=0.000000|duration=5.000000",
    };
    EXPECT_EQ(lines, expected);
}

TEST_F(Playback, KeepsStampsOfAVariableFrameRateExactlyWhileRecordingAndAfter) {
    std::vector<std::int64_t> stamps{0};
    std::uint32_t state = 11;
    while (stamps.back() < 12 * kSecond) {
        state = state * 1664525U + 1013904223U;
        stamps.push_back(stamps.back() + 8'333 + (state >> 8U) % (state % 5 == 0 ? 1'000'000U : 40'000U));
    }
    const auto video = test::encodeVideo(stamps);
    MovieBoxWriter writer(sink);
    ASSERT_EQ(test::writeMovie(writer, video, {}), MovieError::none);
    ASSERT_EQ(writer.flushFragment(), MovieError::none);
    const auto recording = directory.write("recording.mp4", sink.file());
    ASSERT_EQ(writer.finish(stamps.back() + kSecond), MovieError::none);
    const auto finished = directory.write("finished.mp4", sink.file());
    for (const auto& movie : {recording, finished}) {
        expectClean(movie, stamps);
    }
}

TEST_F(Playback, StartsWithTheFirstPictureWhateverTheZeroOfTheStamps) {
    for (const std::int64_t first : {-5 * kSecond - 123, std::int64_t{86'400} * 365 * kSecond + 77}) {
        MemorySink target;
        const auto stamps = test::steadyStamps(60, 30, first);
        const auto video = test::encodeVideo(stamps);
        MovieBoxWriter writer(target);
        ASSERT_EQ(test::writeMovie(writer, video, {}), MovieError::none);
        ASSERT_EQ(writer.flushFragment(), MovieError::none);
        const auto recording = directory.write("recording.mp4", target.file());
        ASSERT_EQ(writer.finish(first + 2 * kSecond), MovieError::none);
        const auto finished = directory.write("finished.mp4", target.file());
        for (const auto& movie : {recording, finished}) {
            expectClean(movie, test::steadyStamps(60, 30));
        }
    }
}

// Sound that begins with the picture, before it and after it.
TEST_F(Playback, KeepsSoundAndPictureTogetherWhileRecordingAndAfter) {
    for (const double begins : {0.0, -0.73, 1.26}) {
        MemorySink target;
        const auto video = test::encodeVideo(test::steadyStamps(180, 60), isBright);
        const auto start = static_cast<std::int64_t>(begins * kRate);
        const auto sound = test::encodeAudio(start, 3 * kRate - start, isLoud, "Application audio");
        MovieBoxWriter writer(target);
        ASSERT_EQ(test::writeMovie(writer, video, {&sound}), MovieError::none);
        ASSERT_EQ(writer.flushFragment(), MovieError::none);
        const auto recording = directory.write("recording.mp4", target.file());
        ASSERT_EQ(writer.finish(3 * kSecond), MovieError::none);
        const auto finished = directory.write("finished.mp4", target.file());
        for (const auto& movie : {recording, finished}) {
            SCOPED_TRACE(movie.string() + " begins " + std::to_string(begins));
            expectClean(movie, test::steadyStamps(180, 60));
            const auto seen = flashes(movie);
            ASSERT_EQ(seen.size(), 9U);
            EXPECT_EQ(seen[0], 500'000);
            EXPECT_EQ(seen[3], 1'500'000);
            EXPECT_EQ(seen[6], 2'500'000);
            std::vector<std::int64_t> expected;
            for (std::int64_t at = kRate / 2; at < 3 * kRate; at += kRate) {
                if (at >= start) {
                    expected.push_back(at);
                }
            }
            const auto heard = onsets(movie);
            ASSERT_EQ(heard.size(), expected.size());
            for (std::size_t i = 0; i < heard.size(); ++i) {
                EXPECT_NEAR(static_cast<double>(heard[i]), static_cast<double>(expected[i]), 5.0 * kRate / 1000);
            }
        }
    }
}

TEST_F(Playback, OfAStillWindowLosesNoMoreThanTheNewestPicture) {
    const auto stamps = test::steadyStamps(8, 1);
    const auto video = test::encodeVideo(stamps);
    MovieBoxWriter writer(sink);
    const auto track = writer.addVideoTrack(video.description);
    ASSERT_EQ(writer.start(), MovieError::none);
    for (std::size_t i = 0; i < stamps.size(); ++i) {
        ASSERT_EQ(writer.addSample(*track, video.samples[i].info, video.samples[i].bytes), MovieError::none);
        const std::vector<std::int64_t> before(stamps.begin(), stamps.begin() + static_cast<std::ptrdiff_t>(i));
        if (i > 0) {
            const auto killed = directory.write("killed.mp4", sink.file());
            expectClean(killed, before);
        }
        if (i % 3 == 1) {  // an owner that flushes once a second loses nothing
            ASSERT_EQ(writer.flushFragment(), MovieError::none);
            const auto flushed = directory.write("flushed.mp4", sink.file());
            expectClean(flushed, test::steadyStamps(static_cast<int>(i) + 1, 1));
        }
    }
    ASSERT_EQ(writer.finish(20 * kSecond), MovieError::none);
    const auto movie = directory.write("movie.mp4", sink.file());
    expectClean(movie, stamps);
    EXPECT_EQ(test::probe(movie, "format=duration"), std::vector<std::string>{"duration=20.000000"});
}

TEST_F(Playback, OfARecordingWhoseSoundTracksAreEmptyIsClean) {
    const auto stamps = test::steadyStamps(90, 30);
    const auto video = test::encodeVideo(stamps);
    auto empty = test::encodeAudio(0, 1024, nullptr, "Application audio");
    empty.samples.clear();
    auto voice = empty;
    voice.description.name = "Microphone";
    MovieBoxWriter writer(sink);
    ASSERT_EQ(test::writeMovie(writer, video, {&empty, &voice}), MovieError::none);
    ASSERT_EQ(writer.flushFragment(), MovieError::none);
    const auto recording = directory.write("recording.mp4", sink.file());
    ASSERT_EQ(writer.finish(3 * kSecond), MovieError::none);
    const auto finished = directory.write("finished.mp4", sink.file());
    EXPECT_EQ(test::probe(recording, "stream=codec_type").size(), 3U);
    EXPECT_EQ(test::probe(finished, "stream=codec_type"), std::vector<std::string>{"codec_type=video"});
    for (const auto& movie : {recording, finished}) {
        expectClean(movie, stamps);
    }
}

TEST_F(Playback, TurnsThePictureAsTheTransformSays) {
    auto video = test::encodeVideo(test::steadyStamps(5, 30));
    video.description.transform = {0, 1, -1, 0, 176, 0};
    MovieBoxWriter writer(sink);
    ASSERT_EQ(test::writeMovie(writer, video, {}), MovieError::none);
    ASSERT_EQ(writer.finish(kSecond), MovieError::none);
    const auto movie = directory.write("movie.mp4", sink.file());
    expectClean(movie, test::steadyStamps(5, 30));
    const auto lines = test::probe(movie, "stream_side_data=rotation");
    ASSERT_FALSE(lines.empty());
    EXPECT_NE(lines[0].find("rotation=-90"), std::string::npos) << lines[0];
}

TEST_F(Playback, DecodingStrictlyNoticesADamagedPicture) {
    const auto video = test::encodeVideo(test::steadyStamps(30, 30));
    MovieBoxWriter writer(sink);
    ASSERT_EQ(test::writeMovie(writer, video, {}), MovieError::none);
    ASSERT_EQ(writer.finish(kSecond), MovieError::none);
    auto bytes = sink.file();
    const auto boxes = test::parseBoxes(bytes);
    const auto sample = test::parseTrack(boxes.at(2).at("trak")).samples.at(10);
    bytes[sample.offset + 2] ^= 0x10;
    EXPECT_NE(test::playStrictly(directory.write("movie.mp4", bytes)).status, 0);
}

}  // namespace
}  // namespace lumacast::mp4
