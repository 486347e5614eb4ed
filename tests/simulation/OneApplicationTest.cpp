// One application records itself, in every interleaving that a seed gives: connect, start, pause, resume, stop, death
// at any step. LC_SEED=n replays one seed; LC_SEEDS=n runs so many.

#include <gtest/gtest.h>

#include <map>

#include "tests/simulation/JudgePictures.h"
#include "tests/simulation/Seeds.h"
#include "tests/simulation/SimulatedApplication.h"
#include "tests/simulation/SimulatedDaemon.h"
#include "tests/simulation/Stillness.h"

namespace lumacast {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

/// What one seed did, for comparing a replay.
struct Outcome {
    std::uint64_t traceHash = 0;
    std::vector<std::string> log;
    int moviesKept = 0;
    int clipsKept = 0;
    int pauses = 0;
    int deaths = 0;
    int replaced = 0;
    int failedStarts = 0;
};

/// One seed's life of the application.
class Life {
public:
    explicit Life(std::uint64_t seed)
        : daemon_(seed),
          random_(daemon_.world.scheduler.fork()),
          application_(fakes(), BundleIdentifier("org.example.Player"), "Player", ProcessID{500}, ContextID{7}) {
        if (random_.below(3) == 0) {
            faulty_ = true;
            fakes().faults.failAtRandom(random_.next(), 1, 60);
        }
    }

    Outcome live() {
        application_.connect();
        const std::uint64_t steps = 4 + random_.below(28);
        for (std::uint64_t i = 0; i < steps; ++i) {
            act();
            goOn();
            checkAlways();
        }
        end();
        outcome_.traceHash = daemon_.world.scheduler.traceHash();
        outcome_.log = fakes().logSink.logged();
        return outcome_;
    }

private:
    FakePlatform& fakes() { return daemon_.world.fakes; }

    ProcessID nextProcess() { return ProcessID{static_cast<std::int32_t>(500 + ++incarnation_)}; }

    void act() {
        if (!application_.isAlive()) {
            application_.startAgain(nextProcess());
            application_.connect();
            return;
        }
        switch (random_.below(12)) {
            case 0: case 1: case 2: starts_.push_back(application_.start()); break;
            case 3: case 4: application_.tell(DaemonMessage::PauseRecording); ++outcome_.pauses; break;
            case 5: case 6: application_.tell(DaemonMessage::ResumeRecording, {number(application_.window)}); break;
            case 7: stops_.push_back(application_.ask(DaemonMessage::StopRecording)); break;
            case 8:
                stops_.push_back(application_.ask(DaemonMessage::StopRecordingWithClipDurations, {1.0, 1.0}));
                break;
            case 9: application_.ask(DaemonMessage::DiscardRecording); break;
            case 10: application_.ask(DaemonMessage::SynchronousGetCurrentState); break;
            default:
                switch (random_.below(4)) {
                    case 0:
                        application_.die();
                        ++outcome_.deaths;
                        break;
                    case 1:
                        application_.replaceProcess(nextProcess());
                        ++outcome_.replaced;
                        break;
                    default: application_.connect();  // again, over the old connection
                }
        }
    }

    /// Lets anything from nothing to seconds happen.
    void goOn() {
        for (std::uint64_t i = random_.below(60); i > 0; --i)
            if (!daemon_.world.scheduler.step()) break;
        if (random_.below(2) == 0) daemon_.world.scheduler.advance(milliseconds(random_.below(1500)));
    }

    void checkAlways() {
        EXPECT_FALSE(fakes().keepAlive.endedWithoutBegin());
        // One for the recording, and one for each older one whose stop is still to be answered.
        EXPECT_LE(fakes().keepAlive.open(), static_cast<int>(1 + starts_.size()));
        for (const auto& asked : application_.asked())
            EXPECT_LE(asked->answers + asked->failures, 1) << describeMessage(*asked);
    }

    /// Nobody else records here: a recording is lost to a newer start of the same process only, and each start ends one.
    void checkTold() {
        std::map<std::size_t, int> starts, lost;
        for (const auto& asked : application_.asked())
            if (asked->message == DaemonMessage::StartRecording) ++starts[asked->firstOfProcess];
        for (const auto& told : application_.told()) {
            const Error* error = told.arguments[0].asError();
            if (error && error->code() == -5806) ++lost[told.firstOfProcess];
        }
        for (const auto& [process, count] : lost)
            EXPECT_LT(count, starts[process]) << "told of the end of a recording that it never began";
        for (const auto& stop : stops_) {
            const URL* url = stop->answers == 1 ? stop->values[0].as<URL>() : nullptr;
            if (!url) continue;
            EXPECT_TRUE(url->path().ends_with("/Player.mp4") || url->path().ends_with("/Player_trimmed.mp4")) << url->path();
        }
    }

    static std::string_view describeMessage(const SimulatedApplication::Asked& asked) {
        return daemonProtocol().messages[static_cast<std::size_t>(asked.message)].name;
    }

    /// The last stop with nothing in its way, then death; afterwards nothing is left but what the rules leave.
    void end() {
        fakes().faults.clear();
        daemon_.world.scheduler.advance(seconds(5));
        checkNothingIsHeldWhenIdle();
        expectStillness(daemon_, faulty_);
        if (application_.isAlive() && !faulty_) {
            recordOnceMore();
            // What an older clip has left is not in the way of a newer one.
            for (std::uint64_t i = random_.below(4) == 0 ? 2 : 0; i > 0; --i) recordClip();
        }
        application_.die();
        daemon_.world.scheduler.advance(seconds(5));
        checkAlways();
        checkTold();
        judgeMovies();
        EXPECT_EQ(fakes().keepAlive.open(), 0);
        EXPECT_EQ(fakes().renderServer.portsOpen(), 0);
        EXPECT_EQ(daemon_.sessionCount(), 0u);
        for (const SimBlockedTask& task : daemon_.world.scheduler.blockedTasks())
            ADD_FAILURE() << task.lane << " waits for " << task.waitsFor;
        expectStillness(daemon_, faulty_);
        for (const auto& start : starts_)
            if (start->answers == 1 && start->values[0].asError()) ++outcome_.failedStarts;
        const std::string folder = fakes().fileSystem.temporaryDirectory() + "/";
        for (const std::string& path : fakes().fileSystem.files())
            EXPECT_TRUE(path == folder + "Player.mp4" || path == folder + "Player_trimmed.mp4") << path;
    }

    /// A session that has come to rest holds no transaction; only a clip that could not be made leaves its stop
    /// unanswered.
    void checkNothingIsHeldWhenIdle() {
        for (const auto& stop : stops_)
            if (stop->message == DaemonMessage::StopRecordingWithClipDurations && stop->answers == 0) return;
        EXPECT_LE(fakes().keepAlive.open(), 1);
        const Dictionary snapshot = daemon_.snapshot();
        for (const Value& entry : *snapshot.find("sessions")->as<Array>()) {
            const Dictionary& session = *entry.as<Dictionary>();
            EXPECT_EQ(*session.find("transactionOpen"), *session.find("recording")) << describe(entry);
        }
    }

    /// Whatever happened before, the application can record again, and that movie is whole.
    void recordOnceMore() {
        application_.connect();
        const auto start = application_.start();
        daemon_.world.scheduler.advance(seconds(3));
        ASSERT_EQ(start->answers, 1);
        EXPECT_TRUE(start->values[0].isNull()) << describe(start->values[0]);
        application_.tell(DaemonMessage::PauseRecording);
        daemon_.world.scheduler.advance(milliseconds(random_.below(3000)));
        application_.tell(DaemonMessage::ResumeRecording, {number(application_.window)});
        daemon_.world.scheduler.advance(seconds(1));
        const auto stop = application_.ask(DaemonMessage::StopRecording);
        daemon_.world.scheduler.advance(seconds(1));
        ASSERT_EQ(stop->answers, 1);
        EXPECT_TRUE(stop->values[1].isNull());
        const URL* url = stop->values[0].as<URL>();
        ASSERT_TRUE(url);
        const auto movie = fakes().fileSystem.movie(url->path());
        ASSERT_TRUE(movie);
        EXPECT_TRUE(movie->finished);
        // Three seconds and one, without the pause.
        EXPECT_NEAR(movie->duration().seconds(), 4.0, 0.1);
        (void)judgePictures(*movie);  // whether it may be late is judged with all the others
        stops_.push_back(stop);
    }

    void recordClip() {
        const auto start = application_.start();
        daemon_.world.scheduler.advance(seconds(3));
        ASSERT_EQ(start->answers, 1);
        const auto stop = application_.ask(DaemonMessage::StopRecordingWithClipDurations, {1.0, 1.0});
        daemon_.world.scheduler.advance(seconds(1));
        ASSERT_EQ(stop->answers, 1) << "a clip";
        const URL* url = stop->values[0].as<URL>();
        const auto movie = url ? fakes().fileSystem.movie(url->path()) : nullptr;
        ASSERT_TRUE(movie);
        EXPECT_TRUE(url->path().ends_with("/Player_trimmed.mp4")) << url->path();
        EXPECT_NEAR(movie->duration().seconds(), 1.0, 0.1);
        stops_.push_back(stop);
    }

    void judgeMovies() {
        for (const auto& stop : stops_) {
            if (stop->answers != 1 || !stop->values[0].as<URL>()) continue;
            if (stop->message == DaemonMessage::StopRecording)
                ++outcome_.moviesKept;
            else
                ++outcome_.clipsKept;
        }
        if (!faulty_) judgeRecordings(fakes().containerWriters.recordings());
    }

    SimulatedDaemon daemon_;
    SimRandom random_;
    SimulatedApplication application_;
    std::vector<std::shared_ptr<SimulatedApplication::Asked>> starts_, stops_;
    bool faulty_ = false;
    int incarnation_ = 0;
    Outcome outcome_;
};

TEST(OneApplication, LeavesNothingBehindInAnyOfManySeeds) {
    const Seeds seeds(500);
    Outcome total;
    for (std::uint64_t seed = seeds.first; seed <= seeds.last; ++seed) {
        Seeds::begin(seed);
        SCOPED_TRACE("LC_SEED=" + std::to_string(seed));
        const Outcome outcome = Life(seed).live();
        total.moviesKept += outcome.moviesKept;
        total.clipsKept += outcome.clipsKept;
        total.pauses += outcome.pauses;
        total.deaths += outcome.deaths;
        total.replaced += outcome.replaced;
        total.failedStarts += outcome.failedStarts;
        if (HasFailure()) {
            for (const std::string& line : outcome.log) ADD_FAILURE() << line;
            FAIL() << "seed " << seed;
        }
    }
    // The seeds really went everywhere.
    if (seeds.areAllOrdinary()) {
        EXPECT_GT(total.moviesKept, 50);
        EXPECT_GT(total.clipsKept, 5);
        EXPECT_GT(total.pauses, 100);
        EXPECT_GT(total.deaths, 20);
        EXPECT_GT(total.replaced, 20);
        EXPECT_GT(total.failedStarts, 5);
    }
}

TEST(OneApplication, ASeedReplaysExactly) {
    for (std::uint64_t seed = 1; seed <= 25; ++seed) {
        const Outcome first = Life(seed).live(), second = Life(seed).live();
        EXPECT_EQ(first.traceHash, second.traceHash) << seed;
        EXPECT_EQ(first.log, second.log) << seed;
    }
    EXPECT_NE(Life(1).live().traceHash, Life(2).live().traceHash);
}

}  // namespace
}  // namespace lumacast
