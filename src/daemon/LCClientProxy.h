#pragma once
#include "base/Guarded.h"
#include "base/MessageTables.h"
#include "platform/IpcConnection.h"
#include "session/LCClientProtocol.h"

namespace lumacast {

class Log;

/// The daemon's outbound half of one client connection: turns each call into a one-way message. Holds no recording
/// state and makes no decisions. Callable from any lane; a connection that has gone is like none.
class LCClientProxy final : public LCClientProtocol {
public:
    explicit LCClientProxy(Log& log) : log_(log) {}
    /// `initWithBundleIdentifier:connection:`
    LCClientProxy(Log& log, std::optional<BundleIdentifier> bundleIdentifier,
                  const std::shared_ptr<IpcConnection>& connection)
        : log_(log), bundleIdentifier_(std::move(bundleIdentifier)) {
        setConnection(connection);
    }

    std::optional<BundleIdentifier> bundleIdentifier() const override { return bundleIdentifier_; }
    std::shared_ptr<IpcConnection> connection() const override { return connection_.get().lock(); }
    void setConnection(const std::shared_ptr<IpcConnection>& connection) override { connection_.set(connection); }

    void updateScreenRecordingState(bool on) override;
    void stopRecordingWithError(const std::optional<Error>& error, const std::optional<URL>& movieURL) override;
    void updateBroadcastServiceInfo(const Value& info) override;
    void updateBroadcastURL(const URL& url) override;
    void captureHandlerWithSample(const std::shared_ptr<SharedPlane>& plane, const Data& timingData) override;
    void captureHandlerWithAudioSample(const Data& sample, const Data& absdData, std::int64_t itemCount,
                                       std::int64_t bufferType, const Data& timingData) override;
    void recordingLockInterrupted(const Value& object) override;
    void recordingTimerDidUpdate(const Value& object) override;

private:
    /// Asks the connection for a remote proxy, anew for every message, and sends. Without a connection nothing happens.
    void send(ClientMessage message, Array arguments, IpcConnection::ErrorHandler errorHandler);

    Log& log_;
    const std::optional<BundleIdentifier> bundleIdentifier_;
    Guarded<std::weak_ptr<IpcConnection>> connection_;
};

}  // namespace lumacast
