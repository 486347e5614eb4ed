#pragma once
#include <memory>
#include <mutex>
#include <optional>
#include <unordered_map>
#include <vector>

#include "linux/ipc/IpcCore.h"
#include "linux/ipc/LinuxIpcConnection.h"
#include "linux/ipc/ServiceSocket.h"
#include "platform/IpcListener.h"

namespace lumacast {

/// Accepts on a service's socket, if it has one, and on the doorbells of its endpoints.
class LinuxIpcListener final : public IpcListener, public std::enable_shared_from_this<LinuxIpcListener> {
public:
    /// `service` without a descriptor: an anonymous listener, or one whose service is not available.
    LinuxIpcListener(std::shared_ptr<IpcCore> core, ServiceSocket service);
    LinuxIpcListener(const LinuxIpcListener&) = delete;
    LinuxIpcListener& operator=(const LinuxIpcListener&) = delete;
    ~LinuxIpcListener() override;

    void setDelegate(std::weak_ptr<IpcListenerDelegate> delegate) override;
    void resume() override;
    std::shared_ptr<IpcEndpoint> endpoint() override;
    void invalidate() override;

private:
    /// The hearing end of an endpoint. Each endpoint has its own, so a holder who misuses it spoils nobody else's.
    struct Doorbell {
        Fd socket;
        std::unique_ptr<Reactor::Watch> watch;
    };

    Reactor::Again acceptFromService();
    Reactor::Again acceptFromDoorbell(int descriptor);
    void refuseForLackOfDescriptors();
    void admit(Fd socket);
    void sayUserIsFull(ProcessID process, uid_t user);
    void makeRoomForTheSilent(uid_t user);
    void ask(const std::shared_ptr<LinuxIpcConnection>& connection);
    void watchDoorbellLocked(Doorbell& doorbell);

    const std::shared_ptr<IpcCore> core_;
    std::optional<ServiceSocket> service_;  ///< the reactor's own once the listener is resumed; none when it is invalid

    std::mutex mutex_;
    std::weak_ptr<IpcListenerDelegate> delegate_;
    bool isResumed_ = false, isInvalid_ = false;
    std::unique_ptr<Reactor::Watch> watch_;
    std::unordered_map<int, Doorbell> doorbells_;
};

/// A connected stream socket to an endpoint's listener, and who that is. Without a socket when the listener is gone.
struct EndpointCall {
    Fd socket;
    Peer peer;
};
EndpointCall ringEndpoint(const IpcEndpoint& endpoint);

}  // namespace lumacast
