#pragma once
#include <cstdlib>

#include "daemon/Process.h"
#include "tests/fakes/FakePlatform.h"

namespace lumacast {

/// The whole daemon in a simulation, started, with the question to the user suppressed and a screen that changes all
/// the time.
class SimulatedDaemon {
public:
    /// `devices`, when given, says whether there is a microphone.
    explicit SimulatedDaemon(std::uint64_t seed, const CaptureDevices* devices = nullptr) : world(seed) {
        world.fakes.preferences.set(kPreferenceDomain, "LCSuppressAlert", true);
        world.fakes.displayCapture.setAutomatic(true);
        world.fakes.displayCapture.setPlanes(1 << 30);  // movies in memory keep their pictures
        if (std::getenv("LC_VERBOSE")) world.fakes.log.setVerbose(true);
        process = std::make_unique<Process>(world.fakes.platform(), LCRecordingManager::SessionMaker{}, devices);
        world.scheduler.mainQueue().sync([this] { process->start(); });
    }
    ~SimulatedDaemon() { world.scheduler.endWorld(); }

    Dictionary snapshot() {
        Dictionary result;
        world.scheduler.mainQueue().sync([&] { result = process->manager().snapshot(); });
        return result;
    }
    std::size_t sessionCount() { return snapshot().find("sessions")->as<Array>()->size(); }

    SimWorld world;
    std::unique_ptr<Process> process;
};

}  // namespace lumacast
