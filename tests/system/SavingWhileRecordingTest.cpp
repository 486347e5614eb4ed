// Movies saved to the user's library while applications record.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <ctime>
#include <filesystem>
#include <mutex>
#include <set>

#include "tests/checkers/tests/FileBytes.h"
#include "tests/client/Heard.h"
#include "tests/system/SavingWorld.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;
using checkers::bytesOf;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

struct Tool {
    int status = -1;
    std::string out, complaints;
};

Tool lumacastctl(const World& world, std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), LC_CTL);
    Tool result;
    {
        checkers::Child child(arguments, world.environment(), world.path("tool.log"));
        result.out = child.readAll();
        result.status = child.wait();
    }
    const auto complaints = bytesOf(world.path("tool.log"));
    result.complaints.assign(complaints.begin(), complaints.end());
    return result;
}

TEST(SavingWhileRecording, TheToolSavesARecordingAndSaysWhereItIs) {
    SavingWorld world;
    world.startDaemon();
    const auto application = world.application({"--size", "320x180", "--fps", "10"});
    ASSERT_TRUE(application->waitForFrame(1));
    const std::uint32_t first = application->askForFrame("start");
    ASSERT_TRUE(application->waitForFrame(first + 10));
    const std::uint32_t last = application->askForFrame("frame");
    const std::string recorded = application->stop();
    const Tool result = lumacastctl(world, {"save", recorded});
    EXPECT_EQ(result.status, 0) << result.complaints;
    EXPECT_EQ(result.out, world.onlySaved() + "\n");
    EXPECT_THAT(result.complaints, HasSubstr("mixing: "));
    std::set<std::uint32_t> shown;
    for (const auto& picture : picturesOf(world.onlySaved()))
        if (picture.number) shown.insert(*picture.number);
    for (std::uint32_t number = first + 1; number < last; ++number) EXPECT_TRUE(shown.contains(number)) << number;
    EXPECT_TRUE(becomesGone(recorded));
    const Tool again = lumacastctl(world, {"save", recorded});
    EXPECT_EQ(again.status, 4);
    EXPECT_THAT(again.complaints, HasSubstr("is not saved: "));
}

TEST(SavingWhileRecording, AMovieThatIsBeingRecordedIsRefusedAndTheRecordingGoesOn) {
    SavingWorld world;
    world.startDaemon();
    const auto application = world.application({"--size", "320x180", "--fps", "10"});
    ASSERT_TRUE(application->waitForFrame(1));
    const std::uint32_t first = application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(0.5));
    EXPECT_EQ(world.save(world.moviePath()), kFailedToSave);
    const Tool tool = lumacastctl(world, {"save", world.moviePath()});
    EXPECT_EQ(tool.status, 4);
    EXPECT_THAT(tool.complaints, HasSubstr("it is being recorded"));
    // Nor under another name.
    const fs::path folder = fs::path(world.moviePath()).parent_path();
    const std::string name = fs::path(world.moviePath()).filename();
    fs::create_directory_symlink(folder, world.path("elsewhere"));
    for (const std::string& path : {folder.string() + "/./" + name,
                                    folder.string() + "/../" + folder.filename().string() + "/" + name,
                                    world.path("elsewhere/") + name})
        EXPECT_EQ(world.save(path), kFailedToSave) << path;
    ASSERT_TRUE(application->waitForFrame(first + 15));
    const std::string recorded = application->stop();
    EXPECT_GE(picturesOf(recorded).size(), 10u);
    EXPECT_THAT(world.library(), IsEmpty());
}

/// A movie that takes many times longer to be encoded than a recording to be started.
checkers::MoviePlan largePlan() {
    checkers::MoviePlan plan;
#ifdef LC_SANITIZED
    plan.width = 640;
    plan.height = 360;
#else
    plan.width = 1280;
    plan.height = 720;
#endif
    plan.halfSize = false;
    plan.bitRate = 3'000'000;
    return plan;
}

TEST(SavingWhileRecording, AMovieWhosePlaceANewerRecordingTakesIsSavedAllTheSameAndTheNewerOneStaysWhole) {
    SavingWorld world;
    world.startDaemon();
    const auto application = world.application({"--size", "320x180", "--fps", "10"});
    ASSERT_TRUE(application->waitForFrame(1));
    // It waits behind one that takes a while, so that the application has started again before it is mixed.
    checkers::MoviePlan plan = largePlan();
    plan.pictures = checkers::steadyPictures(1, 60, 30);
    const std::string before = world.path("movies/before.mp4");
    ASSERT_EQ(checkers::makeMovie(plan, before), "");
    std::uint32_t first = application->askForFrame("start");
    ASSERT_TRUE(application->waitForFrame(first + 5));
    const std::string recorded = application->stop();

    Answers<std::optional<Error>> answers;
    world.recorder().save(URL::file(before), answers.handler(0));
    // Two that are saved in the same second are in each other's way.
    const std::time_t second = std::time(nullptr);
    ASSERT_TRUE(waitUntil([&] { return std::time(nullptr) != second; }));
    world.recorder().save(URL::file(recorded), answers.handler(1));
    ASSERT_TRUE(waitUntil([&] { return world.saveStates().size() == 2; }));
    // The picture that the older one ended with isn't the newer one's first.
    ASSERT_TRUE(application->waitForFrame(application->askForFrame("frame") + 1));
    first = application->askForFrame("start");
    ASSERT_TRUE(waitUntil([&] { return answers.total() == 2; }, kPatience));
    ASSERT_TRUE(application->waitForFrame(first + 10));
    const std::uint32_t last = application->askForFrame("frame");
    std::set<std::uint32_t> shown;
    for (const auto& picture : picturesOf(application->stop()))
        if (picture.number) shown.insert(*picture.number);
    EXPECT_TRUE(shown.contains(first + 1));
    EXPECT_TRUE(shown.contains(last - 1));
    EXPECT_EQ(world.library().size(), 2u);
    // Nothing of the newer one is in the library in the older one's place.
    const auto pictures = picturesOf(world.status()["saves"].back().value("savedAs", ""));
    EXPECT_GE(pictures.size(), 3u);
    for (const auto& picture : pictures) EXPECT_LT(picture.number.value_or(0), first);
}

/// Saves copies of a movie one after the other, as long as this lives: there is always one being mixed, but for the
/// moments between two. The last one is left to the daemon.
class EndlessSaving final {
public:
    EndlessSaving(SavingWorld& world, const std::string& movie) : state_(std::make_shared<State>(world, movie)) {
        State::next(state_);
    }
    ~EndlessSaving() {
        const std::lock_guard lock(state_->mutex);
        state_->isOver = true;
    }
    EndlessSaving(const EndlessSaving&) = delete;
    EndlessSaving& operator=(const EndlessSaving&) = delete;

    int saved() const {
        const std::lock_guard lock(state_->mutex);
        return state_->saved;
    }

private:
    struct State {
        State(SavingWorld& itsWorld, std::string itsMovie) : world(itsWorld), movie(std::move(itsMovie)) {}

        static void next(const std::shared_ptr<State>& state) {
            const std::lock_guard lock(state->mutex);
            if (state->isOver) return;
            const std::string copy = state->world.path("movies/copy " + std::to_string(++state->begun) + ".mp4");
            fs::copy_file(state->movie, copy);
            state->world.recorder().save(URL::file(copy), [state](const std::optional<Error>& error) {
                {
                    const std::lock_guard inner(state->mutex);
                    if (state->isOver) return;
                    EXPECT_FALSE(error);
                    ++state->saved;
                }
                next(state);
            });
        }

        SavingWorld& world;
        const std::string movie;
        std::mutex mutex;
        bool isOver = false;
        int begun = 0, saved = 0;
    };

    const std::shared_ptr<State> state_;
};

TEST(SavingWhileRecording, ARecordingLosesNoFrameWhileMoviesAreMixed) {
#ifdef LC_SANITIZED
    const std::vector<std::string> moving{"--size", "320x180", "--fps", "6"};
    constexpr std::uint32_t kStretch = 18;
#else
    const std::vector<std::string> moving{"--size", "640x360", "--fps", "30"};
    constexpr std::uint32_t kStretch = 120;
#endif
    // A machine that is busy with somebody else's work loses frames for that alone: then once more.
    constexpr int kAttempts = 5;
    SavingWorld world;
    world.startDaemon();
    checkers::MoviePlan plan = largePlan();
    plan.pictures = checkers::steadyPictures(1, 60, 30);
    plan.soundSeconds = 2;
    plan.sound = tone(440);
    plan.moreSounds = {tone(880)};
    const std::string movie = world.path("source.mp4");
    ASSERT_EQ(checkers::makeMovie(plan, movie), "");

    const auto application = world.application(moving);
    ASSERT_TRUE(application->waitForFrame(3));
    EndlessSaving saving(world, movie);
    std::vector<checkers::FrameFinding> findings;
    for (int attempt = 1; attempt <= kAttempts; ++attempt) {
        std::size_t looks = 0, mixing = 0;
        const std::uint32_t first = application->askForFrame("start");
        for (std::uint32_t shown = first; shown < first + kStretch; shown = application->askForFrame("frame")) {
            ASSERT_TRUE(application->waitForFrame(shown + 3));
            const auto states = world.saveStates();
            ++looks;
            if (!states.empty() && states.back() == "mixing") ++mixing;
        }
        const std::uint32_t last = application->askForFrame("frame");
        const std::string recorded = application->stop();
        ASSERT_FALSE(recorded.empty());
        checkers::FrameExpectation expectation;
        for (std::uint32_t number = first + 1; number < last; ++number) expectation.expected.insert(number);
        expectation.allowedRepeats = 2;
        const auto report = checkers::checkFrameNumbers(picturesOf(recorded), expectation);
        std::printf("%zu frames, %zu missing; %zu of %zu looks saw a movie being mixed\n", report.pictures,
                    report.missing.size(), mixing, looks);
        EXPECT_GE(mixing * 10, looks * 6) << "too little was mixed for this to say anything";
        findings = report.findings;
        if (findings.empty()) break;
    }
    for (const auto& finding : findings) ADD_FAILURE() << finding.text;
    std::printf("%d movies were saved meanwhile\n", saving.saved());
    EXPECT_EQ(world.countInLog(kNotMixed), 0u);
}

}  // namespace
}  // namespace lumacast::test
