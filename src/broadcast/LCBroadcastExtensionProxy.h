#pragma once
#include <chrono>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>

#include "base/Guarded.h"
#include "base/Value.h"
#include "platform/AppExtension.h"
#include "platform/Platform.h"
#include "support/RecordingErrors.h"

namespace lumacast {

/// The daemon's end of the link to a broadcast upload extension, one per broadcast, owned by the session; destroying it
/// closes the link quietly. Its connection holds it weakly.
///
/// Lanes: operations from any lane; handlers and messages on the request lane. Nothing here waits for the extension but
/// the handshake, on the extension's own lane.
class LCBroadcastExtensionProxy : public IpcExportedObject,
                                  public IpcListenerDelegate,
                                  public std::enable_shared_from_this<LCBroadcastExtensionProxy> {
public:
    /// Told none when the link is ready, deliberately at every ping, or the error that keeps it from getting so.
    using ReadyHandler = std::function<void(std::optional<Error>)>;

    /// `initWithBroadcastUploadExtension:` — with a listener of its own, which the extension is to connect to. `errors`
    /// and the platform are borrowed.
    static std::shared_ptr<LCBroadcastExtensionProxy> initWithBroadcastUploadExtension(
        const Platform& platform, const RecordingErrors& errors, std::shared_ptr<AppExtension> extension);
    /// `initWithBroadcastUploadListenerEndpoint:` — connects to an extension that listens already: no request is made,
    /// no ping awaited.
    static std::shared_ptr<LCBroadcastExtensionProxy> initWithBroadcastUploadListenerEndpoint(
        const Platform& platform, const RecordingErrors& errors, const std::shared_ptr<IpcEndpoint>& endpoint);
    LCBroadcastExtensionProxy(const LCBroadcastExtensionProxy&) = delete;
    LCBroadcastExtensionProxy& operator=(const LCBroadcastExtensionProxy&) = delete;
    ~LCBroadcastExtensionProxy() override;

    std::shared_ptr<AppExtension> broadcastUploadExtension() const { return extension_.get(); }
    std::shared_ptr<IpcListener> listener() const { return listener_.get(); }
    /// Stays when the link is torn down.
    std::shared_ptr<IpcEndpoint> listenerEndpoint() const { return listenerEndpoint_.get(); }
    std::shared_ptr<IpcConnection> connection() const { return connection_.get(); }
    ReadyHandler connectionReadyHandler() const { return connectionReadyHandler_.get(); }

    // What the extension reports. To be set before the link is made; called on the request lane.
    void setServiceInfoHandler(std::function<void(const Value&)> handler) { serviceInfoHandler_.set(std::move(handler)); }
    void setBroadcastURLHandler(std::function<void(const URL&)> handler) { broadcastURLHandler_.set(std::move(handler)); }
    /// The extension's own failure as it says it, or that it can't be reached any more.
    void setErrorHandler(std::function<void(const Error&)> handler) { errorHandler_.set(std::move(handler)); }

    /// `establishConnectionWithHandler:` — launches the extension and hands it the listener's endpoint. The handler is
    /// called on the extension's lane with an error, or with none where there is nobody to hand the endpoint to; on the
    /// request lane at each ping. There is no time limit.
    void establishConnectionWithHandler(ReadyHandler handler);

    bool listenerShouldAcceptNewConnection(IpcListener& listener,
                                           const std::shared_ptr<IpcConnection>& connection) override;
    void receiveMessage(const std::shared_ptr<IpcConnection>& connection, std::uint16_t message, Array arguments,
                        IpcReply reply) override;

    /// `processPayload:completion:` — sends one payload. The completion is called on the request lane when the extension
    /// has processed it; deliberately never when it can't be reached, which the error handler is told. While it has as
    /// many frames as one may have, further ones are left out, and their completions released.
    virtual void processPayload(Dictionary payload, std::function<void()> completion);
    /// `invalidateConnection` — tears the link down and kills the extension; nothing is reported.
    virtual void invalidateConnection();

    /// Frames that were left out so far because the extension had too many.
    std::uint64_t framesLeftOut() const;

protected:
    LCBroadcastExtensionProxy(const Platform& platform, const RecordingErrors& errors);

private:
    /// What the extension has been given and not processed yet. Shared with the completions.
    struct Pending {
        std::mutex mutex;
        std::uint64_t payloads = 0, frames = 0, framesLeftOut = 0;
        std::chrono::nanoseconds lastProgress{};  ///< host time
    };
    class PendingPayload;

    /// Hands the endpoint over. On the extension's lane, which then waits for what is answered: without a limit, but for
    /// the end of the auxiliary connection. Null when there is nothing to wait for.
    std::shared_ptr<Semaphore> setEndpoint(ExtensionRequestID request, const ReadyHandler& handler);
    void accept(const std::shared_ptr<IpcConnection>& connection);
    void reportUnreachable();
    void tearDown();
    void startPatienceTimer();
    void checkPatience();

    const Platform platform_;
    const RecordingErrors& errors_;
    Log& log_;
    Guarded<std::shared_ptr<AppExtension>> extension_;
    Guarded<std::shared_ptr<IpcListener>> listener_;
    Guarded<std::shared_ptr<IpcEndpoint>> listenerEndpoint_;
    Guarded<std::shared_ptr<IpcConnection>> connection_;
    Guarded<ReadyHandler> connectionReadyHandler_;
    Guarded<std::function<void(const Value&)>> serviceInfoHandler_;
    Guarded<std::function<void(const URL&)>> broadcastURLHandler_;
    Guarded<std::function<void(const Error&)>> errorHandler_;
    const std::shared_ptr<Pending> pending_ = std::make_shared<Pending>();
    Guarded<std::shared_ptr<Timer>> patienceTimer_;
};

}  // namespace lumacast
