#include "tests/fakes/FakePlatform.h"

#include <utility>

namespace lumacast {

FakePlatform::FakePlatform(Scheduler& itsScheduler, std::function<HostTime()> hostTime, std::string root)
    : scheduler(itsScheduler),
      log([this](LogLevel level, std::string_view text) { logSink.write(level, text); }),
      clock(std::move(hostTime)),
      machine(std::make_shared<FakeIpcMachine>()),
      // The main queue lives as long as the scheduler does.
      ipc(machine, std::shared_ptr<SerialQueue>(std::shared_ptr<void>(), &scheduler.mainQueue()), kDaemonPid, faults,
          log),
      renderServer(faults),
      appStateMonitor(scheduler, faults),
      displayCapture(scheduler, clock, faults),
      audioInputQueues(scheduler, clock, faults),
      deviceCapture(scheduler),
      fileSystem(clock, faults, std::move(root)),
      containerWriters(scheduler, clock, fileSystem, faults),
      movieExporters(scheduler, fileSystem, faults),
      photoLibrary(fileSystem, faults),
      telemetry(faults),
      admin(scheduler),
      userAlerts(scheduler, faults),
      storeLookup(scheduler, faults),
      appExtensions(scheduler, ipc, [this](ProcessID pid) { return makeProcess(pid); }, faults),
      storagePurge(scheduler),
      platform_{log,
                scheduler,
                clock,
                ipc,
                bundles,
                renderServer,
                appStateMonitor,
                displayCapture,
                displayCloneControl,
                audioInputQueues,
                deviceCapture,
                containerWriters,
                movieExporters,
                photoLibrary,
                fileSystem,
                preferences,
                deviceInfo,
                telemetry,
                keepAlive,
                admin,
                storagePurge,
                userAlerts,
                systemSounds,
                screenReader,
                storeLookup,
                networkReachability,
                appExtensions,
                keyedArchive} {
    containerWriters.setWhenMade([this] { displayCapture.deliverFrames(); });
}

std::unique_ptr<FakeIpc> FakePlatform::makeProcess(ProcessID pid) {
    auto queue = scheduler.serialQueue("process " + std::to_string(number(pid)));
    return std::make_unique<FakeIpc>(machine, std::move(queue), pid, faults, log);
}

void FakePlatform::endProcess(FakeIpc& process) {
    bundles.processEnded(process.pid());
    renderServer.processEnded(process.pid());
    process.kill();
}

}  // namespace lumacast
