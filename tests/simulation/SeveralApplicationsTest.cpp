// Several applications compete for the recording on a platform that may fail: starts of every kind, pauses, resumes
// with windows of their own and of others, stops, clips, discards, changes of the foreground, purges, a full disk,
// capture that fails, is pre-empted or reset, and deaths at any step, in every interleaving that a seed gives. One of
// them may record the whole display. The user is asked, and grants, refuses, takes a long time or never answers.
// LC_SEED=n replays one seed; LC_SEEDS=n runs so many.

#include <gtest/gtest.h>

#include <algorithm>
#include <deque>
#include <limits>
#include <map>
#include <set>

#include "tests/simulation/JudgePictures.h"
#include "tests/simulation/Seeds.h"
#include "tests/simulation/SimulatedApplication.h"
#include "tests/simulation/SimulatedDaemon.h"

namespace lumacast {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

/// What the seeds did all together: a run that goes nowhere proves nothing.
struct Tally {
    int movies = 0, clips = 0, purges = 0, deaths = 0;
    int granted = 0, refusedByUser = 0, leftStanding = 0, systemRecordings = 0, inLibrary = 0, interrupted = 0;
    std::map<std::int64_t, int> refused;  ///< by the error of the start's answer
    std::map<std::int64_t, int> told;     ///< by the error of the message
};

/// One application and what is known of its movie.
struct Player {
    Player(FakePlatform& machine, const std::string& name, int pid, std::uint32_t window)
        : application(machine, BundleIdentifier("org.example." + name), name, ProcessID{pid}, ContextID{window}) {}

    SimulatedApplication application;
    /// A stop that is the last thing the application asked for: its movie must be there when it was answered.
    std::shared_ptr<SimulatedApplication::Asked> lastStop;
    /// The same for a discard: when it was answered, no movie is left.
    std::shared_ptr<SimulatedApplication::Asked> lastDiscard;
    std::size_t toldWhenItDied = 0;
    std::vector<std::shared_ptr<SimulatedApplication::Asked>> starts, stops;
    /// The session that a reset of the media services has ended for good, if it is still the application's.
    std::weak_ptr<LCRecordingSession> deadSession;
};

class Contest {
public:
    Contest(std::uint64_t seed, Tally& tally) : daemon_(seed), random_(daemon_.world.scheduler.fork()), tally_(tally) {
        players_.emplace_back(fakes(), "Alpha", 500, 7);
        players_.emplace_back(fakes(), "Beta", 600, 8);
        players_.emplace_back(fakes(), "Gamma", 700, 9);
        players_.emplace_back(fakes(), kPrivileged, 800, 10);
        entitle(players_.back());
        fakes().preferences.set(kPreferenceDomain, "LCSuppressAlert", random_.below(2) != 0);
        fakes().deviceInfo.setRegionalRule("RegionalBehaviorShutterClick", random_.below(2) == 0);
        fakes().userAlerts.setUser([this, user = daemon_.world.scheduler.fork()](const AlertContent&) mutable {
            return answerOf(user.below(8));
        });
        faulty_ = random_.below(3) == 0;
        if (faulty_) fakes().faults.failAtRandom(random_.next(), 1, 80);
    }

    void run() {
        for (Player& player : players_) player.application.connect();
        const std::uint64_t steps = 8 + random_.below(40);
        for (std::uint64_t i = 0; i < steps && !::testing::Test::HasFailure(); ++i) {
            if (random_.below(6) == 0)
                disturb();
            else
                act(players_[random_.below(players_.size())]);
            goOn();
            checkAlways();
        }
        end();
    }
    std::uint64_t traceHash() const { return daemon_.world.scheduler.traceHash(); }
    std::vector<std::string> log() { return fakes().logSink.logged(); }

private:
    FakePlatform& fakes() { return daemon_.world.fakes; }

    void entitle(const Player& player) {
        fakes().ipc.grant(player.application.pid(), "com.orvane.private.luma-cast", true);
        fakes().appStateMonitor.setProcess(player.application.identifier, player.application.pid());
    }
    /// None leaves the alert standing.
    std::optional<UserAlert::Response> answerOf(std::uint64_t mood) {
        switch (mood) {
            case 0:
            case 1: ++tally_.refusedByUser; return UserAlert::Response::OtherButton;
            case 2:
            case 3: ++tally_.leftStanding; return std::nullopt;
            case 4: ++tally_.granted; return UserAlert::Response::AlternateButton;
            default: ++tally_.granted; return UserAlert::Response::DefaultButton;
        }
    }
    /// One that waits for the user may begin after anything that is asked now.
    static bool aStartIsOpen(const Player& player) {
        return std::any_of(player.starts.begin(), player.starts.end(),
                           [](const auto& start) { return start->answers + start->failures == 0; });
    }
    static bool isPrivileged(const Player& player) { return player.application.name == kPrivileged; }
    void startProcess(Player& player) {
        player.application.startAgain(ProcessID{static_cast<std::int32_t>(1000 + ++incarnation_)});
        if (isPrivileged(player)) entitle(player);
        player.application.connect();
    }

    void act(Player& player) {
        SimulatedApplication& application = player.application;
        if (!application.isAlive()) {
            startProcess(player);
            return;
        }
        const std::uint64_t what = random_.below(16);
        const bool asksOfItsMovie = what <= 10 && what != 5 && what != 6;
        if (asksOfItsMovie) {
            player.lastStop.reset();
            player.lastDiscard.reset();
        }
        switch (what) {
            case 0:
            case 1:
            case 2:
            case 3:
                player.starts.push_back(isPrivileged(player) && random_.below(2) == 0
                                            ? application.start({}, {.microphone = true, .system = true})
                                            : application.start());
                break;
            case 4: player.starts.push_back(startOfAnotherKind(application)); break;
            case 5:
                application.tell(DaemonMessage::PauseRecording);
                if (random_.below(3) != 0) break;
                [[fallthrough]];
            case 6: {
                const bool ofAnother = random_.below(4) == 0;
                if (ofAnother) player.lastStop.reset();
                application.tell(DaemonMessage::ResumeRecording,
                                 {number(ofAnother ? players_[random_.below(players_.size())].application.window
                                                   : application.window)});
                break;
            }
            case 7:
            case 8:
                player.stops.push_back(application.ask(DaemonMessage::StopRecording));
                if (!aStartIsOpen(player)) player.lastStop = player.stops.back();
                break;
            case 9:
                player.stops.push_back(application.ask(DaemonMessage::StopRecordingWithClipDurations, {1.0, 1.0}));
                break;
            case 10: {
                const auto discard = application.ask(DaemonMessage::DiscardRecording);
                if (!aStartIsOpen(player)) player.lastDiscard = discard;
                break;
            }
            case 11: application.tell(DaemonMessage::ClientDidResignActive); break;
            case 12: application.tell(DaemonMessage::ClientDidBecomeActive); break;
            case 13: application.ask(DaemonMessage::SynchronousGetCurrentState); break;
            case 14: application.connect(); break;  // again, over the old connection
            default:
                application.die();
                player.lastStop.reset();
                player.toldWhenItDied = application.told().size();
                ++tally_.deaths;
        }
    }

    std::shared_ptr<SimulatedApplication::Asked> startOfAnotherKind(SimulatedApplication& application) {
        const std::vector<ContextID> own{application.window};
        switch (random_.below(8)) {
            case 0: return application.start({ContextID{99}}, {});  // nobody's window
            case 1: return application.start({}, {});
            case 2: return application.start({own[0], own[0]}, {.microphone = true});
            case 3: return application.start(own, {.camera = true});
            case 4: return application.start(own, {.broadcast = true});
            case 5: return application.start(own, {.system = true});
            case 6: return application.start(own, {.width = std::numeric_limits<double>::quiet_NaN()});
            default: return application.start(own, {.width = 1e9});
        }
    }

    /// The application whose frames a source delivers has a session that is given none any more.
    void resetMediaServices(FakeDisplayCaptureSource& source) {
        for (Player& player : players_) {
            std::shared_ptr<LCRecordingSession> session;
            daemon_.world.scheduler.mainQueue().sync(
                [&] { session = daemon_.process->manager().registeredSession(player.application.identifier); });
            if (session && session->screenCaptureController().get() == &source) player.deadSession = session;
        }
        source.mediaServicesWereReset();
    }

    /// The device does something.
    void disturb() {
        switch (random_.below(8)) {
            case 6: {
                // Late answers, and alerts whose program dies.
                const auto response = answerOf(random_.below(8));
                if (response) fakes().userAlerts.answer(*response);
                break;
            }
            case 7: {
                // Somebody comes to the front, leaves it, or ends.
                const Player& other = players_[random_.below(players_.size())];
                const std::uint64_t what = random_.below(3);
                fakes().appStateMonitor.update(what == 0 ? 1 : what == 1 ? 8 : 4, what == 1, other.application.pid());
                break;
            }
            case 0: {
                const std::int32_t urgency = 1 + static_cast<std::int32_t>(random_.below(3));
                fakes().storagePurge.requestPurge(urgency, [this, urgency](const std::optional<PurgeRecord>&) {
                    // Whatever was handed out until now may be gone.
                    if (urgency == 3)
                        for (Player& player : players_) player.lastStop.reset();
                });
                ++tally_.purges;
                break;
            }
            case 1: fakes().storagePurge.passDay(); break;
            case 2:
                fakes().appStateMonitor.setState(players_[random_.below(players_.size())].application.identifier,
                                                 random_.below(2) == 0 ? 8 : 4);
                break;
            case 3: {
                const bool full = random_.below(3) == 0;
                diskWasFull_ |= full;
                fakes().fileSystem.setFreeSize(full ? 0 : kPlenty);
                break;
            }
            case 4: fakes().preferences.set(kPreferenceDomain, "LCSuppressAlert", random_.below(2) != 0); break;
            default:
                for (const auto& source : fakes().displayCapture.sources()) {
                    if (!source->isRunning()) continue;
                    switch (random_.below(5)) {
                        case 0: resetMediaServices(*source); break;
                        case 1:
                        case 2: source->preempt(); break;
                        default: source->fail(-3);
                    }
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
        const auto sources = fakes().displayCapture.sources();
        EXPECT_LE(std::count_if(sources.begin(), sources.end(), [](const auto& source) { return source->isRunning(); }),
                  1)
            << "two applications are captured at a time";
        EXPECT_LE(fakes().userAlerts.standing(), 1u) << "the user is asked two things at a time";
        for (const Player& player : players_) {
            for (const auto& asked : player.application.asked()) {
                EXPECT_LE(asked->answers + asked->failures, 1)
                    << daemonProtocol().messages[static_cast<std::size_t>(asked->message)].name;
            }
            // Who loses its recording to another start hears why, and its movie is not handed out.
            std::set<std::string> kept;
            for (const auto& told : player.application.told()) {
                ASSERT_EQ(told.message, ClientMessage::StopRecordingWithError);
                const Error* error = told.arguments[0].asError();
                const URL* url = told.arguments[1].as<URL>();
                // But to one that the user let begin meanwhile: then without an error, and with its movie. It hears of
                // that movie again when it becomes active.
                if (!error) {
                    EXPECT_TRUE(url);
                    if (url) kept.insert(url->path());
                    ++tally_.interrupted;
                } else if (error->code() == -5806 && url) {
                    EXPECT_TRUE(kept.contains(url->path())) << url->path();
                } else if (error->code() != -5816) {  // that was its own doing: it has the movie
                    EXPECT_FALSE(url);
                }
            }
            if (!player.application.isAlive()) {
                EXPECT_EQ(player.application.told().size(), player.toldWhenItDied) << "told after its death";
            }
        }
    }

    /// What must hold when nothing is under way any more.
    void checkAtRest() {
        std::set<std::string> connected;
        bool anUnansweredClip = false;
        for (const Player& player : players_) {
            const auto& all = player.application.asked();
            for (std::size_t i = player.application.firstOfConnection(); i < all.size(); ++i) {
                const auto& asked = all[i];
                if (!player.application.isAlive() || (asked->message != DaemonMessage::StartRecording &&
                                                      asked->message != DaemonMessage::SynchronousGetCurrentState))
                    continue;
                EXPECT_EQ(asked->answers + asked->failures, 1)
                    << daemonProtocol().messages[static_cast<std::size_t>(asked->message)].name;
            }
            if (player.application.isAlive()) connected.insert(player.application.identifier.text());
            for (const auto& stop : player.stops)
                anUnansweredClip |= stop->message == DaemonMessage::StopRecordingWithClipDurations && !stop->answers;
        }
        const Dictionary snapshot = daemon_.snapshot();
        int recording = 0;
        for (const Value& entry : *snapshot.find("sessions")->as<Array>()) {
            const Dictionary& session = *entry.as<Dictionary>();
            const std::string identifier = *session.find("bundleID")->as<std::string>();
            EXPECT_TRUE(connected.contains(identifier) || *session.find("wholeDisplay")->as<bool>()) << describe(entry);
            const bool records = *session.find("recording")->as<bool>();
            recording += records ? 1 : 0;
            if (!anUnansweredClip) {
                EXPECT_EQ(*session.find("transactionOpen")->as<bool>(), records) << describe(entry);
            }
        }
        EXPECT_LE(recording, 1);
        if (!anUnansweredClip) {
            EXPECT_EQ(fakes().keepAlive.open(), recording);
        }
        for (const SimBlockedTask& task : daemon_.world.scheduler.blockedTasks())
            ADD_FAILURE() << task.lane << " waits for " << task.waitsFor;
        if (faulty_) return;
        for (const Player& player : players_) {
            // After a recording of the whole display another file is meant.
            if (isPrivileged(player)) continue;
            if (player.lastDiscard && player.lastDiscard->answers == 1 && player.application.isAlive()) {
                EXPECT_FALSE(fakes().fileSystem.exists(fakes().fileSystem.temporaryDirectory() + "/" +
                                                       player.application.name + ".mp4"));
            }
        }
        // The URL of a movie that could not be written is handed out too.
        if (diskWasFull_) return;
        for (const Player& player : players_) {
            if (!player.lastStop || player.lastStop->answers != 1) continue;
            if (const URL* url = player.lastStop->values[0].as<URL>()) {
                const auto movie = fakes().fileSystem.movie(url->path());
                ASSERT_TRUE(movie) << url->path() << " was handed out and is not there";
                EXPECT_TRUE(movie->finished);
            }
        }
    }

    void end() {
        fakes().faults.clear();
        fakes().fileSystem.setFreeSize(kPlenty);
        fakes().preferences.set(kPreferenceDomain, "LCSuppressAlert", true);
        fakes().userAlerts.setUser([](const AlertContent&) { return UserAlert::Response::DefaultButton; });
        fakes().userAlerts.answer(UserAlert::Response::DefaultButton);
        daemon_.world.scheduler.advance(seconds(5));
        EXPECT_EQ(fakes().userAlerts.standing(), 0u);
        checkAtRest();
        for (Player& player : players_) fakes().appStateMonitor.setState(player.application.identifier, 8);
        if (!faulty_)
            for (Player& player : players_) recordOnceMore(player);
        endSystemRecordings();
        for (Player& player : players_) {
            for (const auto& start : player.starts) {
                if (const Error* error = start->answers == 1 ? start->values[0].asError() : nullptr)
                    ++tally_.refused[error->code()];
            }
            for (const auto& stop : player.stops) {
                if (stop->answers != 1 || !stop->values[0].as<URL>()) continue;
                ++(stop->message == DaemonMessage::StopRecording ? tally_.movies : tally_.clips);
            }
            for (const auto& told : player.application.told()) {
                if (const Error* error = told.arguments[0].asError()) ++tally_.told[error->code()];
            }
            player.application.die();
        }
        daemon_.world.scheduler.advance(seconds(5));
        EXPECT_EQ(fakes().keepAlive.open(), 0);
        EXPECT_EQ(fakes().renderServer.portsOpen(), 0);
        EXPECT_EQ(daemon_.sessionCount(), 0u);
        const std::size_t assets = fakes().photoLibrary.assets().size();
        tally_.inLibrary += static_cast<int>(assets);
        // What could not be written is handed over too.
        for (const auto& asset : fakes().photoLibrary.assets()) {
            EXPECT_TRUE(faulty_ || diskWasFull_ || (asset.content && asset.content->finished)) << asset.movie.path();
        }
        for (const auto& source : fakes().displayCapture.sources()) EXPECT_FALSE(source->isRunning());
        for (const SimBlockedTask& task : daemon_.world.scheduler.blockedTasks())
            ADD_FAILURE() << task.lane << " waits for " << task.waitsFor;
        checkFiles();
        if (!faulty_)
            for (const auto& recording : fakes().containerWriters.recordings()) judgePictures(recording->movie());
    }

    /// A recording of the whole display outlives its client. Its last session becomes an application's again.
    void endSystemRecordings() {
        for (Player& player : players_) {
            if (!isPrivileged(player)) continue;
            if (!player.application.isAlive()) startProcess(player);
            player.application.connect();
            player.application.ask(DaemonMessage::StopRecording);
            daemon_.world.scheduler.advance(seconds(2));
            for (const auto& start : player.starts)
                tally_.systemRecordings += start->answers == 1 && start->values[0].isNull() ? 1 : 0;
            player.application.start();
            daemon_.world.scheduler.advance(seconds(2));
        }
    }

    void checkFiles() {
        const std::string folder = fakes().fileSystem.temporaryDirectory() + "/";
        std::set<std::string> allowed;
        for (const char* name : {"Alpha", "Beta", "Gamma", kPrivileged})
            for (const char* end : {".mp4", "_trimmed.mp4"}) allowed.insert(folder + name + end);
        for (const std::string& path : fakes().fileSystem.files())
            EXPECT_TRUE(allowed.contains(path) || path.starts_with(folder + "ScreenRecording_")) << path;
    }

    /// Whatever happened before, the application can record, alone, and that movie is whole.
    void recordOnceMore(Player& player) {
        SimulatedApplication& application = player.application;
        if (!application.isAlive()) return;
        application.connect();
        daemon_.world.scheduler.advance(milliseconds(100));
        if (const auto dead = player.deadSession.lock()) {
            std::shared_ptr<LCRecordingSession> session;
            daemon_.world.scheduler.mainQueue().sync(
                [&] { session = daemon_.process->manager().registeredSession(application.identifier); });
            if (session == dead) return;  // until the application itself goes
        }
        const auto start = application.start();
        daemon_.world.scheduler.advance(seconds(2));
        ASSERT_EQ(start->answers, 1);
        ASSERT_TRUE(start->values[0].isNull()) << describe(start->values[0]);
        const auto stop = application.ask(DaemonMessage::StopRecording);
        daemon_.world.scheduler.advance(seconds(1));
        ASSERT_EQ(stop->answers, 1);
        const URL* url = stop->values[0].as<URL>();
        ASSERT_TRUE(url) << describe(stop->values[1]);
        const auto movie = fakes().fileSystem.movie(url->path());
        ASSERT_TRUE(movie);
        EXPECT_TRUE(movie->finished);
        EXPECT_NEAR(movie->duration().seconds(), 2.0, 0.1);
    }

    static constexpr char kPrivileged[] = "Delta";
    static constexpr std::uint64_t kPlenty = 10'000'000'000;

    SimulatedDaemon daemon_;
    SimRandom random_;
    std::deque<Player> players_;
    Tally& tally_;
    bool faulty_ = false, diskWasFull_ = false;
    int incarnation_ = 0;
};

TEST(SeveralApplications, LeaveNothingBehindInAnyOfManySeeds) {
    Tally tally;
    const Seeds seeds(2000);
    for (std::uint64_t seed = seeds.first; seed <= seeds.last; ++seed) {
        Seeds::begin(seed);
        SCOPED_TRACE("LC_SEED=" + std::to_string(seed));
        Contest contest(seed, tally);
        contest.run();
        if (HasFailure()) {
            if (!seeds.isOne()) FAIL() << "seed " << seed;
            for (const std::string& line : contest.log()) ADD_FAILURE() << line;
            return;
        }
    }
    if (!seeds.areAllOrdinary()) return;
    // The seeds really went everywhere.
    EXPECT_GT(tally.movies, 50);
    EXPECT_GT(tally.clips, 5);
    EXPECT_GT(tally.purges, 50);
    EXPECT_GT(tally.deaths, 100);
    EXPECT_GT(tally.granted, 100);
    EXPECT_GT(tally.refusedByUser, 50);
    EXPECT_GT(tally.leftStanding, 50);
    EXPECT_GT(tally.systemRecordings, 100);
    EXPECT_GT(tally.inLibrary, 50);
    EXPECT_GT(tally.interrupted, 0);
    for (const std::int64_t code : {-5801, -5803, -5805, -5808, -5810}) EXPECT_GT(tally.refused[code], 3) << code;
    for (const std::int64_t code : {-5805, -5806, -5816, -5817}) EXPECT_GT(tally.told[code], 3) << code;
}

TEST(SeveralApplications, ASeedReplaysExactly) {
    for (const std::uint64_t seed : {3u, 77u}) {
        Tally tally;
        Contest once(seed, tally);
        once.run();
        Contest again(seed, tally);
        again.run();
        EXPECT_EQ(once.traceHash(), again.traceHash());
        EXPECT_EQ(once.log(), again.log());
    }
}

}  // namespace
}  // namespace lumacast
