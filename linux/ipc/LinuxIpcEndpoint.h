#pragma once
#include <memory>
#include <utility>

#include "linux/ipc/Fd.h"
#include "platform/IpcEndpoint.h"

namespace lumacast {

/// An endpoint is a descriptor: the ringing end of a listener's doorbell (a SOCK_SEQPACKET pair). Whoever holds it, or
/// a copy that travelled through a message, connects by making a stream pair and sending one end through it. There is
/// no name to guess and none to clean up; it works from any sandbox, and dies with the listener.
class LinuxIpcEndpoint final : public IpcEndpoint {
public:
    explicit LinuxIpcEndpoint(Fd doorbell) : doorbell_(std::move(doorbell)) {}

    /// Takes a descriptor from another process. Null when it is not what a doorbell is made of.
    static std::shared_ptr<LinuxIpcEndpoint> make(Fd doorbell);

    /// Stays the endpoint's.
    int descriptor() const { return doorbell_.get(); }

private:
    const Fd doorbell_;
};

}  // namespace lumacast
