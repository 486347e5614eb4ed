#pragma once
#include <memory>

#include "capture/LCCaptureManager.h"
#include "daemon/AlertQueue.h"
#include "daemon/LCClientProxy.h"
#include "daemon/LCRecordingManager.h"
#include "platform/Platform.h"
#include "support/LCStoreManager.h"
#include "support/Localization.h"
#include "support/RecordingErrors.h"
#include "support/TempStore.h"

namespace lumacast {

/// Owns what there is one of in the process. A test makes a fresh one per case. The platform must outlive it, and the
/// platform's lanes must have come to rest before it is destroyed.
class Process {
public:
    /// An empty maker makes the real sessions; without `captureDevices` the capture manager says what there is.
    explicit Process(const Platform& platform, LCRecordingManager::SessionMaker makeSession = {},
                     const CaptureDevices* captureDevices = nullptr);

    /// Sends the manager `finishStartup` and opens the administrator's service. On the main queue's thread.
    void start();

    LCRecordingManager& manager() { return *manager_; }
    TempStore& tempStore() { return tempStore_; }
    LCCaptureManager& captureManager() { return *captureManager_; }
    /// `+clientProxy` — the proxy of nobody, the same one at every call. Nothing uses it.
    const std::shared_ptr<LCClientProxy>& clientProxy();

    /// `sharedManager` of LCStoreManager.
    LCStoreManager& storeManager() { return storeManager_; }

private:
    const Platform platform_;
    TempStore tempStore_;
    Localization localization_;
    RecordingErrors errors_;
    LCStoreManager storeManager_;
    const std::shared_ptr<LCCaptureManager> captureManager_;
    AlertQueue alertQueue_;
    std::once_flag clientProxyOnce_;
    std::shared_ptr<LCClientProxy> clientProxy_;
    std::shared_ptr<LCRecordingManager> manager_;
};

}  // namespace lumacast
