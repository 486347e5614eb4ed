// Each kind of movie that the daemon writes, played and sought by a browser: another reader than the one that the tests
// judge with otherwise. It says which frame it shows at a time, and what it hears; both must be what the decoder says.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <fstream>

#include "tests/checkers/BoxChecker.h"
#include "tests/dialog/DialogUser.h"
#include "tests/extension/PrivateBrowser.h"
#include "tests/extension/PrivateNginx.h"
#include "tests/sound/PrivateSoundServer.h"
#include "tests/system/DisplayTool.h"
#include "tests/system/SavingWorld.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;
using ::testing::StartsWith;

constexpr double kFrame = 1 / 30.0;
/// Where it is sought, as parts of the movie, in no order.
constexpr double kSought[]{0.7, 0.1, 0.95, 0.4, 0.0};

double secondsOf(std::chrono::nanoseconds time) { return std::chrono::duration<double>(time).count(); }

/// A movie, and what the decoder makes of it.
struct Movie {
    std::string name;
    std::string path;
    std::vector<checkers::NumberedPicture> pictures;
    std::vector<double> heard, notHeard;  ///< Hz
    bool isWhole = true;
    nlohmann::json area = nullptr;  ///< of the picture where the numbers are; null: all of it
    double from = 0;                ///< seconds after which there are numbers

    /// The picture that is on show at that time.
    std::size_t shownAt(double time) const {
        const auto after = std::find_if(pictures.begin(), pictures.end(),
                                        [time](const auto& picture) { return secondsOf(picture.time) > time; });
        return static_cast<std::size_t>(std::max<std::ptrdiff_t>(1, after - pictures.begin())) - 1;
    }
    double length() const { return secondsOf(pictures.back().time) + kFrame; }
};

Movie movieAt(const std::string& name, const std::string& path, std::vector<double> heard) {
    return {name, path, picturesOf(path), std::move(heard), {1500}};
}

/// Has a browser look at movies and judges what it says.
class Viewer final {
public:
    void add(Movie movie) {
        ASSERT_GE(movie.pictures.size(), 30u) << movie.path;
        movies_.push_back(std::move(movie));
    }

    void judge() {
        fs::create_directories(server_.files());
        nlohmann::json plan = nlohmann::json::array();
        for (const Movie& movie : movies_) plan.push_back(entryOf(movie));
        std::ofstream(server_.files() + "/plan.json") << plan;
        fs::copy_file(LC_SOURCE_DIR "/tests/system/movie_judge.html", server_.files() + "/judge.html");
        const PrivateBrowser browser(server_.url() + "judge.html");
        for (const Movie& movie : movies_) {
            SCOPED_TRACE(movie.name);
            const auto said = told(movie.name, browser);
            if (said.contains("error") || said.is_null()) ADD_FAILURE() << said;
            else judge(movie, said);
        }
    }

private:
    nlohmann::json entryOf(const Movie& movie) {
        fs::copy_file(movie.path, server_.files() + "/" + movie.name + ".mp4", fs::copy_options::overwrite_existing);
        nlohmann::json entry{{"name", movie.name}, {"file", movie.name + ".mp4"}, {"plays", movie.isWhole}};
        if (!movie.area.is_null()) entry["area"] = movie.area;
        if (!movie.heard.empty()) {
            entry["tones"] = movie.heard;
            for (const double tone : movie.notHeard) entry["tones"].push_back(tone);
        }
        for (const double part : kSought) {
            // The middle of a picture's time: a rounding of the one or the other is not what is judged.
            const std::size_t place = movie.shownAt(movie.from + part * (movie.length() - movie.from));
            const double begin = secondsOf(movie.pictures[place].time);
            const bool isLast = place + 1 == movie.pictures.size();
            entry["seeks"].push_back((begin + (isLast ? movie.length() : secondsOf(movie.pictures[place + 1].time))) / 2);
        }
        return entry;
    }

    nlohmann::json told(const std::string& name, const PrivateBrowser& browser) {
        nlohmann::json said;
        const std::string path = server_.files() + "/" + name + ".json", trouble = server_.files() + "/error.json";
        const auto isThere = [&] {
            said = nlohmann::json::parse(ScratchDirectory::read(path), nullptr, false);
            return said.is_object() || fs::exists(trouble);
        };
        EXPECT_TRUE(waitUntil(isThere, std::chrono::seconds(240))) << browser.log();
        return said.is_object() ? said : nlohmann::json{{"error", ScratchDirectory::read(trouble)}};
    }

    void judge(const Movie& movie, const nlohmann::json& said) {
        std::printf("    %s: %s\n", movie.name.c_str(), said.dump().substr(0, 400).c_str());
        judgeSeeks(movie, said["seeks"]);
        if (movie.isWhole) {
            checkers::MovieReader reader(movie.path);
            EXPECT_NEAR(said["duration"], secondsOf(reader.duration()), kFrame);
            judgePlayed(said["played"], said["duration"]);
        }
        if (!movie.heard.empty()) judgeSound(movie, said["sound"]);
    }

    static void judgeSeeks(const Movie& movie, const nlohmann::json& seeks) {
        ASSERT_EQ(seeks.size(), std::size(kSought));
        for (const auto& seen : seeks) {
            const std::size_t place = movie.shownAt(seen["time"]);
            const auto& picture = movie.pictures[place];
            ASSERT_TRUE(seen["number"].is_number()) << seen;
            EXPECT_NEAR(seen["stamp"], secondsOf(picture.time), kFrame) << seen;
            ASSERT_TRUE(picture.number) << seen;
            // One that was drawn next, or before: within a frame.
            const auto numberAt = [&](std::size_t at) {
                return movie.pictures[std::min(at, movie.pictures.size() - 1)].number.value_or(0);
            };
            EXPECT_GE(seen["number"], numberAt(place > 0 ? place - 1 : 0)) << seen;
            EXPECT_LE(seen["number"], numberAt(place + 1)) << seen;
        }
    }

    static void judgePlayed(const nlohmann::json& played, double duration) {
        EXPECT_NEAR(played["end"], duration, kFrame);
        std::uint32_t last = 0;
        std::size_t read = 0;
        for (const auto& number : played["numbers"]) {
            if (!number.is_number()) continue;
            EXPECT_GE(number.get<std::uint32_t>(), last) << played;
            last = number;
            ++read;
        }
        EXPECT_GE(read, 5u) << "of a machine that is in time for few";
    }

    static void judgeSound(const Movie& movie, const nlohmann::json& sound) {
        ASSERT_EQ(sound["levels"].size(), movie.heard.size() + movie.notHeard.size());
        double quietest = 0;
        for (std::size_t at = 0; at < sound["levels"].size(); ++at) {
            const double level = sound["levels"][at];
            if (at < movie.heard.size()) {
                EXPECT_GT(level, -40) << movie.heard[at] << " Hz";
                quietest = std::min(quietest, level);
            } else {
                // A pause's joint has a click in the middle, with a little of every tone.
                EXPECT_LT(level, quietest - 30) << movie.notHeard[at - movie.heard.size()] << " Hz";
            }
        }
        EXPECT_NEAR(sound["seconds"], movie.length(), 0.3);
    }

    PrivateNginx server_;
    std::vector<Movie> movies_;
};

class Browser : public ::testing::Test {
protected:
    Browser() {
        world_.addVariable("PULSE_SERVER=" + sound_.address());
        keeperFolder_ = world_.installExtension(World::kKeeper, LC_MINIMAL_EXTENSION, false);
        world_.startDaemon();
        app_ = world_.application({"--size", "640x360", "--fps", "30", "--tone", "700"});
        EXPECT_TRUE(app_->waitForFrame(30));  // its tone is on its way too
    }

    void record(double seconds) {
        ASSERT_THAT(app_->ask("start"), StartsWith("started")) << world_.daemonLog();
        ASSERT_TRUE(world_.waitForElapsed(seconds));
    }

    /// A file of its own, before the next recording takes the place.
    std::string keep(const std::string& movie, const std::string& name) {
        std::string kept = world_.path("movies/" + name + ".mp4");
        fs::copy_file(movie, kept);
        return kept;
    }

    std::string recordPlain() {
        record(1.5);
        EXPECT_THAT(app_->ask("pause"), StartsWith("paused"));
        const std::uint32_t frame = app_->askForFrame("frame");
        EXPECT_TRUE(app_->waitForFrame(frame + 30));
        EXPECT_THAT(app_->ask("resume"), StartsWith("resumed"));
        EXPECT_TRUE(world_.waitForElapsed(3));
        return keep(app_->stop(), "plain");
    }

    std::string recordTrimmed() {
        record(4.3);
        return keep(app_->stop("clip 1 1"), "trimmed");
    }

    std::vector<std::string> recordClips() {
        const std::string started =
            app_->ask("broadcast org.lumacast.SelfRecorder " + std::string(World::kKeeper) + " directory=" + keeperFolder_);
        EXPECT_THAT(started, StartsWith("started")) << world_.daemonLog();
        std::vector<std::string> clips{keeperFolder_ + "/clip-1.mp4", keeperFolder_ + "/clip-2.mp4"};
        // The third is there when the second is whole.
        EXPECT_TRUE(waitUntil([this] { return fs::exists(keeperFolder_ + "/clip-3.mp4"); })) << world_.daemonLog();
        EXPECT_THAT(app_->ask("stop"), StartsWith("stopped"));
        return clips;
    }

    std::string recordAndKill() {
        record(3.5);
        world_.endDaemon(SIGKILL);
        return keep(world_.moviePath(), "unfinished");
    }

    std::string saveMixed() {
        const std::string movie = world_.makeMovie("two.mp4", {440, 880});
        EXPECT_EQ(world_.save(movie), 0) << world_.daemonLog();
        return keep(world_.onlySaved(), "mixed");
    }

    const PrivateSoundServer sound_;
    SavingWorld world_;
    std::string keeperFolder_;
    std::unique_ptr<Application> app_;
};

TEST_F(Browser, PlaysAndSeeksEachKindOfMovieToTheSameFramesAsTheDecoder) {
    Viewer viewer;
    viewer.add(movieAt("plain", recordPlain(), {700}));
    viewer.add(movieAt("trimmed", recordTrimmed(), {700}));
    const auto clips = recordClips();
    viewer.add(movieAt("first-clip", clips[0], {700}));
    viewer.add(movieAt("second-clip", clips[1], {700}));
    viewer.add(movieAt("mixed", saveMixed(), {440, 880}));
    const std::string left = recordAndKill();
    const auto boxes = checkers::checkBoxes(left, checkers::BoxShape::Fragmented);
    EXPECT_EQ(boxes.findings, checkers::Findings{});
    EXPECT_GE(boxes.fragments, 2u);
    viewer.add({"unfinished", left, picturesOf(left, true), {700}, {1500}, false});
    viewer.judge();
}

class BrowserOfDisplay : public DisplayTool {};

TEST_F(BrowserOfDisplay, ShowsTheWholeDisplayUprightAndSeeksInIt) {
    constexpr int kLeft = 100, kTop = 200, kWidth = 640, kHeight = 360;
    entitle();
    askNobody();
    world_.startDaemon();
    const std::string movie = world_.path("display.mp4"), part = world_.path("part.mp4");
    const auto recorder = tool({"--output", movie});
    ASSERT_TRUE(waitUntil([&] { return elapsed() > 0; })) << world_.daemonLog() << complaints();
    const auto shown = world_.otherApplication("Shown", {"--size", "640x360", "--fps", "10", "--tone", "700"});
    ASSERT_EQ(shown->ask("move 100 200"), "ok");
    ASSERT_TRUE(shown->waitForFrame(10));
    const double from = elapsed();
    // Its tone is in the middle of the movie.
    ASSERT_TRUE(world_.waitForElapsed(2 * from + 2));
    ASSERT_GT(recorder->pid(), 1);
    ::kill(recorder->pid(), SIGINT);
    EXPECT_EQ(recorder->wait(), 0) << complaints() << world_.daemonLog();
    // As a player shows the window, for the decoder.
    const std::string command = "ffmpeg -v error -y -i '" + movie + "' -vf crop=640:360:100:200 -fps_mode passthrough -an" +
                                " -c:v libx264 -preset ultrafast -qp 0 '" + part + "' </dev/null";
    ASSERT_EQ(std::system(command.c_str()), 0);
    Movie display{"display", movie, picturesOf(part, true), {700}, {1500}};
    display.area = {{"x", kLeft}, {"y", kTop}, {"width", kWidth}, {"height", kHeight}};
    display.from = from;
    Viewer viewer;
    viewer.add(display);
    viewer.judge();
}

}  // namespace
}  // namespace lumacast::test
