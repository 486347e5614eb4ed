#pragma once
// The roles that differ from port to port: what the user sees, hears and is asked. Everything else is the same wherever
// the daemon runs on Linux, and is made by LinuxPlatform.

#include <functional>
#include <memory>
#include <optional>

#include "base/Identifiers.h"
#include "base/Log.h"
#include "linux/system/LinuxEnvironment.h"
#include "platform/AppStateMonitor.h"
#include "platform/AudioInputQueue.h"
#include "platform/Bundles.h"
#include "platform/Clock.h"
#include "platform/DeviceCapture.h"
#include "platform/DisplayCapture.h"
#include "platform/RenderServer.h"
#include "platform/Scheduler.h"
#include "platform/SystemSounds.h"
#include "platform/UserAlert.h"

namespace lumacast {

/// What the desktop's roles may use of the platform. Borrowed; outlives them.
struct DesktopServices {
    const LinuxEnvironment& environment;
    Log& log;
    Clock& clock;
    Scheduler& scheduler;
    Bundles& bundles;
    /// The application that a process runs; none for one that is no application's. Callable from any lane, may take a
    /// moment.
    std::function<std::optional<BundleIdentifier>(ProcessID pid)> applicationOf;
};

// Members are unmade in the opposite order.

struct SoundRoles {
    std::unique_ptr<AudioInputQueues> audioInputQueues;
    std::unique_ptr<DeviceCapture> deviceCapture;
};

struct DisplayRoles {
    std::shared_ptr<DisplayCapture> displayCapture;
    std::shared_ptr<DisplayCloneControl> displayCloneControl;  ///< may be the same object
    std::unique_ptr<RenderServer> renderServer;
    std::unique_ptr<AppStateMonitor> appStateMonitor;
};

struct AttentionRoles {
    std::unique_ptr<UserAlerts> userAlerts;
    std::unique_ptr<SystemSounds> systemSounds;
};

/// Makes the desktop's roles, each group once and none of them null, in this order: between them the platform makes
/// what is its own. Outlives what it made.
class DesktopRoles {
public:
    virtual ~DesktopRoles() = default;
    virtual SoundRoles makeSound() = 0;
    virtual DisplayRoles makeDisplay() = 0;
    virtual AttentionRoles makeAttention() = 0;
};

using MakeDesktopRoles = std::function<std::unique_ptr<DesktopRoles>(const DesktopServices& services)>;

}  // namespace lumacast
