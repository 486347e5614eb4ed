#pragma once
// What the contract suite of the extensions needs of a world.

#include <atomic>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/AppExtension.h"
#include "platform/IpcListener.h"
#include "platform/Scheduler.h"

namespace lumacast {

/// One extension as it is installed. Its program does what the first item of each request says, an item with the title
/// "command": "echo" completes with the other items, "hold" keeps the request open, "release" completes those that are
/// held, "leave" ends the process, "cancel" gives the request up, "twice" completes it twice (with "first", then
/// "second"), "many" completes with as many items as the next item says.
struct ExtensionToInstall {
    std::string identifier;
    std::string point = "org.example.point";
    std::optional<Value> activationRule = {};
    std::string processMode = {};
    std::string name = "An Extension";
    std::string germanName = {};
    std::vector<Data> icons = {};
    bool canBeLaunched = true;
};

class ExtensionsWorld {
public:
    virtual ~ExtensionsWorld() = default;
    virtual AppExtensions& extensions() = 0;
    virtual Scheduler& scheduler() = 0;
    virtual void install(const ExtensionToInstall& extension) = 0;
    virtual void uninstall(const std::string& identifier) = 0;
    /// From now on lookups fail.
    virtual void breakLookups() = 0;
    /// A file where tokens may be issued for; its path.
    virtual std::string makeFile(const std::string& name, const std::string& text) = 0;
    virtual std::string directory() = 0;
    /// A listener in the daemon's process, and what waits on it: whether the extension has said "ping".
    virtual std::shared_ptr<IpcEndpoint> listenForPing() = 0;
    virtual bool wasPinged() = 0;
    /// Whether this is the lane on which connections deliver.
    virtual bool isOnRequestLane() = 0;
    /// How many processes of extensions there are.
    virtual std::size_t processCount() = 0;
};

using ExtensionsWorldMaker = std::unique_ptr<ExtensionsWorld> (*)();

std::unique_ptr<ExtensionsWorld> fakeExtensionsWorld();
std::unique_ptr<ExtensionsWorld> portExtensionsWorld();

/// Takes the ping.
class PingListener final : public IpcListenerDelegate,
                           public IpcExportedObject,
                           public std::enable_shared_from_this<PingListener> {
public:
    bool listenerShouldAcceptNewConnection(IpcListener&, const std::shared_ptr<IpcConnection>& connection) override {
        connection->setExportedInterface(broadcastDaemonProtocol());
        connection->setExportedObject(weak_from_this());
        connection->setRemoteInterface(broadcastExtensionProtocol());
        connection->resume();
        return true;
    }
    void receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t, Array, IpcReply) override { was = true; }
    std::atomic<bool> was{false};
};

}  // namespace lumacast
