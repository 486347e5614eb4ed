#pragma once
#include <sys/types.h>

#include <chrono>
#include <cstddef>
#include <list>
#include <memory>
#include <optional>

#include "base/Identifiers.h"

namespace lumacast {

class LinuxIpcConnection;

/// Accepted connections that have not said hello, oldest first; not their owner. The reactor's own.
class WaitingRoom {
public:
    void enter(const std::shared_ptr<LinuxIpcConnection>& connection, uid_t user, ProcessID process);
    /// It has said hello, or is gone. Nothing when it was not in here.
    void leave(const LinuxIpcConnection* connection);
    bool holds(const LinuxIpcConnection* connection) const;
    std::size_t countOf(uid_t user) const;
    /// Who is to go when a user has too many in here: the oldest of the process that has the most, so that a process
    /// with a single connection stays whatever another one does. Null when the user has none.
    std::shared_ptr<LinuxIpcConnection> firstToGo(uid_t user) const;

private:
    struct Guest {
        const LinuxIpcConnection* key;
        std::weak_ptr<LinuxIpcConnection> connection;
        uid_t user;
        ProcessID process;
    };
    std::list<Guest> guests_;
};

/// Tells the first of a run of equal events from those that follow it closely, for one log line a run.
class BurstGate {
public:
    /// Whether nothing came for `quiet` before `now`.
    bool begins(std::chrono::steady_clock::time_point now, std::chrono::nanoseconds quiet) {
        const bool first = !last_ || now - *last_ >= quiet;
        last_ = now;
        return first;
    }

private:
    std::optional<std::chrono::steady_clock::time_point> last_;
};

}  // namespace lumacast
