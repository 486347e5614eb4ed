#include "daemon/Process.h"

namespace lumacast {

Process::Process(const Platform& platform)
    : platform_(platform), tempStore_(platform_), localization_(platform_.bundles), errors_(localization_) {
    manager_ = LCRecordingManager::init(
        {platform_, tempStore_, localization_, errors_, captureManager_, &platform_.scheduler.mainQueue()});
}

void Process::start() {
    manager_->finishStartup();
    platform_.admin.resume([weak = std::weak_ptr(manager_)] {
        const auto manager = weak.lock();
        return manager ? manager->snapshot() : Dictionary();
    });
}

}  // namespace lumacast
