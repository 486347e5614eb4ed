#pragma once
#include <atomic>
#include <functional>
#include <memory>
#include <mutex>
#include <string>

#include "base/Log.h"
#include "linux/extensions/LaunchLane.h"
#include "linux/extensions/OutputLines.h"
#include "linux/extensions/Sandbox.h"
#include "linux/ipc/Fd.h"
#include "linux/ipc/Peer.h"
#include "linux/ipc/Reactor.h"

namespace lumacast {

/// One launched process of an extension, with all that its sandbox holds. Watched on the reactor; keeps itself until it
/// has ended and was waited for.
class ExtensionProcess final : public std::enable_shared_from_this<ExtensionProcess> {
public:
    /// One of the two sockets, and the process that says hello on it: as the kernel tells when it does.
    struct Greeting {
        Fd socket;
        Peer peer;
    };
    /// Called on the reactor.
    struct Events {
        /// Once, when it has said something on both sockets.
        std::function<void(Greeting requests, Greeting auxiliary)> greeted;
        /// Once, at its end, however it came: also when it could not be started. `error` is the system's number.
        std::function<void(const std::string& how, int error)> ended;
    };

    ExtensionProcess(Reactor& reactor, Log& log, std::string name, Events events);
    ExtensionProcess(const ExtensionProcess&) = delete;
    ExtensionProcess& operator=(const ExtensionProcess&) = delete;
    ~ExtensionProcess();

    /// Starts it. On the reactor, once.
    void start(LaunchLane& lane, const ConfinedCommand& command);

    /// Sends the signal to the extension's own process; SIGKILL goes to the whole sandbox. By descriptors, or to the
    /// group of a process that was not waited for, so that nobody else can have its number. Before the start is through
    /// SIGKILL is kept for it, others are dropped. Callable from any lane.
    void signal(int signal);

    /// Ends it and waits for that, at most two seconds. For the end of this process's work with extensions; no event
    /// comes after it. Not on the reactor while that runs.
    void endNow();
    /// Lets go of everything, itself too, without an event. On the reactor.
    void forget();

private:
    void took(Started started);
    void watchAll();
    void lookForHello(Greeting& greeting, std::unique_ptr<Reactor::Watch>& watch);
    Reactor::Again readOutput();
    void end();
    void killAll();

    Reactor& reactor_;
    Log& log_;
    const std::string name_;
    Events events_;
    OutputLines lines_;

    std::mutex mutex_;
    pid_t group_ = 0;  ///< of what was started, until it was waited for
    Fd process_;       ///< what was started: with bubblewrap what watches over the sandbox
    Fd program_;       ///< the process that said hello
    bool isKilled_ = false;
    bool isOver_ = false;

    // The reactor's own.
    std::shared_ptr<ExtensionProcess> self_;
    Greeting requests_, auxiliary_;
    Fd output_;
    std::unique_ptr<Reactor::Watch> endWatch_, requestsWatch_, auxiliaryWatch_, outputWatch_;
    std::unique_ptr<Timer> outputPause_;
    std::size_t outputBytes_ = 0;
};

}  // namespace lumacast
