#pragma once
#include <chrono>
#include <functional>
#include <memory>
#include <mutex>
#include <string>

#include "base/Log.h"
#include "linux/ipc/Fd.h"
#include "linux/ipc/IpcCore.h"
#include "linux/ipc/Peer.h"
#include "linux/ipc/Reactor.h"
#include "linux/ipc/ServiceSocket.h"
#include "platform/IpcListener.h"

namespace lumacast {

struct LinuxIpcOptions {
    /// Where the services' sockets are. Made (0700) by the first listener when it is missing.
    std::string runtimeDirectory;
    /// For connections' valueForEntitlement. Empty: nobody is granted anything.
    EntitlementLookup entitlements = {};
    ActivatedSockets activated = {};
    /// How long an accepted connection may keep its hello to itself.
    std::chrono::nanoseconds helloDeadline = std::chrono::seconds(10);
    /// Called when a named service can't be served (after the line that says why), on the lane that asked for it. For a
    /// process that has no other reason to be. Empty: its listener just accepts nobody.
    std::function<void()> serviceUnavailable = {};
};

/// The transport: Unix sockets served by one reactor, which is the lane of everything that is delivered. Operations are
/// callable from any lane. The reactor and the log are borrowed and outlive all connections.
class LinuxIpc final : public Ipc {
public:
    LinuxIpc(Reactor& reactor, Log& log, LinuxIpcOptions options);
    LinuxIpc(const LinuxIpc&) = delete;
    LinuxIpc& operator=(const LinuxIpc&) = delete;
    /// Closes the accepted connections; their handlers are not called.
    ~LinuxIpc() override;

    std::shared_ptr<IpcListener> listenerForService(const std::string& name) override;
    std::shared_ptr<IpcListener> anonymousListener() override;
    std::shared_ptr<IpcConnection> connectToService(const std::string& name) override;
    std::shared_ptr<IpcConnection> connectToEndpoint(const std::shared_ptr<IpcEndpoint>& endpoint) override;

    /// A connection over a stream socket whose other end a process has or will have: launched with it, or inherited.
    /// `peer` is that process where the kernel would name another (the maker of the pair). Owned by the caller.
    std::shared_ptr<IpcConnection> adopt(Fd socket, Peer peer);

    /// What came of one attempt to reach a service.
    struct Attempt {
        std::shared_ptr<IpcConnection> connection;  ///< null when the service was not reached
        bool isBusy = false;  ///< it was not because so many wait to be accepted: try again later
        Peer peer;            ///< who listens there
    };
    /// connectToService for those who try again: answers at once whether the service was reached. Never blocks.
    Attempt tryService(const std::string& name);

    /// An endpoint's descriptor, for a child process to inherit; -1 when it has none. Stays the endpoint's.
    static int descriptorOf(const IpcEndpoint& endpoint);
    /// An endpoint from a descriptor that was inherited. Null when it is none.
    static std::shared_ptr<IpcEndpoint> endpointFrom(Fd descriptor);

private:
    std::shared_ptr<IpcConnection> connectionOver(Fd socket, Peer peer);

    const std::shared_ptr<IpcCore> core_;
    const std::string runtimeDirectory_;
    std::mutex mutex_;
    ActivatedSockets activated_;
};

}  // namespace lumacast
