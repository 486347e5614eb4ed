#pragma once
#include <map>
#include <string>

#include "base/Log.h"
#include "linux/ipc/Fd.h"

namespace lumacast {

/// Listening sockets that whoever started this process opened for it (socket activation: LISTEN_PID, LISTEN_FDS and
/// LISTEN_FDNAMES, descriptors from 3 on).
class ActivatedSockets {
public:
    ActivatedSockets() = default;

    /// Takes the descriptors that are meant for this process, and the variables out of the environment. Once, before
    /// there are other threads.
    static ActivatedSockets fromEnvironment();

    /// Adds a listening socket under a name.
    void add(std::string name, Fd socket) { sockets_.emplace(std::move(name), std::move(socket)); }

    /// The socket for a service: one named for it, or bound to its path's last part, or the only one there is. None
    /// otherwise. It is the caller's from then on.
    Fd take(const std::string& service);

private:
    std::multimap<std::string, Fd> sockets_;
};

/// The listening socket of a named service in the runtime directory, `<name>.sock`; the name is free again when it
/// goes.
///
/// Beside it lies `<name>.lock`, locked as long as the service lives, so that a socket left behind by a dead process is
/// told from a live one without a race.
class ServiceSocket {
public:
    ServiceSocket() = default;
    ServiceSocket(ServiceSocket&&) = default;
    ServiceSocket& operator=(ServiceSocket&&) = delete;
    ~ServiceSocket();

    /// Binds and listens. On failure logs one line and answers an object without a descriptor.
    static ServiceSocket open(const std::string& runtimeDirectory, const std::string& service,
                              ActivatedSockets& activated, Log& log);

    int descriptor() const { return socket_.get(); }

private:
    /// Answers null, or why it can't be had.
    const char* bindIn(const std::string& runtimeDirectory, const std::string& service);

    Fd lock_;
    Fd socket_;
    std::string path_;  ///< removed at the end; empty when it isn't ours
};

/// One attempt to reach a named service.
struct ServiceCall {
    Fd socket;            ///< connected; none when that was not possible
    bool isBusy = false;  ///< there is none because so many wait to be accepted: somebody listens, try again later
};

/// Connects a stream socket to a named service. Never blocks.
ServiceCall callServiceSocket(const std::string& runtimeDirectory, const std::string& service);

/// The same without the reason: none when nobody listens, or nobody can be told at once.
Fd connectToServiceSocket(const std::string& runtimeDirectory, const std::string& service);

}  // namespace lumacast
