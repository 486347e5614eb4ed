// The whole display, recorded by the tool as a privileged application: its own entry, entitled by a drop-in.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <set>

#include "tests/checkers/ToneChecker.h"
#include "tests/dialog/DialogUser.h"
#include "tests/system/DisplayTool.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;
using ::testing::StartsWith;

class DisplayRecording : public DisplayTool {
protected:
    /// What a player shows of the movie there, as a movie of its own.
    std::string shownAt(const std::string& movie, int x, int y, int width, int height) {
        const std::string part = world_.path("part.mp4");
        const std::string size = std::to_string(width) + ":" + std::to_string(height);
        const std::string place = std::to_string(x) + ":" + std::to_string(y);
        const std::string command = "ffmpeg -v error -y -i '" + movie + "' -vf crop=" + size + ":" + place +
                                    " -an -c:v libx264 -preset ultrafast -qp 0 '" + part + "' </dev/null";
        EXPECT_EQ(std::system(command.c_str()), 0);
        return part;
    }
};

/// How much louder one tone is than another in a stretch of a movie's sound, in dB.
double louderBy(const checkers::Sound& sound, double from, double to, double tone, double other) {
    const auto at = [&](double seconds) {
        return sound.samples.begin() + std::clamp<std::ptrdiff_t>(static_cast<std::ptrdiff_t>(seconds * sound.rate), 0,
                                                                  std::ssize(sound.samples));
    };
    const std::vector<float> part(at(from), at(to));
    return checkers::toneLevel(part, sound.rate, tone) - checkers::toneLevel(part, sound.rate, other);
}

TEST_F(DisplayRecording, IsUprightAndHasTheSoundOfWhatIsInFront) {
    entitle();
    world_.startDaemon();
    const std::string movie = world_.path("display.mp4");
    const auto recorder = tool({"--output", movie});
    ASSERT_TRUE(DialogUser(world_.display().name()).answer(DialogUser::Button::Default)) << world_.daemonLog();
    ASSERT_TRUE(waitUntil([&] { return elapsed() > 0; })) << world_.daemonLog() << complaints();

    const auto first = world_.otherApplication("First", {"--size", "640x360", "--fps", "10", "--tone", "700"});
    ASSERT_EQ(first->ask("move 100 200"), "ok");
    ASSERT_TRUE(first->waitForFrame(5));
    const double firstFrom = elapsed();
    const std::uint32_t from = first->askForFrame("frame");
    ASSERT_TRUE(world_.waitForElapsed(firstFrom + 3));
    const double firstTo = elapsed();
    const auto second = world_.otherApplication("Second", {"--size", "320x180", "--fps", "10", "--tone", "1900"});
    ASSERT_EQ(second->ask("move 1300 800"), "ok");
    ASSERT_TRUE(second->waitForFrame(5));
    const double secondFrom = elapsed();
    ASSERT_TRUE(world_.waitForElapsed(secondFrom + 3));
    const double secondTo = elapsed();
    const std::uint32_t to = first->askForFrame("frame");
    second->kill();
    ASSERT_TRUE(world_.waitForElapsed(secondTo + 2));
    const auto current = world_.recording();
    EXPECT_EQ(current["width"], 1080);
    EXPECT_EQ(current["height"], 1920);
    ASSERT_GT(recorder->pid(), 1);
    ::kill(recorder->pid(), SIGINT);
    EXPECT_EQ(recorder->wait(), 0) << complaints() << world_.daemonLog();
    EXPECT_EQ(recorder->readAll(), movie + "\n");

    checkers::MovieReader reader(movie);
    ASSERT_EQ(reader.videoTracks().size(), 1u) << reader.error();
    EXPECT_EQ(reader.videoTracks()[0].width, 1080);
    EXPECT_EQ(reader.videoTracks()[0].height, 1920);
    EXPECT_EQ(reader.videoTracks()[0].rotation, 90);
    // Numbers can be read where the windows were, as a player turns the movie.
    std::set<std::uint32_t> shown;
    for (const auto& picture : picturesOf(shownAt(movie, 100, 200, 640, 360), true))
        if (picture.number) shown.insert(*picture.number);
    std::size_t missing = 0;
    for (std::uint32_t number = from + 1; number < to; ++number) missing += shown.contains(number) ? 0 : 1;
    std::printf("    %zu of %u frames drawn and not seen\n", missing, to - from - 1);
    EXPECT_LE(missing, (to - from) / 5) << "those of a machine that stood still";
    std::size_t ofSecond = 0;
    for (const auto& picture : picturesOf(shownAt(movie, 1300, 800, 320, 180), true)) ofSecond += picture.number ? 1 : 0;
    EXPECT_GT(ofSecond, 10u);

    ASSERT_EQ(reader.audioTracks().size(), 1u);
    const auto sound = reader.readSound();
    ASSERT_TRUE(sound) << reader.error();
    const double firstAlone = louderBy(*sound, firstFrom + 0.7, firstTo - 0.2, 700, 1900);
    const double secondAlone = louderBy(*sound, secondFrom + 0.7, secondTo - 0.2, 1900, 700);
    std::printf("    in front: its tone %.0f dB and %.0f dB above the other's\n", firstAlone, secondAlone);
    // On a machine that stands still the sound has gaps, whose clicks have a little of every tone.
    EXPECT_GT(firstAlone, 40);
    EXPECT_GT(secondAlone, 40);
    // One that has ended is heard no more, nor anybody whose turn has not come.
    const double length = static_cast<double>(sound->samples.size()) / sound->rate;
    EXPECT_LT(checkers::toneLevel(std::vector<float>(sound->samples.end() - sound->rate, sound->samples.end()),
                                  sound->rate, 1900),
              -60)
        << length;
}

TEST_F(DisplayRecording, EndsWithItsDurationAndIsSavedToTheLibrary) {
    entitle();
    askNobody();
    world_.startDaemon();
    const auto recorder = tool({"--duration", "2"});
    EXPECT_EQ(recorder->wait(), 0) << complaints() << world_.daemonLog();
    const std::string saved = recorder->readLine();
    EXPECT_THAT(saved, StartsWith(world_.path("videos")));
    checkers::MovieReader reader(saved);
    ASSERT_EQ(reader.videoTracks().size(), 1u) << reader.error();
    EXPECT_NEAR(std::chrono::duration<double>(reader.duration()).count(), 2, 0.5);
    EXPECT_EQ(reader.videoTracks()[0].rotation, 90);
}

TEST_F(DisplayRecording, EndsWithAKeyAndShowsHowFarItIs) {
    entitle();
    askNobody();
    world_.startDaemon();
    const std::string movie = world_.path("display.mp4");
    // A terminal between: what is sent to it are keys.
    checkers::Child terminal({"script", "-qfec", "'" + world_.path("lumacastctl") + "' record --display --output '" +
                                                     movie + "'", "/dev/null"},
                             world_.environment(), world_.path("tool.log"));
    ASSERT_TRUE(waitUntil([&] { return elapsed() > 1; })) << world_.daemonLog();
    terminal.send("q");
    const std::string output = terminal.readAll();
    EXPECT_EQ(terminal.wait(), 0) << output;
    EXPECT_THAT(output, HasSubstr(" frames"));
    EXPECT_THAT(output, HasSubstr("q or Ctrl-C stops"));
    EXPECT_THAT(output, HasSubstr(movie));
    EXPECT_TRUE(fs::exists(movie));
}

TEST_F(DisplayRecording, IsRefusedWithoutTheDropIn) {
    world_.startDaemon();
    const auto recorder = tool({"--duration", "1"});
    EXPECT_EQ(recorder->wait(), 6);
    EXPECT_THAT(complaints(), HasSubstr("not allowed to record the whole screen"));
    EXPECT_TRUE(world_.recording().is_null());
}

TEST_F(DisplayRecording, OutlivesAToolThatIsKilledAndIsKeptWhenAnotherRecordingTakesItsPlace) {
    entitle();
    askNobody();
    world_.startDaemon();
    const auto recorder = tool({});
    ASSERT_TRUE(waitUntil([&] { return elapsed() > 1; })) << world_.daemonLog();
    ASSERT_GT(recorder->pid(), 1);
    ::kill(recorder->pid(), SIGKILL);
    EXPECT_EQ(recorder->wait(), -1);
    const double then = elapsed();
    EXPECT_TRUE(world_.waitForElapsed(then + 0.5));
    const auto player = world_.application({"--size", "320x180", "--fps", "10"});
    ASSERT_TRUE(player->waitForFrame(1));
    (void)player->askForFrame("start");
    const fs::path library = world_.path("videos/Lumacast");
    ASSERT_TRUE(waitUntil([&] { return fs::exists(library) && !fs::is_empty(library); })) << world_.daemonLog();
    EXPECT_TRUE(waitUntil([&] {
        return world_.daemonLog().find("Video saved to camera roll successful") != std::string::npos;
    }));
    checkers::MovieReader reader(fs::directory_iterator(library)->path());
    ASSERT_EQ(reader.videoTracks().size(), 1u) << reader.error();
    EXPECT_EQ(reader.videoTracks()[0].rotation, 90);
    // A recording that is stopped before its first picture has no movie.
    EXPECT_TRUE(world_.waitForElapsed(0.2)) << world_.daemonLog();
    EXPECT_FALSE(player->stop().empty());
}

}  // namespace
}  // namespace lumacast::test
