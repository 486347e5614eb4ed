#pragma once
#include <sys/types.h>

#include <optional>
#include <string>

#include "linux/ipc/Fd.h"

namespace lumacast {

/// A listening stream socket at `path`, for this user alone, non-blocking. A socket that nobody listens at any more is
/// replaced; one that somebody does, and anything that is not a socket, is left alone: then, and on any failure, empty.
Fd listenAt(const std::string& path);
/// The same; an empty answer says why in `reason`.
Fd listenAt(const std::string& path, std::string& reason);

/// A connection to the socket at `path`, non-blocking; empty, with errno, when nobody listens there
/// (EAGAIN: somebody does, but too many wait already).
Fd connectTo(const std::string& path);

/// The user at the other end, by the kernel's word; none when the system does not say.
std::optional<uid_t> peerUser(int socket);

}  // namespace lumacast
