#pragma once
// What an upload extension links: the process that carries a live broadcast away from the device.

#include <functional>
#include <optional>

#include "base/Identifiers.h"
#include "base/URL.h"
#include "base/Value.h"
#include "client/extension/Clip.h"
#include "client/extension/Samples.h"
#include "client/extension/TokenExchange.h"

namespace lumacast::extension {

/// What the daemon can be told while samples flow. Callable from any thread; nothing blocks. Without a connection to
/// the daemon (before Handler::connected, after Handler::ended, and in clip mode at all times) nothing is sent.
class Broadcast {
public:
    virtual ~Broadcast() = default;
    /// Hands the broadcasting application a dictionary; what is in it is between the two.
    virtual void updateServiceInfo(Dictionary info) = 0;
    /// Tells the broadcasting application where the broadcast can be watched.
    virtual void updateBroadcastURL(URL url) = 0;
    /// Ends the broadcast: the recording stops, its application is told this error, and this process is killed.
    virtual void finishWithError(Error error) = 0;
    /// Whether the daemon has gone. The handler may still be busy with what came before.
    virtual bool hasEnded() const = 0;
};

/// What an extension is made of: the things that happen, in the order in which they do.
///
/// Threads: all of it is called on the thread that called run(), one call at a time. It may block (the library answers the
/// daemon on a thread of its own), but what follows waits: in sample mode the daemon leaves out frames meanwhile, and takes
/// an extension that has processed nothing for ten seconds for lost. A handler must not throw.
///
/// An extension takes clips or samples, as its manifest says, and overrides what belongs to that. What it doesn't override is
/// processed at once.
class Handler {
public:
    virtual ~Handler() = default;

    /// The first call. `broadcast` is valid until run() returns.
    virtual void connected(Broadcast& broadcast) { static_cast<void>(broadcast); }

    // Clip mode.

    /// A movie of a few seconds; see Clip. The daemon removes its file when the clip's answer is given.
    virtual void clip(Clip clip) { static_cast<void>(clip); }
    /// A clip whose movie can't be had: the daemon did not hand it over. `isLast` as in Clip.
    virtual void clipMissed(bool isLast) { static_cast<void>(isLast); }

    // Sample mode. A payload counts as processed when its completion is released; see Completion.

    /// The broadcast begins when this is processed. `userInfo` is what the application set it up with, if anything.
    virtual void started(std::optional<Dictionary> userInfo, Completion completion) {
        static_cast<void>(userInfo), static_cast<void>(completion);
    }
    /// The application has paused, and no frame comes until it goes on. In this version none ever does.
    virtual void paused(Completion completion) { static_cast<void>(completion); }
    /// It goes on. The time between is in no stamp.
    virtual void resumed(Completion completion) { static_cast<void>(completion); }
    /// Nothing follows. The daemon ends the process when this is processed.
    virtual void finished(Completion completion) { static_cast<void>(completion); }
    /// A picture, in the order of their times. Some are left out while three are not processed; see Completion.
    virtual void frame(Frame frame) { static_cast<void>(frame); }
    /// A stretch of sound, each source's in the order of their times, none left out. It may come later than a frame of
    /// its time: only the times put them together.
    virtual void sound(Sound sound) { static_cast<void>(sound); }
    /// Whose sound a broadcast of the whole display takes since its first change of the application in front: told once a
    /// broadcast, and not again when another one comes to the front.
    virtual void frontmostApplication(BundleIdentifier application) { static_cast<void>(application); }

    /// The last call: the daemon has gone, or has no use for this process any more. run() returns after it.
    virtual void ended() {}
};

/// Where run() finds the daemon. The defaults are right for a process that the daemon launches.
struct Options {
    int requestsDescriptor;   ///< a connected stream socket; run() owns it
    int auxiliaryDescriptor;  ///< likewise
    TokenExchange exchange = exchangeOverConnection;
    Options();
};

/// Serves the daemon that launched this process, until it has gone. Blocks. Once in a process's life.
///
/// Answers 0, or 64 when this process was not launched by the daemon, which it says on standard error; nothing of the handler
/// is called then. What the daemon says that makes no sense is refused, with a line on standard error. Ignores SIGPIPE for
/// the whole process. Throws std::system_error when no thread can be had.
int run(Handler& handler, Options options = {});

}  // namespace lumacast::extension
