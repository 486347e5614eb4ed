#pragma once
// A process of the sound tests that is spoken to line by line.

#include <sys/types.h>

#include <chrono>
#include <string>
#include <vector>

#include "base/Identifiers.h"
#include "linux/ipc/Fd.h"

namespace lumacast::test {

/// A program with pipes for its input and output, ended by its pid with this object. `environment` ("NAME=value") takes
/// the place of the test's own variables of these names; NAME alone takes one away.
class SoundProcess final {
public:
    explicit SoundProcess(std::vector<std::string> command, const std::vector<std::string>& environment = {});
    ~SoundProcess() { end(); }
    SoundProcess(const SoundProcess&) = delete;
    SoundProcess& operator=(const SoundProcess&) = delete;

    pid_t pid() const { return pid_; }
    bool hasEnded() const;
    /// How it ended without having been told to: "exit 1", "signal 9"; empty while it runs, and after end() or kill().
    std::string ownEnd() const;
    /// Writes a line and answers the one that comes back, or nothing within ten seconds.
    std::string ask(const std::string& line);
    std::string readLine(std::chrono::milliseconds patience = std::chrono::seconds(10));
    void send(int signal) const;
    void end();
    /// At once.
    void kill();

private:
    pid_t pid_ = -1;
    Fd input_, output_;
    std::string pending_;
};

/// An application that plays what it is told (tests/sound/tone_player).
class TonePlayer final {
public:
    /// `server` as in $PULSE_SERVER; `options` may be {"--child"}, {"--claim", "PID"} or {"--later"}: it connects only
    /// when it is told to.
    explicit TonePlayer(const std::string& server, const std::vector<std::string>& options = {});

    bool isReady() const { return number(playing_) > 0; }
    /// The process that was started, and the one that plays: its child with --child.
    ProcessID pid() const { return ProcessID{process_.pid()}; }
    ProcessID playing() const { return playing_; }
    /// Whether the command was done.
    bool tell(const std::string& command);
    /// Host time, in nanoseconds, at which a beep of this stream is heard by the player's account; 0 when not told.
    std::int64_t beep(const std::string& name);
    void kill() { process_.kill(); }

private:
    SoundProcess process_;
    ProcessID playing_{0};
};

}  // namespace lumacast::test
