// The client library in this process, against the real daemon.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>

#include <filesystem>
#include <thread>
#include <mutex>

#include "client/Recorder.h"
#include "linux/admin/LinuxAdminService.h"
#include "tests/client/Heard.h"
#include "tests/contract/TestWindow.h"
#include "tests/dialog/DialogUser.h"
#include "tests/system/MovingWindow.h"
#include "tests/system/World.h"

namespace lumacast::test {
namespace {

using client::Recorder;
using client::StartAnswer;
using client::StateAnswer;
using client::StopAnswer;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

/// This process as an application with a window, and its recorder.
class Client : public ::testing::Test {
protected:
    explicit Client(World::Consent consent = World::Consent::Suppressed) : world_(consent) {
        world_.install("org.lumacast.Tester", "Tester", std::filesystem::read_symlink("/proc/self/exe"));
        world_.startDaemon();
        window_ = std::make_unique<TestWindow>(world_.display().name(), TestWindow::Look{.colour = 0x336699});
        connect();
    }

    void connect() {
        client::Events events = comings_.events();
        events.stopped = [this](const std::optional<Error>& error, const std::optional<URL>& movie) {
            const std::lock_guard lock(mutex_);
            stops_.push_back(keyIn(error));
            if (error) text_ = client::textOf(*error);
            movie_ = movie;
        };
        recorder_ = std::make_unique<Recorder>(std::move(events), world_.path("run/lumacast"));
    }

    client::StartOptions options() const {
        client::StartOptions options;
        options.windows = {window_->context()};
        options.size = {320, 240};
        return options;
    }
    /// A desktop that does not say within its time who is in front says "nobody"; on a busy machine one asks again.
    std::optional<Error> start(const client::StartOptions& options) {
        StartAnswer answer;
        for (int i = 0; i < 20; ++i) {
            answer = recorder_->startAndWait(options);
            if (!answer.error || answer.error->code() != -5803) break;
        }
        return answer.error;
    }
    void startRecording() {
        const auto error = start(options());
        ASSERT_FALSE(error) << keyIn(error) << world_.daemonLog();
        ASSERT_TRUE(world_.waitForElapsed(0.5));
    }
    std::vector<std::string> stops() const {
        const std::lock_guard lock(mutex_);
        return stops_;
    }

    World world_;
    std::unique_ptr<TestWindow> window_;
    Comings comings_;
    mutable std::mutex mutex_;
    std::vector<std::string> stops_;  ///< the keys of what `stopped` told
    std::string text_;
    std::optional<URL> movie_;
    std::unique_ptr<Recorder> recorder_;
};

class ClientOfAskedUser : public Client {
protected:
    ClientOfAskedUser() : Client(World::Consent::Asked) {}
};

TEST_F(Client, RecordsItsWindow) {
    startRecording();
    const StateAnswer state = recorder_->stateAndWait();
    ASSERT_TRUE(state.state);
    EXPECT_TRUE(client::recordingState(*state.state).isRecording);
    window_->paint(0xFFCC00);
    const auto current = world_.recording();
    EXPECT_GT(current["framesRecorded"].get<std::uint64_t>(), 0u);
    EXPECT_LE(current["framesRecorded"].get<std::uint64_t>(), current["frames"].get<std::uint64_t>());
    const StopAnswer stopped = recorder_->stopAndWait();
    ASSERT_TRUE(stopped.movie) << keyIn(stopped.error);
    EXPECT_TRUE(std::filesystem::exists(stopped.movie->path()));
    EXPECT_EQ(recorder_->discardAndWait(), std::nullopt);
    EXPECT_FALSE(std::filesystem::exists(stopped.movie->path()));
    EXPECT_THAT(comings_.all(), ElementsAre("connected"));
}

TEST_F(Client, KeepsWhatItWantsToRemember) {
    recorder_->setMicrophoneEnabledPersistent(true);
    recorder_->setHasUserConsentForCamera(true);
    recorder_->setHasUserConsentForMicrophone(true);
    recorder_->setBroadcastURL(URL("https://example.org/live"));
    const auto state = client::recordingState(recorder_->stateAndWait().state.value_or(Dictionary()));
    EXPECT_TRUE(state.microphoneEnabledPersistent);
    EXPECT_TRUE(state.hasUserConsentForCamera);
    EXPECT_TRUE(state.hasUserConsentForMicrophone);
    EXPECT_EQ(state.broadcastURL, URL("https://example.org/live"));
    EXPECT_FALSE(state.isRecording);
}

TEST_F(Client, IsToldThatAForeignWindowFailsToStart) {
    const auto other = world_.application(kMoving);
    window_->raise();  // it is in the foreground, so that nothing but the window can be wrong
    client::StartOptions foreign = options();
    foreign.windows = {ContextID{other->window()}};
    const auto error = recorder_->startAndWait(foreign).error;
    ASSERT_TRUE(error);
    EXPECT_EQ(client::recordingCodeOf(*error), RecordingErrorCode::FailedToStart);
    EXPECT_EQ(client::keyOf(*error), "RECORDING_ERROR_FAILED_TO_START");
    EXPECT_TRUE(error->localizedDescription()) << "the daemon's text";
    EXPECT_EQ(client::textOf(*error), *error->localizedDescription());
    EXPECT_THAT(world_.daemonLog(), HasSubstr("refused with -5803: a window layer is not the application's own"));
}

TEST_F(Client, IsToldThatItFailsToStartBehindAnotherApplication) {
    const auto other = world_.application(kMoving);
    ASSERT_TRUE(other->waitForFrame(1));
    EXPECT_EQ(keyIn(recorder_->startAndWait(options()).error), "RECORDING_ERROR_FAILED_TO_START");
    EXPECT_THAT(world_.daemonLog(), HasSubstr("refused with -5803: the application is not in the foreground"));
}

TEST_F(Client, IsToldThatASystemRecordingTakesAnEntitlement) {
    client::StartOptions system = options();
    system.systemRecording = true;
    EXPECT_EQ(keyIn(recorder_->startAndWait(system).error), "RECORDING_ERROR_ENTITLEMENTS");
}

TEST_F(Client, IsToldThatABroadcastTakesASetUp) {
    client::StartOptions broadcast = options();
    broadcast.broadcast = true;
    const auto error = start(broadcast);
    ASSERT_TRUE(error);
    EXPECT_EQ(client::recordingCodeOf(*error), RecordingErrorCode::InvalidBroadcastSession);
    EXPECT_FALSE(error->localizedDescription());
    EXPECT_EQ(client::textOf(*error), "RECORDING_ERROR_INVALID_BROADCAST_SESSION (-5808)");
}

TEST_F(ClientOfAskedUser, IsToldThatTheUserDeclined) {
    const std::string display = world_.display().name();
    std::thread user([&] { EXPECT_TRUE(DialogUser(display).answer(DialogUser::Button::Other)); });
    EXPECT_EQ(keyIn(start(options())), "RECORDING_ERROR_USER_DECLINED");
    user.join();
}

TEST_F(Client, IsToldThatSpaceRanOut) {
    startRecording();
    const auto purged = askAdminService(world_.path("run/lumacast/admin.sock"), "purge 3", std::chrono::seconds(60));
    ASSERT_TRUE(purged);
    ASSERT_TRUE(waitUntil([&] { return !stops().empty(); }));
    EXPECT_THAT(stops(), ElementsAre("RECORDING_ERROR_INSUFFICIENT_STORAGE"));
    EXPECT_FALSE(movie_);
}

TEST_F(Client, IsToldThatAnotherApplicationInterrupted) {
    startRecording();
    const auto other = world_.application(kMoving);
    ASSERT_TRUE(other->waitForFrame(1));
    ASSERT_TRUE(other->ask("start").starts_with("started")) << world_.daemonLog();
    ASSERT_TRUE(waitUntil([&] { return !stops().empty(); }));
    EXPECT_EQ(stops().front(), "RECORDING_ERROR_INTERRUPTED");
}

TEST_F(Client, IsToldThatAResumeNamedAForeignWindowAndGetsTheMovie) {
    const auto other = world_.application(kMoving);
    window_->raise();
    startRecording();
    recorder_->pause();
    recorder_->resume(ContextID{other->window()});
    ASSERT_TRUE(waitUntil([&] { return !stops().empty(); })) << world_.daemonLog();
    EXPECT_THAT(stops(), ElementsAre("RECORDING_ERROR_NO_CONTEXTID_MATCH"));
    EXPECT_FALSE(text_.empty());
    ASSERT_TRUE(movie_);
    EXPECT_GT(checkers::MovieReader(movie_->path()).duration(), std::chrono::nanoseconds::zero());
}

TEST_F(Client, IsAnsweredOnceWhenTheDaemonIsKilledAndRecordsWithTheNextOne) {
    startRecording();
    for (std::size_t round = 1; round <= 2; ++round) {
        Answers<StartAnswer> start;
        Answers<StopAnswer> stop;
        Answers<StateAnswer> state;
        // Stopped, it answers nothing that is asked now.
        ::kill(world_.daemon().pid(), SIGSTOP);
        recorder_->start(options(), start.handler());
        recorder_->stop(stop.handler());
        recorder_->state(state.handler());
        EXPECT_EQ(start.total() + stop.total() + state.total(), 0);
        EXPECT_EQ(world_.endDaemon(SIGKILL), -1);
        ASSERT_TRUE(waitUntil([&] { return start.total() + stop.total() + state.total() >= 3; }));
        EXPECT_EQ(keyIn(start.last().error), "CONNECTION_ERROR_LOST");
        EXPECT_EQ(keyIn(stop.last().error), "CONNECTION_ERROR_LOST");
        EXPECT_EQ(keyIn(state.last().error), "CONNECTION_ERROR_LOST");
        ASSERT_TRUE(waitUntil([&] { return comings_.all().size() == 2 * round; }));
        world_.startDaemon();
        ASSERT_TRUE(waitUntil([&] { return comings_.all().size() == 2 * round + 1; }));
        startRecording();
        EXPECT_TRUE(start.eachOnce() && stop.eachOnce() && state.eachOnce());
    }
    const StopAnswer stopped = recorder_->stopAndWait();
    ASSERT_TRUE(stopped.movie) << keyIn(stopped.error);
    EXPECT_GT(checkers::MovieReader(stopped.movie->path()).duration(), std::chrono::nanoseconds::zero());
    EXPECT_THAT(comings_.all(),
                ElementsAre("connected", "disconnected", "connected", "disconnected", "connected"));
}

TEST_F(Client, StopsAfterAThousandDiscardsWhileRecording) {
    Answers<std::optional<Error>> discards;
    startRecording();
    for (std::size_t i = 0; i < 1000; ++i) {
        recorder_->discard(discards.handler(i));
        if (i % 50 != 49) continue;
        const StateAnswer state = recorder_->stateAndWait();
        ASSERT_FALSE(state.error) << i << keyIn(state.error);
        ASSERT_TRUE(client::recordingState(*state.state).isRecording) << i;
    }
    const StopAnswer stopped = recorder_->stopAndWait();
    ASSERT_TRUE(stopped.movie) << keyIn(stopped.error);
    EXPECT_TRUE(std::filesystem::exists(stopped.movie->path()));
    EXPECT_EQ(discards.total(), 0);
    EXPECT_THAT(comings_.all(), ElementsAre("connected"));
    EXPECT_EQ(world_.endDaemon(SIGKILL), -1);
    ASSERT_TRUE(waitUntil([&] { return discards.total() >= 1000; }));
    EXPECT_TRUE(discards.eachOnce());
    EXPECT_EQ(keyIn(discards.last()), "CONNECTION_ERROR_LOST");
}

TEST_F(Client, SeesSevenThingsInItsStateAndAnEighthWithABroadcastURL) {
    const auto keys = [this] {
        std::vector<std::string> names;
        const Dictionary state = recorder_->stateAndWait().state.value_or(Dictionary());
        for (const auto& [key, value] : state.entries()) names.push_back(key);
        return names;
    };
    EXPECT_THAT(keys(), ElementsAre("isRecording", "isBroadcasting", "microphoneEnabled", "isSystemRecording",
                                    "hasUserConsentForMicrophone", "hasUserConsentForCamera",
                                    "microphoneEnabledPersistent"));
    recorder_->setBroadcastURL(URL("https://example.org/live"));
    EXPECT_EQ(keys().back(), "broadcastURL");
    EXPECT_EQ(keys().size(), 8u);
}

TEST_F(Client, IsNotHeardAboutItsMicrophoneWhileItDoesNotRecord) {
    const auto microphone = [this] {
        return client::recordingState(recorder_->stateAndWait().state.value_or(Dictionary())).microphoneEnabled;
    };
    recorder_->setMicrophoneEnabled(true);
    EXPECT_FALSE(microphone());
    startRecording();
    recorder_->setMicrophoneEnabled(true);
    EXPECT_TRUE(microphone());
}

TEST_F(Client, GetsTheWholeMovieForOneClipDurationAndNoAnswerForAStopWhenIdle) {
    startRecording();
    const StopAnswer stopped = recorder_->stopWithClipAndWait(1, 0);
    ASSERT_TRUE(stopped.movie) << keyIn(stopped.error);
    EXPECT_TRUE(stopped.movie->path().ends_with("/Tester.mp4")) << stopped.movie->path();
    Answers<StopAnswer> idle;
    recorder_->stop(idle.handler(0));
    EXPECT_FALSE(recorder_->stateAndWait().error) << "a later question is answered";
    EXPECT_EQ(idle.total(), 0);
    EXPECT_EQ(world_.endDaemon(SIGKILL), -1);
    EXPECT_TRUE(waitUntil([&] { return idle.total() == 1; })) << "the end of the connection answers it";
}

TEST_F(Client, GivesItsPlaceToTheNewestRecorderOfTheApplicationWhichGoesOnRecording) {
    startRecording();
    Comings newest;
    Recorder second(newest.events(), world_.path("run/lumacast"));
    const auto state = second.stateAndWait();
    ASSERT_TRUE(state.state);
    EXPECT_TRUE(client::recordingState(*state.state).isRecording);
    ASSERT_TRUE(waitUntil([&] { return comings_.all().size() == 2; }));
    const double elapsed = world_.recording()["elapsedSeconds"].get<double>();
    // Longer than the first one looks whether the daemon has died.
    ASSERT_TRUE(world_.waitForElapsed(elapsed + 2));
    EXPECT_THAT(newest.all(), ElementsAre("connected")) << "the first one took its place back";
    EXPECT_THAT(comings_.all(), ElementsAre("connected", "disconnected"));
    EXPECT_TRUE(second.stopAndWait().movie);
}

TEST(MinimalExample, LeavesAMovieOfThreeSeconds) {
    World world;
    world.install("org.lumacast.Minimal", "Minimal", LC_MINIMAL);
    world.startDaemon();
    checkers::Child example({LC_MINIMAL, world.path("copy.mp4")}, world.environment(), world.path("minimal.log"));
    EXPECT_EQ(example.wait(), 0);
    const double seconds =
        std::chrono::duration<double>(checkers::MovieReader(world.path("copy.mp4")).duration()).count();
    EXPECT_GT(seconds, 2.0);
    EXPECT_LT(seconds, 20.0);
}

TEST_F(Client, IsSeenInAWatchUntilTheDaemonEnds) {
    startRecording();
    checkers::Child watch({LC_CTL, "status", "--watch"}, world_.environment(), world_.path("tool.log"));
    std::vector<std::string> lines;
    for (int block = 0; block < 2; ++block) {
        EXPECT_THAT(watch.readLine(), ::testing::StartsWith("APPLICATION"));
        lines.push_back(watch.readLine());
        EXPECT_EQ(watch.readLine(), "");
    }
    EXPECT_THAT(lines[0],
                ::testing::MatchesRegex("org.lumacast.Tester +recording +0:0[0-9].[0-9] .* [1-9][0-9]* +[0-9]+"));
    EXPECT_NE(lines[0], lines[1]);
    EXPECT_EQ(world_.endDaemon(SIGTERM), 0);
    (void)watch.readAll();
    EXPECT_EQ(watch.wait(), 1);
}

}  // namespace
}  // namespace lumacast::test
