#include "daemon/Process.h"

#include "broadcast/LCExtensionHostContext.h"

namespace lumacast {

Process::Process(const Platform& platform, LCRecordingManager::SessionMaker makeSession,
                 const CaptureDevices* captureDevices)
    : platform_(platform),
      tempStore_(platform_),
      localization_(platform_.bundles),
      errors_(localization_),
      storeManager_(platform_, localization_),
      captureManager_(LCCaptureManager::init(platform_)),
      alertQueue_(platform_.scheduler) {
    platform_.appExtensions.setContextClass(LCExtensionHostContext::contextClass(platform_.log));
    manager_ = LCRecordingManager::init(
        {platform_, tempStore_, localization_, errors_, *captureManager_, &platform_.scheduler.mainQueue(),
         captureDevices},
        alertQueue_,
        std::move(makeSession));
}

const std::shared_ptr<LCClientProxy>& Process::clientProxy() {
    std::call_once(clientProxyOnce_, [this] { clientProxy_ = std::make_shared<LCClientProxy>(platform_.log); });
    return clientProxy_;
}

void Process::start() {
    errors_.readTexts();
    manager_->finishStartup();
    manager_->serveStorageCommands();
    manager_->serveSaveCommand();
    platform_.admin.resume([weak = std::weak_ptr(manager_)] {
        const auto manager = weak.lock();
        return manager ? manager->snapshot() : Dictionary();
    });
}

}  // namespace lumacast
