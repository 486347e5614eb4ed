// Clips made into segments: what the joined segments hold.

#include <gtest/gtest.h>

#include <fstream>

#include "extensions/hls-clips/Segmenter.h"
#include "tests/extension/StreamJudge.h"
#include "tests/extension/TestClips.h"

namespace lumacast::test {
namespace {

using extensions::kTicksPerSecond;
using extensions::Segment;
using extensions::Segmenter;

class Segments : public ::testing::Test {
protected:
    void add(const ClipPlan& plan = {}, bool isLast = false) {
        std::string error;
        auto more = segmenter.add(clips.next(plan), isLast, error);
        EXPECT_EQ(error, "");
        for (Segment& segment : more) segments.push_back(std::move(segment));
    }
    /// All segments behind the first one's header.
    std::string joined() {
        const std::string path = scratch.path("joined.mp4");
        std::ofstream file(path, std::ios::binary);
        const auto write = [&](const Data& bytes) {
            file.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
        };
        write(segments.front().init);
        for (const Segment& segment : segments) write(segment.media);
        return path;
    }
    static constexpr std::int64_t kClipTicks = 45 * kTicksPerSecond / kClipRate;

    ScratchDirectory scratch;
    TestClips clips{scratch};
    Segmenter segmenter{6};
    std::vector<Segment> segments;
};

TEST_F(Segments, JoinedTheyHoldEveryFrameInOrderAndASoundWithoutABreak) {
    for (int at = 0; at < 4; ++at) add({}, at == 3);
    ASSERT_EQ(segments.size(), 4u);
    const std::string path = joined();
    expectFrames(path, 0, clips.frames() - 1);
    const checkers::Sound sound = soundOf(path);
    const checkers::Stretch all{std::chrono::milliseconds(50), std::chrono::milliseconds(5900)};
    expectUnbrokenTone(sound, kApplicationTone, kQuietTone, all);
    expectUnbrokenTone(sound, kMicrophoneTone, kQuietTone, all);
}

TEST_F(Segments, TheirLengthsAreThoseOfTheirPicturesExactly) {
    for (int at = 0; at < 3; ++at) add({}, at == 2);
    const auto pictures = picturesOf(joined());
    ASSERT_EQ(pictures.size(), 135u);
    std::int64_t begin = 0;
    for (std::size_t at = 0; at < segments.size(); ++at) {
        const auto nanoseconds = std::chrono::nanoseconds(begin * 100'000 / 9);
        EXPECT_LE(std::chrono::abs(pictures[at * 45].time - pictures[0].time - nanoseconds),
                  std::chrono::nanoseconds(11'112));
        begin += segments[at].ticks;
    }
    EXPECT_NEAR(static_cast<double>(begin), 3.0 * kClipTicks, 3 * kTicksPerSecond / 50.0);
}

TEST_F(Segments, ClipsOfTheSameKindShareTheirHeader) {
    for (int at = 0; at < 2; ++at) add();
    EXPECT_EQ(segments[0].init, segments[1].init);
    add({.width = 400, .height = 240});
    EXPECT_NE(segments[1].init, segments[2].init);
}

TEST_F(Segments, AClipWithoutSoundIsSilentAndTheNextOnesSoundIsInItsPlace) {
    add({.hasMicrophone = false});
    add({.hasSound = false});
    add({.hasMicrophone = false}, true);
    const std::string path = joined();
    expectFrames(path, 0, clips.frames() - 1);
    const checkers::Sound sound = soundOf(path);
    using std::chrono::milliseconds;
    expectUnbrokenTone(sound, kApplicationTone, kQuietTone, {milliseconds(50), milliseconds(1450)});
    EXPECT_EQ(checkToneAbsent(sound, kApplicationTone, -50, {milliseconds(1600), milliseconds(2950)}),
              checkers::Findings{});
    expectUnbrokenTone(sound, kApplicationTone, kQuietTone, {milliseconds(3060), milliseconds(4400)});
}

TEST_F(Segments, ALongClipBecomesSeveralSegmentsThatBeginWithAKeyFrame) {
    Segmenter strict{2};
    std::string error;
    segments = strict.add(clips.next({.frames = 150}), true, error);
    EXPECT_EQ(error, "");
    ASSERT_GE(segments.size(), 3u);
    std::int64_t ticks = 0;
    for (const Segment& segment : segments) {
        EXPECT_LE(segment.ticks, 2 * kTicksPerSecond);
        ticks += segment.ticks;
    }
    EXPECT_NEAR(static_cast<double>(ticks), 5.0 * kTicksPerSecond, kTicksPerSecond / 20.0);
    expectFrames(joined(), 0, 149);
}

TEST_F(Segments, AFileThatIsNoMovieIsLeftOutAndTheNextOneSaysSo) {
    add();
    std::string error;
    const Fd text(::open(scratch.write("text", "no movie at all").c_str(), O_RDONLY | O_CLOEXEC));
    EXPECT_TRUE(segmenter.add(text, false, error).empty());
    EXPECT_NE(error, "");
    add({}, true);
    ASSERT_EQ(segments.size(), 2u);
    EXPECT_FALSE(segments[0].isDiscontinuous);
    EXPECT_TRUE(segments[1].isDiscontinuous);
    expectFrames(joined(), 0, 89);
}

}  // namespace
}  // namespace lumacast::test
