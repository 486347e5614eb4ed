#pragma once
#include <cstdint>
#include <memory>
#include <optional>

#include "base/Identifiers.h"
#include "base/Value.h"

namespace lumacast {

class IpcConnection;
class SharedPlane;

/// What the daemon tells one client, as the recording session sees it. Every message is one-way, callable from any lane
/// and never blocks on the client; one that can't be delivered is only logged.
class LCClientProtocol {
public:
    virtual ~LCClientProtocol() = default;

    /// Whose client this is; none for the shared proxy of nobody.
    virtual std::optional<BundleIdentifier> bundleIdentifier() const = 0;
    /// The connection on which the client is reached; null when it has gone. Not owned: its listener owns it.
    virtual std::shared_ptr<IpcConnection> connection() const = 0;
    virtual void setConnection(const std::shared_ptr<IpcConnection>& connection) = 0;

    virtual void updateScreenRecordingState(bool on) = 0;
    virtual void stopRecordingWithError(const std::optional<Error>& error, const std::optional<URL>& movieURL) = 0;
    /// `info` is whatever the extension sent.
    virtual void updateBroadcastServiceInfo(const Value& info) = 0;
    virtual void updateBroadcastURL(const URL& url) = 0;
    /// `timingData` is the frame's SampleTiming record, 72 bytes.
    virtual void captureHandlerWithSample(const std::shared_ptr<SharedPlane>& plane, const Data& timingData) = 0;
    /// `absdData` is the buffer's AudioFormat record, 40 bytes; `bufferType` 2 application sound, 3 microphone.
    virtual void captureHandlerWithAudioSample(const Data& sample, const Data& absdData, std::int64_t itemCount,
                                               std::int64_t bufferType, const Data& timingData) = 0;
    virtual void recordingLockInterrupted(const Value& object) = 0;
    virtual void recordingTimerDidUpdate(const Value& object) = 0;
};

}  // namespace lumacast
