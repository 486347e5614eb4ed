// Recordings through the real daemon, judged by what the movies show.

#include <gtest/gtest.h>
#include <signal.h>

#include <filesystem>

#include "tests/checkers/check_movie/MovieCheck.h"
#include "tests/system/MovingWindow.h"
#include "tests/system/World.h"

namespace lumacast::test {
namespace {

using checkers::FrameExpectation;
using checkers::NumberRange;
using std::chrono::milliseconds;

// A sanitizer's daemon is many times slower: a small, slow picture there, and the content is judged, not the rate.
#ifdef LC_SANITIZED
constexpr std::uint32_t kStretch = 12;
constexpr milliseconds kLargestHole{1500};
constexpr milliseconds kEndsApart{2000};
#else
constexpr std::uint32_t kStretch = 60;
constexpr milliseconds kLargestHole{67};  // two frame times
constexpr milliseconds kEndsApart{250};   // sound against picture
#endif

void addRange(std::set<std::uint32_t>& numbers, std::uint32_t first, std::uint32_t last) {
    for (std::uint32_t number = first; number <= last; ++number) numbers.insert(number);
}

checkers::FrameReport judge(const std::string& movie, const FrameExpectation& expectation) {
    const auto report = checkers::checkFrameNumbers(picturesOf(movie), expectation);
    for (const auto& finding : report.findings) ADD_FAILURE() << finding.text;
    return report;
}

/// Every picture has its place on the time line of the log, and no step from one to the next is longer than the
/// application's own by more than a frame time. The very first picture shows what had stood there before the start, and
/// is left out.
[[maybe_unused]] void judgeTimeLine(const std::string& movie, const std::vector<NumberRange>& forbidden,
                   const checkers::FramesLog& drawn) {
    auto pictures = picturesOf(movie);
    ASSERT_GT(pictures.size(), 2u);
    std::chrono::nanoseconds slowest = kLargestHole / 2;
    for (auto frame = drawn.upper_bound(*pictures.front().number); frame != drawn.end(); ++frame)
        slowest = std::max(slowest, frame->second.shown - std::prev(frame)->second.sent);
    pictures.erase(pictures.begin());
    FrameExpectation expectation;
    expectation.forbidden = forbidden;
    expectation.allowedRepeats = 8;
    expectation.drawn = drawn;
    expectation.largestHole = slowest + kLargestHole / 2;
    for (const auto& finding : checkers::checkFrameNumbers(pictures, expectation).findings)
        ADD_FAILURE() << finding.text;
}

TEST(Recording, ShowsEveryFrameThatWasDrawnInOrderAndOnTime) {
    World world;
    world.startDaemon();
    const auto application = world.application(kJudged);
    ASSERT_TRUE(application->waitForFrame(3));
    const std::uint32_t first = application->askForFrame("start");
    ASSERT_TRUE(application->waitForFrame(first + kStretch));
    const std::uint32_t last = application->askForFrame("frame");
    const std::string movie = application->stop();
    ASSERT_FALSE(movie.empty());

    FrameExpectation expectation;
    addRange(expectation.expected, first + 1, last - 1);
    expectation.allowedRepeats = 2;
    judge(movie, expectation);
#ifndef LC_SANITIZED
    judgeTimeLine(movie, {}, application->framesLog());
#endif

    checkers::MovieReader reader(movie);
    ASSERT_EQ(reader.videoTracks().size(), 1u);
    EXPECT_EQ(reader.videoTracks()[0].codec, "h264");
    EXPECT_EQ(reader.videoTracks()[0].profile, "High");
    // The application plays nothing, and there is no sound server: silence for as long as the pictures last.
    ASSERT_EQ(reader.audioTracks().size(), 1u);
    EXPECT_EQ(reader.audioTracks()[0].codec, "aac");
    EXPECT_LT(abs(reader.audioTracks()[0].duration - reader.videoTracks()[0].duration), kEndsApart);
    const auto sound = reader.readSound();
    ASSERT_TRUE(sound.has_value()) << reader.error();
    float loudest = 0;
    for (const float sample : sound->samples) loudest = std::max(loudest, std::abs(sample));
    EXPECT_LT(loudest, 1e-4F);
    checkers::MovieCheckOptions whole;
    whole.movie = movie;
    whole.frames.allowedRepeats = 2;
    for (const auto& finding : checkers::checkMovie(whole).findings) ADD_FAILURE() << finding;
}

TEST(Recording, HasNoFrameOfAPauseAndNoHoleWhereItWas) {
    World world;
    world.startDaemon();
    const auto application = world.application(kJudged);
    ASSERT_TRUE(application->waitForFrame(3));
    FrameExpectation expectation;
    std::uint32_t from = application->askForFrame("start");
    for (int pause = 0; pause < 3; ++pause) {
        ASSERT_TRUE(application->waitForFrame(from + kStretch / 2));
        const std::uint32_t paused = application->askForFrame("pause");
        addRange(expectation.expected, from + 1, paused - 1);
        ASSERT_TRUE(application->waitForFrame(paused + 8));
        // What is on the screen when the recording goes on belongs to it again.
        const std::uint32_t stillPaused = application->askForFrame("frame") - 1;
        expectation.forbidden.push_back({paused + 1, stillPaused});
        from = application->askForFrame("resume");
    }
    ASSERT_TRUE(application->waitForFrame(from + kStretch / 2));
    addRange(expectation.expected, from + 1, application->askForFrame("frame") - 1);
    expectation.allowedRepeats = 8;  // what stood when a pause began may be shown again after it
    const std::string movie = application->stop();
    judge(movie, expectation);
#ifndef LC_SANITIZED
    judgeTimeLine(movie, expectation.forbidden, application->framesLog());
#endif
}

TEST(Recording, StillGoesOnAfterVeryManyPauses) {
    const int pauses = longTests() ? 10'000 : 300;
    World world;
    world.startDaemon();
#ifdef LC_SANITIZED
    const auto application = world.application(kJudged);
#else
    const auto application = world.application({"--size", "320x180", "--fps", "60"});
#endif
    ASSERT_TRUE(application->waitForFrame(3));
    (void)application->askForFrame("start");
    for (int i = 0; i < pauses; ++i) {
        ASSERT_TRUE(application->ask("pause").starts_with("paused")) << i;
        ASSERT_TRUE(application->ask("resume").starts_with("resumed")) << i;
    }
    const std::uint32_t from = application->askForFrame("frame");
    ASSERT_TRUE(application->waitForFrame(from + kStretch));
    FrameExpectation expectation;
    addRange(expectation.expected, from + 2, from + kStretch - 2);
    expectation.allowedRepeats = static_cast<std::size_t>(pauses) + 5;
    const auto report = judge(application->stop(), expectation);
    EXPECT_GE(report.pictures, kStretch);
}

TEST(Recording, TrimmedToAClipBeginsOnThePictureOfThatMoment) {
    World world;
    world.startDaemon();
    const auto application = world.application(kJudged);
    ASSERT_TRUE(application->waitForFrame(3));
    const std::uint32_t first = application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(4.2));
    const std::string clip = application->stop("clip 1 2");
    ASSERT_TRUE(clip.ends_with("/Self Recorder_trimmed.mp4")) << clip;
    const auto pictures = picturesOf(clip);
    ASSERT_FALSE(pictures.empty());
    const auto whole = picturesOf(world.moviePath());
    // What the whole movie shows at one second is what the clip shows first.
    std::optional<std::uint32_t> atOneSecond;
    for (const auto& picture : whole)
        if (picture.time <= std::chrono::seconds(1)) atOneSecond = picture.number;
    ASSERT_TRUE(atOneSecond && pictures.front().number);
    EXPECT_GE(*pictures.front().number, *atOneSecond);
    EXPECT_LE(*pictures.front().number, *atOneSecond + 1);
    EXPECT_GT(*pictures.front().number, first);
    const double seconds = std::chrono::duration<double>(checkers::MovieReader(clip).duration()).count();
    const double wholeSeconds =
        std::chrono::duration<double>(checkers::MovieReader(world.moviePath()).duration()).count();
    EXPECT_NEAR(seconds, wholeSeconds - 3, 0.1);
}

TEST(Recording, OfAStillWindowIsAsLongAsItLasted) {
    World world;
    world.startDaemon();
    const auto application = world.application({"--size", "320x180", "--still"});
    ASSERT_TRUE(application->waitForFrame(1));
    (void)application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(3));
    const double elapsed = world.recording()["elapsedSeconds"].get<double>();
    const std::string movie = application->stop();
    EXPECT_NEAR(std::chrono::duration<double>(checkers::MovieReader(movie).duration()).count(), elapsed, 0.5);
    for (const auto& picture : picturesOf(movie)) EXPECT_EQ(picture.number, 1u);
}

TEST(Recording, GoesOnWhileItsWindowIsHiddenMovedAndResized) {
    World world;
    world.startDaemon();
    const auto application = world.application(kJudged);
    ASSERT_TRUE(application->waitForFrame(3));
    const std::uint32_t first = application->askForFrame("start");
    ASSERT_TRUE(application->waitForFrame(first + 5));
    EXPECT_EQ(application->ask("hide"), "ok");
    EXPECT_EQ(application->ask("show"), "ok");
    ASSERT_TRUE(application->waitForFrame(application->askForFrame("frame") + 5));
    EXPECT_EQ(application->ask("move 100 50"), "ok");
    EXPECT_EQ(application->ask("size 480 270"), "ok");
    const std::uint32_t from = application->askForFrame("frame");
    ASSERT_TRUE(application->waitForFrame(from + kStretch));
    const auto pictures = picturesOf(application->stop());
    std::set<std::uint32_t> seen;
    for (const auto& picture : pictures)
        if (picture.number) seen.insert(*picture.number);
    // Well after the change of size every frame is there again.
    for (std::uint32_t number = from + kStretch / 2; number < from + kStretch; ++number)
        EXPECT_TRUE(seen.contains(number)) << number;
}

TEST(Recording, EndsWithAnErrorWhenItsWindowIsGone) {
    World world;
    world.startDaemon();
    const auto recorded = world.application(kJudged);
    ASSERT_TRUE(recorded->waitForFrame(3));
    (void)recorded->askForFrame("start");
    // Stopped, so that the application does not go with its display: the end of the connection would come first.
    ::kill(recorded->pid(), SIGSTOP);
    ::kill(world.display().pid(), SIGTERM);
    EXPECT_TRUE(waitUntil([&] { return world.recording().is_null(); })) << world.daemonLog();
    const auto isLogged = [&](const char* line) {
        return waitUntil([&] { return world.daemonLog().find(line) != std::string::npos; });
    };
    EXPECT_TRUE(isLogged("LCRecordingSession: screenCaptureController: didFailWithStatus:")) << world.daemonLog();
    EXPECT_TRUE(isLogged("LCClientProxy:stopRecordingWithError:movieURL:")) << world.daemonLog();
    ::kill(recorded->pid(), SIGCONT);
}

}  // namespace
}  // namespace lumacast::test
