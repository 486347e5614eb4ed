#pragma once
// The way samples come: the auxiliary connection brings an endpoint, and there the daemon listens.

#include <atomic>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>

#include "client/extension/Extension.h"
#include "client/extension/Payloads.h"
#include "client/extension/World.h"

namespace lumacast::extension {

/// Connects to the daemon when it is told to, takes its payloads and tells it what the extension reports. Everything on the
/// reactor, but Broadcast.
class DaemonLink final : public Broadcast, public std::enable_shared_from_this<DaemonLink> {
public:
    DaemonLink(std::shared_ptr<World> world, Handler& handler);

    /// Serves the auxiliary connection's socket. `gone` is called once when a daemon that was connected to has gone.
    void open(Fd auxiliary, std::function<void()> gone);
    void close();

    void updateServiceInfo(Dictionary info) override;
    void updateBroadcastURL(URL url) override;
    void finishWithError(Error error) override;
    bool hasEnded() const override { return world_->lane.isFinished(); }

private:
    /// What the two connections deliver to; each knows which one it is.
    class Vendor;
    class Extension;

    void connectTo(const std::shared_ptr<IpcEndpoint>& endpoint);
    void takePayload(const Dictionary& payload, IpcReply reply);
    void deliver(Payload payload, IpcReply reply);
    bool isRepeated(const Frame& frame);
    void send(BroadcastDaemonMessage message, Array arguments);

    const std::shared_ptr<World> world_;
    Handler& handler_;
    std::function<void()> gone_;
    std::shared_ptr<IpcConnection> auxiliary_;
    std::shared_ptr<Vendor> vendor_;
    std::shared_ptr<Extension> extension_;
    std::optional<MediaTime> lastFrame_;

    std::mutex mutex_;
    std::shared_ptr<IpcConnection> daemon_;  ///< null without one
};

}  // namespace lumacast::extension
