#pragma once
#include <atomic>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "base/Log.h"
#include "linux/extensions/InstalledExtensions.h"
#include "linux/extensions/LaunchLane.h"
#include "linux/extensions/LinuxAppExtensions.h"
#include "linux/extensions/Sandbox.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"
#include "linux/system/DiskLane.h"
#include "platform/AppExtension.h"
#include "platform/Scheduler.h"

namespace lumacast {

class ExtensionProcess;

/// What all extensions share.
struct ExtensionServices {
    Reactor& reactor;
    Scheduler& scheduler;
    LinuxIpc& ipc;
    Log& log;
    const LinuxAppExtensions::Options options;
    const std::shared_ptr<InstalledExtensions> installed;  ///< shared with questions the disk has not answered
    const std::shared_ptr<Sandbox> sandbox;
    const std::shared_ptr<SerialQueue> lookups;
    const std::shared_ptr<DiskLane> disk;

    std::atomic<bool> isOver{false};
    std::mutex mutex;
    ExtensionContextClass contextClass;
    std::vector<std::weak_ptr<ExtensionProcess>> processes;
    std::unique_ptr<LaunchLane> launches;  ///< null at the end
};

}  // namespace lumacast
