#pragma once
#include <memory>
#include <optional>

#include "base/Value.h"

namespace lumacast {

class LCBroadcastExtensionProxy;
class LCRecordingSession;

/// Told by a session what happens to it, on whatever lane that happens; must not block it.
class LCRecordingSessionDelegate {
public:
    virtual ~LCRecordingSessionDelegate() = default;
    /// `recordingSession:stoppedWithError:` — the session stopped by itself, or was told to stop with notification.
    virtual void recordingSessionStoppedWithError(const std::shared_ptr<LCRecordingSession>& session,
                                                  const std::optional<Error>& error) = 0;
    /// The extension at the other end of this link has failed, has finished its broadcast, or can't be reached any more:
    /// whatever it has not taken note of it never will. Told after the stop that comes of it, if any does.
    virtual void broadcastExtensionFailed(const std::shared_ptr<LCRecordingSession>& session,
                                          const std::shared_ptr<LCBroadcastExtensionProxy>& link, const Error& error) = 0;
    /// `broadcastSession:didUpdateServiceInfo:` — whatever the extension sent, passed on as it is.
    virtual void broadcastSessionDidUpdateServiceInfo(const std::shared_ptr<LCRecordingSession>& session,
                                                      const Value& info) = 0;
    /// `broadcastSession:didUpdateDuration:` — sent for every captured sample, from its lane.
    virtual void broadcastSessionDidUpdateDuration(LCRecordingSession& session, double seconds) = 0;
};

}  // namespace lumacast
