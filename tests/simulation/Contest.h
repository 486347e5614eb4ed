#pragma once
// Several applications that compete for the recording, and what must hold whatever they do.

#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "tests/simulation/SimulatedApplication.h"
#include "tests/simulation/SimulatedDaemon.h"

namespace lumacast {


/// What the seeds did all together: a run that goes nowhere proves nothing.
struct ContestTally {
    int movies = 0, clips = 0, purges = 0, deaths = 0;
    int granted = 0, refusedByUser = 0, leftStanding = 0, systemRecordings = 0, inLibrary = 0, interrupted = 0,
        handedOver = 0, interruptionsChecked = 0, purgedAway = 0, begunInThePurge = 0;
    std::map<std::int64_t, int> refused;  ///< by the error of the start's answer
    std::map<std::int64_t, int> told;     ///< by the error of the message
};

/// One application and what is known of its movie.
struct ContestPlayer {
    ContestPlayer(FakePlatform& machine, const std::string& name, int pid, std::uint32_t window)
        : application(machine, BundleIdentifier("org.example." + name), name, ProcessID{pid}, ContextID{window}) {}

    SimulatedApplication application;
    /// A stop that is the last thing the application asked for: its movie must be there when it was answered.
    std::shared_ptr<SimulatedApplication::Asked> lastStop;
    /// The same for a discard: when it was answered, no movie is left.
    std::shared_ptr<SimulatedApplication::Asked> lastDiscard;
    std::size_t toldWhenItDied = 0;
    std::vector<std::shared_ptr<SimulatedApplication::Asked>> starts, stops;
    /// Starts that must fail, and why: nothing has changed since they were asked if `changes` is still the contest's.
    struct Forbidden {
        std::shared_ptr<SimulatedApplication::Asked> start;
        const char* why;
        std::uint64_t changes;
    };
    std::vector<Forbidden> forbidden;
    static constexpr std::uint64_t kNever = UINT64_MAX;  ///< a start that is forbidden whatever changes
    /// Stops that were asked of a recording that was on: they are answered, unless the application is told of its end.
    struct Awaited {
        std::shared_ptr<SimulatedApplication::Asked> stop;
        std::size_t connection, told;
    };
    std::vector<Awaited> awaited;
    bool isInForeground = true;
    /// The session that a reset of the media services has ended for good, if it is still the application's.
    std::weak_ptr<LCRecordingSession> deadSession;
};

/// One seed's contest on a platform that may fail: starts of every kind, pauses, resumes with windows of their own and of
/// others, stops, clips, discards, changes of the foreground, purges, a full disk, capture that fails, is pre-empted or
/// reset, and deaths at any step. One of them may record the whole display. The user is asked, and grants, refuses,
/// takes a long time or never answers.
class Contest {
public:
    Contest(std::uint64_t seed, ContestTally& tally);

    void run();
    std::uint64_t traceHash() const { return daemon_.world.scheduler.traceHash(); }
    std::vector<std::string> log() { return fakes().logSink.logged(); }

private:
    using Player = ContestPlayer;

    FakePlatform& fakes() { return daemon_.world.fakes; }

    // What happens.
    void entitle(const Player& player);
    /// None leaves the alert standing.
    std::optional<UserAlert::Response> answerOf(std::uint64_t mood);
    void startProcess(Player& player);
    void stop(Player& player, DaemonMessage message, Array arguments = {});
    /// Between two steps of the simulation.
    bool isRecording(const Player& player);
    void act(Player& player);
    void startOfAnotherKind(Player& player);
    /// Of the newest start; null for a reason that lies in the moment, if there is one.
    void noteForbidden(Player& player, const char* why);
    /// The application whose frames a source delivers has a session that is given none any more.
    void resetMediaServices(FakeDisplayCaptureSource& source);
    void purge(std::int32_t urgency);
    /// The storage is cleared, and while that is under way an application begins to record.
    void recordInThePurge();
    /// The device does something.
    void disturb();
    void setForeground(Player& player, std::uint32_t state);
    void setFreeSize(std::uint64_t bytes);
    /// While the user is asked about an application, its window becomes another one's. Then the user agrees.
    void handWindowOver();
    /// Fewer steps than that.
    void goOnUpTo(std::uint64_t steps);
    /// Lets anything from nothing to seconds happen.
    void goOn();

    // What must hold.
    /// One that waits for the user may begin after anything that is asked now.
    static bool aStartIsOpen(const Player& player);
    static bool isPrivileged(const Player& player) { return player.application.name == kPrivileged; }
    void checkAlways();
    void checkTold(const Player& player);
    void checkForbidden(Player& player);
    void checkStops(const Player& player);
    /// Whoever is captured shows no window of another.
    void checkWindows();
    /// When nothing is under way any more.
    void checkAtRest();
    void end();
    /// A recording of the whole display outlives its client. Its last session becomes an application's again.
    void endSystemRecordings();
    void checkFiles();
    /// Whatever happened before, the application can record, alone, and that movie is whole; unless the storage is
    /// cleared just then, and it is told that this has ended its recording.
    void recordOnceMore(Player& player);
    /// The user is asked again after the application was in the background for long, and not after a short while.
    void checkExemption(Player& player);
    bool isAskedAbout(Player& player);
    /// A recording that ends because the user, asked for long, lets another begin: its application is told of the movie
    /// then, and once more when it becomes active while it records again.
    void checkInterruption(Player& player, Player& other);
    /// The user lets the other one begin while the player records.
    void interrupt(Player& player, Player& other);

    static constexpr char kPrivileged[] = "Delta";
    static constexpr std::uint64_t kPlenty = 10'000'000'000;

    SimulatedDaemon daemon_;
    SimRandom random_;
    std::deque<Player> players_;
    ContestTally& tally_;
    bool faulty_ = false, diskWasFull_ = false, diskIsFull_ = false;
    std::uint64_t changes_ = 0;  ///< of what forbids starts
    int incarnation_ = 0;
};

}  // namespace lumacast
