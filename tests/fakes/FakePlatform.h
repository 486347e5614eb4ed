#pragma once
// A fresh world for each test: every role's fake, gathered.

#include <cstdint>
#include <memory>
#include <string>

#include "platform/Platform.h"
#include "tests/fakes/FakeAdminService.h"
#include "tests/fakes/FakeAppExtensions.h"
#include "tests/fakes/FakeAppStateMonitor.h"
#include "tests/fakes/FakeAudioInputQueue.h"
#include "tests/fakes/FakeBundles.h"
#include "tests/fakes/FakeClock.h"
#include "tests/fakes/FakeContainerWriter.h"
#include "tests/fakes/FakeDeviceCapture.h"
#include "tests/fakes/FakeDeviceInfo.h"
#include "tests/fakes/FakeDisplayCapture.h"
#include "tests/fakes/FakeDisplayCloneControl.h"
#include "tests/fakes/FakeFileSystem.h"
#include "tests/fakes/FakeIpc.h"
#include "tests/fakes/FakeKeepAlive.h"
#include "tests/fakes/FakeKeyedArchive.h"
#include "tests/fakes/FakeLogSink.h"
#include "tests/fakes/FakeMovieExporter.h"
#include "tests/fakes/FakeNetworkReachability.h"
#include "tests/fakes/FakePhotoLibrary.h"
#include "tests/fakes/FakePreferences.h"
#include "tests/fakes/FakeRenderServer.h"
#include "tests/fakes/FakeScreenReader.h"
#include "tests/fakes/FakeStoragePurgeService.h"
#include "tests/fakes/FakeStoreLookup.h"
#include "tests/fakes/FakeSystemSounds.h"
#include "tests/fakes/FakeTelemetry.h"
#include "tests/fakes/FakeUserAlerts.h"
#include "tests/fakes/FaultPlan.h"
#include "tests/fakes/SimScheduler.h"

namespace lumacast {

/// The fakes of one daemon's process on any scheduler, wired together: the log writes to the sink, capture follows the
/// clock, movies are files of the file system, and a new writer is given a picture at once.
class FakePlatform final : public PlatformOwner {
public:
    static constexpr ProcessID kDaemonPid{100};

    /// `scheduler` outlives the platform. The clock follows `hostTime`, or stands until it is moved when that is empty.
    explicit FakePlatform(Scheduler& scheduler, std::function<HostTime()> hostTime = {}, std::string root = {});

    Platform& platform() override { return platform_; }

    /// The Ipc role of another process on the same machine, with a main queue of its own. It outlives the platform's
    /// connections to it or is killed first; either order is safe.
    std::unique_ptr<FakeIpc> makeProcess(ProcessID pid);
    /// The process dies for every role: it is found nowhere any more.
    void endProcess(FakeIpc& process);

    Scheduler& scheduler;
    FaultPlan faults;
    FakeLogSink logSink;
    Log log;
    FakeClock clock;
    const std::shared_ptr<FakeIpcMachine> machine;
    FakeIpc ipc;
    FakeBundles bundles;
    FakeRenderServer renderServer;
    FakeAppStateMonitor appStateMonitor;
    FakeDisplayCapture displayCapture;
    FakeDisplayCloneControl displayCloneControl;
    FakeAudioInputQueues audioInputQueues;
    FakeDeviceCapture deviceCapture;
    FakeFileSystem fileSystem;
    FakeContainerWriters containerWriters;
    FakeMovieExporters movieExporters;
    FakePhotoLibrary photoLibrary;
    FakePreferences preferences;
    FakeDeviceInfo deviceInfo;
    FakeTelemetry telemetry;
    FakeKeepAlive keepAlive;
    FakeAdminService admin;
    FakeUserAlerts userAlerts;
    FakeSystemSounds systemSounds;
    FakeScreenReader screenReader;
    FakeStoreLookup storeLookup;
    FakeNetworkReachability networkReachability;
    FakeAppExtensions appExtensions;
    FakeKeyedArchive keyedArchive;
    FakeStoragePurgeService storagePurge;  ///< last: it holds who has registered

private:
    Platform platform_;
};

/// The fakes in a simulation. End the world (SimScheduler::endWorld) before what its tasks use is gone; the destructor
/// does it at the latest.
class SimWorld final {
public:
    explicit SimWorld(std::uint64_t seed, std::string root = {})
        : scheduler(seed), fakes(scheduler, [this] { return scheduler.now(); }, std::move(root)) {}
    ~SimWorld() { scheduler.endWorld(); }
    SimWorld(const SimWorld&) = delete;
    SimWorld& operator=(const SimWorld&) = delete;

    SimScheduler scheduler;
    FakePlatform fakes;
};

}  // namespace lumacast
