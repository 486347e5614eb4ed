#pragma once
#include <sys/types.h>

#include "base/Identifiers.h"
#include "linux/ipc/Fd.h"

namespace lumacast {

/// Who is at the other end of a connected Unix socket, as the kernel says: fixed when the two were connected, whatever
/// becomes of the process. The pidfd tells whether that process still lives, so that a number used again by another
/// process is not taken for it.
struct Peer {
    ProcessID pid{};  ///< 0 when it can't be told
    uid_t uid = static_cast<uid_t>(-1);
    Fd pidfd;

    /// For a socket made by socketpair the peer is whoever made the pair.
    static Peer of(int socket);

    /// Whether the process is known to be running. False when it can't be told.
    bool isAlive() const;
};

}  // namespace lumacast
