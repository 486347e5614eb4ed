#pragma once
#include <functional>

#include "base/Value.h"

namespace lumacast {

/// The daemon's end of the link to a broadcast upload extension, one per broadcast, owned by the session. Called on the
/// request lane; nothing here waits for the extension.
class LCBroadcastExtensionProxy {
public:
    virtual ~LCBroadcastExtensionProxy() = default;

    /// `processPayload:completion:` — sends one payload. The completion is called on the request lane when the
    /// extension has processed it; deliberately never when it can't be reached.
    virtual void processPayload(Dictionary payload, std::function<void()> completion) = 0;
    /// `invalidateConnection` — tears the link down and ends the extension's process; nothing is reported.
    virtual void invalidateConnection() = 0;
};

}  // namespace lumacast
