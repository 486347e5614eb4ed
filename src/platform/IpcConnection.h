#pragma once
// One connection between two processes.

#include <functional>
#include <memory>
#include <optional>
#include <string_view>

#include "base/Identifiers.h"
#include "base/MessageTables.h"
#include "base/Value.h"

namespace lumacast {

class IpcConnection;

/// Sends a message's reply. Callable once, from any lane; later calls and calls after the connection has gone do
/// nothing. Releasing the last copy of it without a call, on whatever lane, leaves the peer without an answer (see
/// IpcRemoteProxy::send): the request is in flight no more, at either end. A release never blocks and calls nobody's
/// handlers; after the connection has gone it does nothing. It sends, though: where a call would not do, under a lock
/// of one's own say, a release does not either.
using IpcReply = std::function<void(Array values)>;

/// An object that receives the messages of an interface.
class IpcExportedObject {
public:
    virtual ~IpcExportedObject() = default;
    /// One message of the exported interface, on the main queue, in the order of arrival; `arguments` match the
    /// declaration. `reply` is empty for a message that has none.
    virtual void receiveMessage(const std::shared_ptr<IpcConnection>& connection, std::uint16_t message,
                                Array arguments, IpcReply reply) = 0;
};

/// Sends messages of the remote interface. Made anew for each message; holds the connection.
class IpcRemoteProxy {
public:
    virtual ~IpcRemoteProxy() = default;
    /// Sends; never blocks on the receiver. When the message can't be delivered (connection gone or invalid, peer too
    /// slow, message over a limit) the proxy's error handler is called later, on the main queue, and `reply` is not.
    /// `reply` is called on the main queue.
    ///
    /// A request whose reply the receiver has released is in flight no more, but neither `reply` nor the error handler
    /// is called then: the asker is left waiting, and the error handler is called once when the connection is lost.
    /// Limit::RequestsWithoutReply of these error handlers are kept for a connection; one more, and the oldest of them
    /// is called, later, with ENODATA. So each request still ends in exactly one call of one of the two.
    virtual void send(std::uint16_t message, Array arguments, std::function<void(Array values)> reply = {}) = 0;
};

/// A connection: configured, then resumed; delivers everything on the main queue, never inline from one of its
/// operations. It reports its loss once: the interruption handler when the peer's end broke while the connection could
/// be restored (this transport never does), otherwise the invalidation handler. Handlers are read when the loss is
/// delivered (one that was replaced before is not called), copied before the call, and called at most once. The
/// exported object is held weakly. All operations are callable from any lane and from the connection's own handlers.
///
/// Ownership: the listener role owns an accepted connection until it is invalid and its handlers have run, or it was
/// invalidated by its user; others hold it weakly.
class IpcConnection {
public:
    using Handler = std::function<void()>;
    using ErrorHandler = std::function<void(const Error&)>;

    virtual ~IpcConnection() = default;

    virtual void setExportedInterface(const Protocol& interface) = 0;
    virtual void setExportedObject(std::weak_ptr<IpcExportedObject> object) = 0;
    virtual void setRemoteInterface(const Protocol& interface) = 0;
    virtual void setInterruptionHandler(Handler handler) = 0;
    virtual void setInvalidationHandler(Handler handler) = 0;

    /// Lets messages flow. What arrived before is delivered from now on.
    virtual void resume() = 0;
    /// Closes the connection for good; the handlers that are set then are called later, once.
    virtual void invalidate() = 0;

    /// The process at the other end, as the kernel says; 0 when it can't be told. Fixed at the connection's birth.
    virtual ProcessID processIdentifier() const = 0;
    /// The user whose process it is, as the kernel says; kNoUser when it can't be told. Fixed likewise.
    virtual UserID userIdentifier() const = 0;
    /// The value that the administrator granted the peer under this name, or none.
    virtual std::optional<Value> valueForEntitlement(std::string_view name) = 0;

    /// A proxy for the next message.
    virtual std::unique_ptr<IpcRemoteProxy> remoteProxy(ErrorHandler errorHandler) = 0;
};

}  // namespace lumacast
