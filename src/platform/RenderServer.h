#pragma once
#include <memory>
#include <optional>

#include "base/Identifiers.h"

namespace lumacast {

/// The display server's connection of one client; released with the object.
class ClientPort {
public:
    virtual ~ClientPort() = default;
    /// The process behind the connection, as the kernel says; none when there is none (any more).
    virtual std::optional<ProcessID> processIdentifier() = 0;
};

/// The owner look-up of window layers. Each question is answered within 100 ms or as "none"; callable from the request
/// lane.
class RenderServer {
public:
    virtual ~RenderServer() = default;
    /// The client that owns this window layer; null when there is no such layer (0 and the whole screen are none).
    virtual std::unique_ptr<ClientPort> clientPort(ContextID context) = 0;
};

}  // namespace lumacast
