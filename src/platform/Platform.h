#pragma once
// Every platform service, gathered.

#include <memory>

#include "base/Log.h"
#include "platform/AdminService.h"
#include "platform/AppExtension.h"
#include "platform/AppStateMonitor.h"
#include "platform/AudioInputQueue.h"
#include "platform/Bundles.h"
#include "platform/Clock.h"
#include "platform/ContainerWriter.h"
#include "platform/DeviceCapture.h"
#include "platform/DeviceInfo.h"
#include "platform/DisplayCapture.h"
#include "platform/FileSystem.h"
#include "platform/IpcListener.h"
#include "platform/KeepAlive.h"
#include "platform/KeyedArchive.h"
#include "platform/LogSink.h"
#include "platform/MovieExporter.h"
#include "platform/NetworkReachability.h"
#include "platform/PhotoLibrary.h"
#include "platform/Preferences.h"
#include "platform/RenderServer.h"
#include "platform/Scheduler.h"
#include "platform/ScreenReader.h"
#include "platform/StoragePurgeService.h"
#include "platform/StoreLookup.h"
#include "platform/SystemSounds.h"
#include "platform/TelemetryReporter.h"
#include "platform/UserAlert.h"

namespace lumacast {

/// The roles of one process, handed down by constructor. Borrowed: the platform outlives everything that holds it.
struct Platform {
    Log& log;
    Scheduler& scheduler;
    Clock& clock;
    Ipc& ipc;
    Bundles& bundles;
    RenderServer& renderServer;
    AppStateMonitor& appStateMonitor;
    DisplayCapture& displayCapture;
    DisplayCloneControl& displayCloneControl;
    AudioInputQueues& audioInputQueues;
    DeviceCapture& deviceCapture;
    ContainerWriters& containerWriters;
    MovieExporters& movieExporters;
    PhotoLibrary& photoLibrary;
    FileSystem& fileSystem;
    Preferences& preferences;
    DeviceInfo& deviceInfo;
    TelemetryReporter& telemetry;
    KeepAlive& keepAlive;
    AdminService& admin;
    StoragePurgeService& storagePurge;
    UserAlerts& userAlerts;
    SystemSounds& systemSounds;
    ScreenReader& screenReader;
    StoreLookup& storeLookup;
    NetworkReachability& networkReachability;
    AppExtensions& appExtensions;
    KeyedArchive& keyedArchive;
};

/// What owns the platform's objects.
class PlatformOwner {
public:
    virtual ~PlatformOwner() = default;
    virtual Platform& platform() = 0;
};

/// Makes the platform of this process. Defined by the port that is linked in. Null, after a line on standard error,
/// when a service the daemon can't live without is missing.
std::unique_ptr<PlatformOwner> makePlatform();

}  // namespace lumacast
