#pragma once
// A machine of the test's own: directories, a display, the daemon and applications, all real processes.

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <vector>

#include "tests/checkers/FrameNumberChecker.h"
#include "tests/checkers/FramesLog.h"
#include "tests/checkers/MovieReader.h"
#include "tests/checkers/tests/Child.h"
#include "tests/client/WaitUntil.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/system/DaemonUser.h"

namespace lumacast::test {

/// The innermost process that runs a program; 0 when there is none.
pid_t processRunning(const std::string& program);

/// Whether the long runs were asked for (LC_LONG_TESTS=1).
bool longTests();

class World;

/// One example application, driven by its standard input.
class Application {
public:
    Application(World& world, const std::string& program, const std::string& name,
                const std::vector<std::string>& options);

    /// Answers the line that answers `command`; "event ..." lines are put aside.
    std::string ask(const std::string& command);
    /// The two halves of that: several commands may be under way.
    void send(const std::string& command) { child_->send(command); }
    std::string answer();
    /// The number that stands behind "frame" in an answer; fails the test when there is none.
    std::uint32_t askForFrame(const std::string& command);
    /// Waits until a frame with at least this number is shown.
    bool waitForFrame(std::uint32_t number);
    /// The next event line, waiting for it; empty when none comes.
    std::string nextEvent();
    /// Whether this event came with the answers so far.
    bool wasTold(const std::string& event) const;
    /// Passes over the events that came with the answers so far.
    void forgetEvents() { events_.clear(); }
    /// Stops the recording; the movie's path, empty after a failure.
    std::string stop(const std::string& command = "stop");

    std::uint32_t window() const { return window_; }
    pid_t pid() const { return child_->pid(); }
    void kill();
    checkers::FramesLog framesLog() const;

private:
    std::string log_;
    std::unique_ptr<checkers::Child> child_;
    std::vector<std::string> events_;
    std::uint32_t window_ = 0;
};

class World {
public:
    enum class Consent { Suppressed, Asked };

    /// `screen` is the display's size, as "1280x800x24".
    explicit World(Consent consent = Consent::Suppressed, const std::string& screen = "1280x800x24");
    World(const World&) = delete;
    World& operator=(const World&) = delete;

    /// One more variable for every process that is started from now on, "NAME=value".
    void addVariable(const std::string& variable) { user_.addVariable(variable); }
    /// Starts the daemon and waits for its sockets. `variables` are its alone.
    void startDaemon(const std::vector<std::string>& variables = {}) { startDaemonBy({LC_DAEMON}, variables); }
    /// The same by another command, which becomes the daemon.
    void startDaemonBy(const std::vector<std::string>& command, const std::vector<std::string>& variables = {}) {
        user_.startDaemon(command, variables);
    }
    checkers::Child& daemon() { return user_.daemon(); }
    /// Ends it with a signal and waits; its exit status, -1 when the signal ended it.
    int endDaemon(int signal);

    std::unique_ptr<Application> application(std::vector<std::string> options);
    /// Another application: the same program under another name and identifier ("org.lumacast.<name>").
    std::unique_ptr<Application> otherApplication(const std::string& name, std::vector<std::string> options);

    /// What `status` of the administrator's socket answers.
    nlohmann::json status() const { return user_.status(); }
    /// The one session's running recording; null when there is none.
    nlohmann::json recording();
    /// Waits until the running recording is at least so old.
    bool waitForElapsed(double seconds);
    std::size_t daemonDescriptors();
    /// A number of /proc/<pid>/status, such as "Threads" or "VmRSS" (kB).
    std::size_t daemonNumber(const std::string& name);
    /// The movie that the recordings of an application are written to.
    std::string moviePath(const std::string& name = "Self Recorder") const;
    std::string daemonLog() const { return user_.daemonLog(); }

    std::string path(const std::string& name) const { return user_.path(name); }
    const std::vector<std::string>& environment() const { return user_.environment(); }
    /// The variables that make a daemon's disk one that can stop answering or be full (tests/system/slow_disk).
    std::vector<std::string> troubledDisk() const;
    void setDiskStalled(bool stalled) const { setFlag("disk stalled", stalled); }
    /// Writes fail; the disk says that it is full, or, for a quota, that there is room.
    void setDiskFull(bool full) const { setFlag("disk full", full); }
    void setDiskQuotaUsedUp(bool used) const { setFlag("disk quota", used); }
    const PrivateDisplay& display() const { return display_; }
    /// Installs a program as an application.
    void install(const std::string& identifier, const std::string& name, const std::string& executable) {
        user_.install(identifier, name, executable);
    }
    /// Whom the shortest extension is installed as, where it takes clips.
    static constexpr char kKeeper[] = "org.lumacast.ClipKeeper";
    /// Installs a program as an upload extension that takes clips, or samples. Answers the folder where it may write.
    std::string installExtension(const std::string& identifier, const std::string& program, bool takesSamples);
    /// Installs an upload extension as it is built, a folder with its manifest. Answers where its program is then.
    std::string installExtensionFolder(const std::string& folder);
    /// The innermost process of a running extension; 0 when there is none.
    pid_t extensionProcess(const std::string& identifier) const;

private:
    void setFlag(const std::string& name, bool on) const;

    PrivateDisplay display_;
    DaemonUser user_;
    int applications_ = 0;
};

/// The pictures of a movie with their numbers; fails the test when the movie can't be decoded, unless `mayEndEarly`.
std::vector<checkers::NumberedPicture> picturesOf(const std::string& movie, bool mayEndEarly = false);

}  // namespace lumacast::test
