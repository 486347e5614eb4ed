#pragma once
// One kind of movie, made by a real daemon whose file calls may fail, and judged.

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "tests/reliability/FaultPlan.h"
#include "tests/system/SavingWorld.h"

namespace lumacast::test {

/// A call of the system that a recording makes, the number-th of its kind on its target.
struct FaultPoint {
    std::string call, target;
    std::size_t number = 0;
};

/// A line of the daemon's notes.
struct NotedCall {
    std::chrono::nanoseconds time{};
    std::string call, target;
    std::string fault;  ///< empty when it had none
};

/// What the client heard of one recording.
struct Heard {
    std::string start, stop;  ///< "ok", "error <code>", "no answer"; empty when it was not asked
    bool isDisconnected = false;  ///< told so before it asked for the end, by an application with a window
    std::vector<std::string> events;
    std::optional<std::string> movie;
};

class Scenario {
public:
    virtual ~Scenario() = default;
    virtual std::string name() const = 0;

    /// Has one movie made, start to end. Everything that answers may fail, and the daemon may die on the way.
    virtual Heard record() = 0;
    /// Whether what follows the answer of a recording without fault has happened: what was handed on is removed.
    virtual bool isSettled() const { return true; }
    /// What is wrong with what is there after a recording that had a fault: each movie plays, or there is none, and nothing
    /// is lost that was safe before. `ended` is when the daemon was killed.
    virtual std::vector<std::string> judgeAfterFault(const Heard& heard, std::optional<std::chrono::nanoseconds> ended) = 0;
    /// What is wrong with a recording that had none.
    virtual std::vector<std::string> judgeWhole(const Heard& heard) = 0;
    /// Has another movie made, the plainest and shortest that there is of this kind; what is wrong with it in the end.
    virtual std::vector<std::string> judgeNext();
    /// Removes what recordings have left.
    virtual void clear();

    /// Starts the daemon with the faulty calls, following this plan (none: it only takes notes).
    void startFaulty(const std::optional<FaultPoint>& point, std::optional<Fault> fault);
    /// Starts the daemon with the faulty calls, all of which it only notes, until its end, and has the system's own list of
    /// `systemCalls` written to the file `trace` meanwhile (strace, which ends with it).
    void startTraced(const std::string& trace, const std::string& systemCalls);
    /// Starts the shipped daemon.
    void startShipped();
    /// From now on calls are noted and may fail, if the daemon was started for that; no more, until the next start.
    void arm() const;
    void disarm();
    /// The daemon's notes since it was started.
    std::vector<NotedCall> calls() const;
    std::string faultsFolder() const { return world_.path("faults"); }
    SavingWorld& world() { return world_; }

    /// Whether the daemon's process is there.
    bool daemonLives();

protected:
    Scenario();
    virtual std::vector<std::string> daemonVariables() const;

    SavingWorld world_;

private:
    bool wantsFaults_ = false, staysArmed_ = false;
};

/// The movie of a window; whole, its middle ("clip"), or with clips for an extension.
std::unique_ptr<Scenario> plainMovie();
std::unique_ptr<Scenario> trimmedMovie();
std::unique_ptr<Scenario> clipMovies();
/// The whole display.
std::unique_ptr<Scenario> displayMovie();
/// A movie with two sound tracks, saved to the user's library with both in one.
std::unique_ptr<Scenario> mixedMovie();

}  // namespace lumacast::test
