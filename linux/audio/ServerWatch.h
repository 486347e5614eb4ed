#pragma once
// Tells when a sound server may have come, so that nobody has to look again and again.

#include <string>

#include "linux/ipc/Fd.h"

namespace lumacast::sound {

/// Watches the place where the user's sound server makes its socket, or where the folder of it will be made. Only a
/// server on this machine at a place that is known without the library is watched; for any other there is nothing to
/// wait for. Belongs to one thread at a time; touches the file system, and never waits for a server.
///
/// Destroying it may take seconds: on a busy machine the kernel makes whoever closes an inotify descriptor wait for work
/// that all processes share. Keep it, and let it rest.
class ServerWatch final {
public:
    /// `server` as in $PULSE_SERVER, which counts where it is empty, and the user's runtime folder where that is, too.
    explicit ServerWatch(const std::string& server);

    /// Readable when something has come to the place. Below zero where nothing can be watched.
    int descriptor() const { return events_.get(); }
    /// Takes what has come, and watches on; whether it was of interest.
    bool take();
    /// Watches nothing until it resumes. Waits for nobody.
    void rest();
    /// After a rest: watches again; what came meanwhile is not told.
    void resume();
    /// Whether the socket is not there now, and the descriptor will tell when it is.
    bool waitsForServer() const;

private:
    void arm();
    /// Reads all that was told; whether any of it is of interest.
    bool readEvents();

    std::string socket_;  ///< where it is; empty: nowhere that is known
    Fd events_;
    int watched_ = -1;
    std::string wanted_;  ///< the name that is waited for in what is watched
};

}  // namespace lumacast::sound
