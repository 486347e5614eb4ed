#pragma once
#include <memory>
#include <string>
#include <variant>

#include "platform/IpcConnection.h"
#include "platform/IpcEndpoint.h"

namespace lumacast {

class IpcListener;

class IpcListenerDelegate {
public:
    virtual ~IpcListenerDelegate() = default;
    /// Decides on a new connection, on the main queue. True: the delegate has configured and resumed it. False: it is
    /// closed, and its peer sees it end.
    virtual bool listenerShouldAcceptNewConnection(IpcListener& listener,
                                                   const std::shared_ptr<IpcConnection>& connection) = 0;
};

/// Accepts connections on a name or, for an anonymous listener, through endpoints. Nothing is accepted before resume.
/// Destroying it closes the name; connections it accepted live on. The delegate is held weakly.
class IpcListener {
public:
    virtual ~IpcListener() = default;
    virtual void setDelegate(std::weak_ptr<IpcListenerDelegate> delegate) = 0;
    virtual void resume() = 0;
    /// A new endpoint that names this listener. An endpoint stays good as long as the listener lives.
    virtual std::shared_ptr<IpcEndpoint> endpoint() = 0;
    /// Accepts nobody any more; its endpoints name nothing from now on. Connections it accepted live on.
    virtual void invalidate() = 0;
};

/// Makes listeners and connects to them. Callable from any lane.
class Ipc {
public:
    virtual ~Ipc() = default;
    /// A listener on the named service; an error (resume will then accept nobody) is answered by a listener that logs
    /// it.
    virtual std::shared_ptr<IpcListener> listenerForService(const std::string& name) = 0;
    virtual std::shared_ptr<IpcListener> anonymousListener() = 0;
    /// A connection to a named service, or to an endpoint's listener. Never null: one that can't be made is lost as
    /// soon as it is resumed.
    virtual std::shared_ptr<IpcConnection> connectToService(const std::string& name) = 0;
    virtual std::shared_ptr<IpcConnection> connectToEndpoint(const std::shared_ptr<IpcEndpoint>& endpoint) = 0;
};

}  // namespace lumacast
