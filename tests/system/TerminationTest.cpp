// The service is told to end, at every moment: what was recorded is whole, and the end is an orderly one.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <array>
#include <filesystem>
#include <fstream>
#include <future>

#include "tests/checkers/check_movie/MovieCheck.h"
#include "tests/system/SavingWorld.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;

#ifdef LC_SANITIZED
const std::vector<std::string> kEnding{"--size", "320x180", "--fps", "6"};
constexpr std::uint32_t kLate = 12;
#else
const std::vector<std::string> kEnding{"--size", "320x180", "--fps", "30"};
/// Pictures that were shown and had not got to the daemon when it was told to end.
constexpr std::uint32_t kLate = 6;
#endif

/// The movie plays from `from` (the very first picture may be older) to `to`, its numbers going up, and its boxes are
/// those of a finished one.
void expectWhole(const std::string& movie, std::uint32_t from, std::uint32_t to) {
    checkers::MovieCheckOptions options;
    options.movie = movie;
    for (const auto& finding : checkers::checkMovie(options).findings) ADD_FAILURE() << finding;
    const auto pictures = picturesOf(movie);
    ASSERT_GT(pictures.size(), 2u);
    std::uint32_t before = 0;
    for (auto picture = std::next(pictures.begin()); picture != pictures.end(); ++picture) {
        ASSERT_TRUE(picture->number);
        EXPECT_GT(*picture->number, before);
        before = *picture->number;
    }
    EXPECT_LE(*std::next(pictures.begin())->number, from + kLate);
    EXPECT_GE(before + kLate, to) << "what was shown before the end is in it";
}

/// An application with a running recording of more than a second.
class Termination : public ::testing::Test {
protected:
    void start(const std::vector<std::string>& variables = {}) {
        world_.startDaemon(variables);
        application_ = world_.application(kEnding);
        ASSERT_TRUE(application_->waitForFrame(1));
        first_ = application_->askForFrame("start");
        ASSERT_TRUE(world_.waitForElapsed(1.2));
    }
    World world_;
    std::unique_ptr<Application> application_;
    std::uint32_t first_ = 0;
};

TEST_F(Termination, DuringARecordingLeavesAllThatWasShown) {
    start();
    const std::uint32_t last = application_->askForFrame("frame");
    EXPECT_EQ(world_.endDaemon(SIGTERM), 0);
    expectWhole(world_.moviePath(), first_, last);
    EXPECT_EQ(application_->nextEvent(), "event disconnected") << "and it hears of no error before";
}

TEST_F(Termination, ByTheKeyboardIsTheSame) {
    start();
    const std::uint32_t last = application_->askForFrame("frame");
    EXPECT_EQ(world_.endDaemon(SIGINT), 0);
    expectWhole(world_.moviePath(), first_, last);
}

TEST_F(Termination, DuringAPauseLeavesWhatWasRecordedBeforeIt) {
    start();
    const std::uint32_t paused = application_->askForFrame("pause");
    ASSERT_TRUE(application_->waitForFrame(paused + 20));
    EXPECT_EQ(world_.endDaemon(SIGTERM), 0);
    expectWhole(world_.moviePath(), first_, paused);
    for (const auto& picture : picturesOf(world_.moviePath())) EXPECT_LE(picture.number.value_or(0), paused + kLate);
}

TEST_F(Termination, WhileTheMovieIsFinishedLetsItFinish) {
    for (int i = 0; i < 3; ++i) {
        start();
        const std::uint32_t last = application_->askForFrame("frame");
        application_->send("stop");
        EXPECT_EQ(world_.endDaemon(SIGTERM), 0);
        expectWhole(world_.moviePath(), first_, last);
        application_.reset();
        fs::remove(world_.moviePath());
    }
}

TEST_F(Termination, ToldTwiceEndsOnce) {
    start();
    const std::uint32_t last = application_->askForFrame("frame");
    for (int i = 0; i < 20; ++i) ::kill(world_.daemon().pid(), i % 2 == 0 ? SIGTERM : SIGINT);
    EXPECT_EQ(world_.endDaemon(SIGTERM), 0);
    expectWhole(world_.moviePath(), first_, last);
}

TEST_F(Termination, WithAMainLaneThatIsStuckIsNoDifferent) {
    const std::string flag = world_.path("stuck");
    // A blank in the library's own path would end it there.
    const std::string library = world_.path("stuck_lane.so");
    fs::create_symlink(LC_STUCK_LANE, library);
    start({"LD_PRELOAD=" + library, "LC_LANE_STUCK=" + flag});
    std::ofstream(flag) << "";
    application_->send("state");  // something to do for the lane, so that it asks for more
    ASSERT_TRUE(waitUntil([&] { return fs::exists(flag + ".now"); }));
    const std::uint32_t before = application_->framesLog().rbegin()->first;
    ASSERT_TRUE(waitUntil([&] { return application_->framesLog().rbegin()->first > before + 15; }));
    const std::uint32_t last = application_->framesLog().rbegin()->first;
    EXPECT_EQ(world_.endDaemon(SIGTERM), 0);
    expectWhole(world_.moviePath(), first_, last);
}

/// The service manager's end of the notify socket.
class Manager {
public:
    explicit Manager(const std::string& path)
        : socket_(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)) {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path.copy(address.sun_path, sizeof address.sun_path - 1);
        EXPECT_EQ(::bind(socket_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    }
    /// How often it was asked for more time up to now.
    int askedForTime() {
        std::array<char, 512> buffer;
        for (ssize_t count = 0; (count = ::recv(socket_.get(), buffer.data(), buffer.size(), 0)) > 0;) {
            const std::string text(buffer.data(), static_cast<std::size_t>(count));
            if (text == "STOPPING=1\nEXTEND_TIMEOUT_USEC=10000000\n") ++asked_;
        }
        return asked_;
    }

private:
    const Fd socket_;
    int asked_ = 0;
};

TEST_F(Termination, WithADiskThatStallsAsksForMoreTimeUntilTheMovieIsWhole) {
    Manager manager(world_.path("notify"));
    auto variables = world_.troubledDisk();
    variables.push_back("NOTIFY_SOCKET=" + world_.path("notify"));
    start(variables);
    EXPECT_EQ(manager.askedForTime(), 0);
    const std::uint32_t last = application_->askForFrame("frame");
    world_.setDiskStalled(true);
    ::kill(world_.daemon().pid(), SIGTERM);
    EXPECT_TRUE(waitUntil([&] { return manager.askedForTime() >= 2; })) << "again and again";
    world_.setDiskStalled(false);
    EXPECT_EQ(world_.daemon().wait(), 0);
    expectWhole(world_.moviePath(), first_, last);
}

TEST_F(Termination, WithADiskThatIsDeadEndsInTimeAndLeavesWhatWasWritten) {
    start(world_.troubledDisk());
    const double elapsed = world_.recording()["elapsedSeconds"].get<double>();
    world_.setDiskStalled(true);
    const auto before = std::chrono::steady_clock::now();
    EXPECT_EQ(world_.endDaemon(SIGTERM), 0);
    EXPECT_LT(std::chrono::steady_clock::now() - before, std::chrono::seconds(20));
    checkers::MovieReader reader(world_.moviePath());
    EXPECT_EQ(reader.error(), "");
    EXPECT_FALSE(picturesOf(world_.moviePath(), true).empty());
    EXPECT_GT(std::chrono::duration<double>(reader.duration()).count(), elapsed - 1.2);
}

TEST(TerminationOfASave, WhileAMovieIsCopiedLeavesTheMovieAndItCanBeSavedLater) {
    SavingWorld world;
    std::vector<std::string> variables{"LC_DISK=" + world.path("videos")};
    for (const auto& variable : world.troubledDisk()) variables.push_back(variable);
    world.startDaemon(variables);
    const std::string movie = world.makeMovie("two.mp4", {440, 880});
    world.setDiskStalled(true);  // the library's
    auto saved = std::async(std::launch::async, [&] { return world.save(movie); });
    ASSERT_TRUE(waitUntil([&] { return world.saveStates() == std::vector<std::string>{"adding"}; }, kPatience));
    EXPECT_EQ(world.endDaemon(SIGTERM), 0);
    EXPECT_NE(saved.get(), 0) << "the one who waits is told";
    world.setDiskStalled(false);
    expectAllFrames(movie);
    EXPECT_TRUE(world.library().empty()) << "no half of a movie";
    world.startDaemon();
    EXPECT_EQ(world.save(movie), 0) << world.daemonLog();
    expectAllFrames(world.onlySaved());
}

TEST(TerminationOfASave, WhileAMovieIsMixedLeavesNoHalfMadeFileAndTheMovieWhole) {
    SavingWorld world;
    world.startDaemon();
    // Of a size and length that takes a while to encode anew.
    checkers::MoviePlan plan;
    plan.width = 1280;
    plan.height = 720;
    plan.halfSize = false;
    plan.bitRate = 2'000'000;
    plan.pictures = checkers::steadyPictures(1, 300, 30);
    plan.soundSeconds = 10;
    plan.sound = tone(440);
    plan.moreSounds = {tone(880)};
    const std::string movie = world.path("movies/long.mp4");
    ASSERT_EQ(checkers::makeMovie(plan, movie), "");
    auto saved = std::async(std::launch::async, [&] { return world.save(movie); });
    ASSERT_TRUE(waitUntil([&] { return !world.temporaryFiles().empty(); }));
    ASSERT_EQ(world.saveStates(), std::vector<std::string>{"mixing"});
    const auto before = std::chrono::steady_clock::now();
    EXPECT_EQ(world.endDaemon(SIGTERM), 0);
    std::printf("    ended after %.2f s\n",
                std::chrono::duration<double>(std::chrono::steady_clock::now() - before).count());
    EXPECT_NE(saved.get(), 0) << "the one who waits is told";
    EXPECT_TRUE(world.temporaryFiles().empty()) << world.temporaryFiles().front();
    EXPECT_TRUE(world.library().empty());
    EXPECT_EQ(picturesOf(movie).size(), 300u);
    EXPECT_EQ(world.countInLog("Error Mixing video Audio tracks"), 0u) << "nobody goes on without the mix";
}

TEST(TerminationOfASave, AtAnyMomentLeavesTheMovieInOnePlaceAtLeast) {
    SavingWorld world;
    for (int i = 0; i < 4; ++i) {
        world.startDaemon();
        const std::string movie = world.makeMovie("two " + std::to_string(i) + ".mp4", {440, 880});
        const auto before = world.library();
        auto saved = std::async(std::launch::async, [&] { return world.save(movie); });
        ASSERT_TRUE(
            waitUntil([&] { return world.countInLog("saveVideoToCameraRoll") > 0 || !world.saveStates().empty(); }));
        if (i > 0) {
            // Later each time: when the mixed movie is there, when the copy is begun, when it is done.
            ASSERT_TRUE(waitUntil([&] {
                return (i == 1 && !world.temporaryFiles().empty()) || world.library().size() > before.size() ||
                       !fs::exists(movie);
            }));
        }
        EXPECT_EQ(world.endDaemon(SIGTERM), 0);
        (void)saved.get();
        if (fs::exists(movie)) {
            expectAllFrames(movie);
        } else {
            ASSERT_EQ(world.library().size(), before.size() + 1);
            for (const std::string& file : world.library()) expectAllFrames(file);
        }
    }
}

}  // namespace
}  // namespace lumacast::test
