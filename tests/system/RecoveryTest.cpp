// A daemon that is killed while it records, and the next one's way with what it finds.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <map>

#include "tests/checkers/BoxChecker.h"
#include "tests/checkers/ToneChecker.h"
#include "tests/sound/PrivateSoundServer.h"
#include "tests/system/World.h"

namespace lumacast::test {
namespace {

using ::testing::HasSubstr;

#ifdef LC_SANITIZED
const std::vector<std::string> kWindow{"--size", "320x180", "--fps", "6", "--tone", "700"};
constexpr double kSlack = 2;
#else
const std::vector<std::string> kWindow{"--size", "320x180", "--fps", "30", "--tone", "700"};
constexpr double kSlack = 1.5;  ///< seconds that a machine may stand still meanwhile
#endif

double durationOf(const std::string& movie) {
    return std::chrono::duration<double>(checkers::MovieReader(movie).duration()).count();
}

struct timespec modificationOf(const std::string& file) {
    struct stat status = {};
    EXPECT_EQ(::stat(file.c_str(), &status), 0);
    return status.st_mtim;
}

std::size_t timesIn(const std::string& text, const std::string& part) {
    std::size_t count = 0;
    for (std::size_t at = text.find(part); at != std::string::npos; at = text.find(part, at + 1)) ++count;
    return count;
}

std::string storageList(const World& world, const std::vector<std::string>& options = {}) {
    std::vector<std::string> arguments{LC_CTL, "storage", "list"};
    arguments.insert(arguments.end(), options.begin(), options.end());
    checkers::Child child(arguments, world.environment(), world.path("tool.log"));
    std::string text = child.readAll();
    EXPECT_EQ(child.wait(), 0);
    return text;
}

nlohmann::json entryOf(const World& world, const std::string& name) {
    const auto list = nlohmann::json::parse(storageList(world, {"--json"}), nullptr, false);
    for (const auto& file : list["files"])
        if (file["name"] == name) return file;
    return {};
}

bool isOrdinary(const std::string& movie) {
    const auto report = checkers::checkBoxes(movie);
    return report.findings.empty() && report.topLevel == std::vector<std::string>{"ftyp", "mdat", "moov"};
}

class Recovery : public ::testing::Test {
protected:
    Recovery() {
        EXPECT_TRUE(server_.isThere());
        world_.addVariable("PULSE_SERVER=" + server_.address());
        world_.addVariable("DBUS_SESSION_BUS_ADDRESS=");
        world_.startDaemon();
    }

    struct Killed {
        double elapsed = 0;       ///< seconds of the recording
        std::uint32_t frame = 0;  ///< that the application drew a second before
    };
    /// Kills the daemon in the middle of a recording.
    Killed killWhileRecording(Application& application, double length) {
        EXPECT_TRUE(application.waitForFrame(1));
        (void)application.askForFrame("start");
        EXPECT_TRUE(world_.waitForElapsed(length));
        EXPECT_EQ(entryOf(world_, "Self Recorder.mp4")["state"], "beingRecorded");
        Killed killed;
        killed.elapsed = world_.recording()["elapsedSeconds"].get<double>();
        const checkers::FramesLog drawn = application.framesLog();
        EXPECT_EQ(world_.endDaemon(SIGKILL), -1);
        EXPECT_EQ(application.nextEvent(), "event disconnected");
        for (const auto& [number, frame] : drawn)
            if (frame.shown <= drawn.rbegin()->second.shown - std::chrono::duration<double>(1.0 + kSlack)) killed.frame = number;
        EXPECT_GT(killed.frame, 0u);
        return killed;
    }

    PrivateSoundServer server_;
    World world_;
};

TEST_F(Recovery, TheMovieOfAKilledDaemonIsAnOrdinaryOneAfterTheNextStart) {
    const std::string movie = world_.moviePath();
    Killed killed;
    {
        const auto application = world_.application(kWindow);
        killed = killWhileRecording(*application, 5);
    }
    ASSERT_FALSE(isOrdinary(movie));
    const auto shownBefore = picturesOf(movie, true);
    ASSERT_FALSE(shownBefore.empty());
    const struct timespec crashed = modificationOf(movie);

    world_.startDaemon();
    ASSERT_TRUE(waitUntil([&] { return isOrdinary(movie); })) << world_.daemonLog();
    ASSERT_TRUE(waitUntil([&] { return timesIn(world_.daemonLog(), "Self Recorder.mp4 unfinished: it has its index now") == 1; }))
        << world_.daemonLog();
    const struct timespec after = modificationOf(movie);
    EXPECT_EQ(after.tv_sec, crashed.tv_sec);
    EXPECT_EQ(after.tv_nsec, crashed.tv_nsec);

    // All that a player saw of it before, and up to the last second; read strictly this time.
    EXPECT_GE(durationOf(movie), killed.elapsed - 1.0 - kSlack);
    const auto pictures = picturesOf(movie);
    ASSERT_GE(pictures.size(), shownBefore.size());
    for (std::size_t i = 0; i < shownBefore.size(); ++i) {
        EXPECT_EQ(pictures[i].number, shownBefore[i].number);
        EXPECT_EQ(pictures[i].time, shownBefore[i].time);
    }
    for (const auto& picture : pictures) EXPECT_TRUE(picture.number);
    EXPECT_GE(pictures.back().number.value_or(0), killed.frame);
    checkers::MovieReader reader(movie);
    ASSERT_EQ(reader.audioTracks().size(), 1u);
    const auto sound = reader.readSound(0);
    ASSERT_TRUE(sound) << reader.error();
    EXPECT_GE(static_cast<double>(sound->samples.size()) / sound->rate, killed.elapsed - 1.0 - kSlack);
    const std::vector<float> last(sound->samples.end() - sound->rate / 2, sound->samples.end());
    EXPECT_GT(checkers::toneLevel(last, sound->rate, 700), -40);

    const auto entry = entryOf(world_, "Self Recorder.mp4");
    EXPECT_EQ(entry["state"], "recovered") << entry;
    EXPECT_NEAR(entry["seconds"].get<double>(), durationOf(movie), 0.1);
    EXPECT_THAT(storageList(world_), HasSubstr("  recovered: the recording was cut off\n"));

    // The next recording works, and the next start finds nothing to do.
    const auto next = world_.otherApplication("Next", kWindow);
    ASSERT_TRUE(next->waitForFrame(1));
    (void)next->askForFrame("start");
    ASSERT_TRUE(world_.waitForElapsed(1.0));
    const std::string second = next->stop();
    EXPECT_FALSE(picturesOf(second).empty());
    EXPECT_EQ(entryOf(world_, "Next.mp4")["state"], "finished");
    EXPECT_EQ(world_.endDaemon(SIGTERM), 0);
    std::map<std::string, struct timespec> before{{movie, modificationOf(movie)}, {second, modificationOf(second)}};
    world_.startDaemon();
    EXPECT_EQ(entryOf(world_, "Self Recorder.mp4")["state"], "recovered");
    EXPECT_EQ(world_.endDaemon(SIGTERM), 0);
    for (const auto& [file, moment] : before) EXPECT_EQ(modificationOf(file).tv_nsec, moment.tv_nsec) << file;
    EXPECT_EQ(timesIn(world_.daemonLog(), "unfinished"), 0u) << world_.daemonLog();  // of the last start
}

TEST_F(Recovery, LosesASecondAtMostOfEachKindOfWindow) {
    const std::map<std::string, std::vector<std::string>> windows{
        {"Still", {"--size", "320x180", "--still"}},
        {"Slow", {"--size", "320x180", "--fps", "10"}},
        {"Fast", {"--size", "320x180", "--fps", "60"}}};
    for (const auto& [name, options] : windows) {
        SCOPED_TRACE(name);
        const std::string movie = world_.moviePath(name);
        double elapsed = 0;
        {
            const auto application = world_.otherApplication(name, options);
            ASSERT_TRUE(application->waitForFrame(1));
            (void)application->askForFrame("start");
            ASSERT_TRUE(world_.waitForElapsed(3.3));
            elapsed = world_.recording()["elapsedSeconds"].get<double>();
            EXPECT_EQ(world_.endDaemon(SIGKILL), -1);
        }
        world_.startDaemon();
        ASSERT_TRUE(waitUntil([&] { return isOrdinary(movie); })) << world_.daemonLog();
        std::optional<std::chrono::nanoseconds> last;
        for (const auto& picture : picturesOf(movie)) last = picture.time;
        ASSERT_TRUE(last);
        const double pictures = std::chrono::duration<double>(*last).count();
        std::printf("    %s: killed after %.2f s; %.2f s play, the last picture is of %.2f s\n", name.c_str(), elapsed, durationOf(movie),
                    pictures);
        EXPECT_GE(durationOf(movie), elapsed - 1.0 - kSlack);
        if (name != "Still") {
            EXPECT_GE(pictures, elapsed - 1.0 - kSlack);
        }
    }
}

// Killed again and again, at whatever it is: in the end the movie is whole, and it is the same one.
TEST_F(Recovery, ADaemonThatIsKilledAtItsStartsLeavesTheMovieToTheNext) {
    const std::string movie = world_.moviePath();
    {
        const auto application = world_.application(kWindow);
        (void)killWhileRecording(*application, 4.5);
    }
    const auto shownBefore = picturesOf(movie, true);
    for (int i = 0; i < 5; ++i) {
        world_.startDaemon();
        EXPECT_EQ(world_.endDaemon(SIGKILL), -1);
        EXPECT_GE(picturesOf(movie, true).size(), shownBefore.size());
    }
    world_.startDaemon();
    ASSERT_TRUE(waitUntil([&] { return isOrdinary(movie); })) << world_.daemonLog();
    EXPECT_GE(picturesOf(movie).size(), shownBefore.size());
}

TEST_F(Recovery, WhatIsNotAMovieStaysAndTheListSaysSo) {
    EXPECT_EQ(world_.endDaemon(SIGTERM), 0);
    const std::filesystem::path folder = std::filesystem::path(world_.moviePath()).parent_path();
    std::ofstream(folder / "notes.txt") << "not a movie";
    std::filesystem::create_symlink("/etc/passwd", folder / "link.mp4");
    world_.startDaemon();
    EXPECT_EQ(entryOf(world_, "notes.txt")["state"], "other");
    EXPECT_FALSE(entryOf(world_, "link.mp4").contains("state"));
    EXPECT_THAT(storageList(world_), HasSubstr("  not a movie\n"));
    EXPECT_EQ(world_.daemonLog().find("earlier run"), std::string::npos);
}

}  // namespace
}  // namespace lumacast::test
