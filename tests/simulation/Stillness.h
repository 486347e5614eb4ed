#pragma once
#include <gtest/gtest.h>

#include "tests/simulation/SimulatedDaemon.h"

namespace lumacast {

/// What the daemon says of a session: whether it records, and of its movie.
struct DescribedSession {
    std::string identifier;
    bool isRecording = false, isPaused = false;
    std::string path;  ///< empty without a movie that has pictures
};

inline std::vector<DescribedSession> describedSessions(SimulatedDaemon& daemon) {
    std::vector<DescribedSession> all;
    const Dictionary snapshot = daemon.snapshot();
    for (const Value& entry : *snapshot.find("sessions")->as<Array>()) {
        const Dictionary& session = *entry.as<Dictionary>();
        DescribedSession& described = all.emplace_back();
        described.identifier = *session.find("bundleID")->as<std::string>();
        described.isRecording = *session.find("recording")->as<bool>();
        if (!described.isRecording) continue;
        const Dictionary& current = *session.find("current")->as<Dictionary>();
        described.isPaused = *current.find("paused")->as<bool>();
        const Value* pictures = current.find("framesRecorded");
        if (pictures && *pictures->as<std::uint64_t>() > 0) described.path = *current.find("path")->as<std::string>();
    }
    return all;
}

/// At any moment: the movie of a recording that is on is in its file.
inline void expectMoviesInTheirFiles(SimulatedDaemon& daemon) {
    for (const char* name : {"Alpha", "Beta", "Gamma", "Delta"}) {
        const auto session =
            daemon.process->manager().registeredSession(BundleIdentifier(std::string("org.example.") + name));
        const auto writer = session && session->isRecording() ? session->movieWriter() : nullptr;
        const auto file = writer ? writer->assetWriter() : nullptr;
        if (!file || file->status() != ContainerStatus::Writing || file->picturesTaken() == 0) continue;
        EXPECT_TRUE(daemon.world.fakes.fileSystem.isThere(writer->outputPath()))
            << writer->outputPath() << " is being recorded and is not there";
    }
}

/// At rest: each request was answered once, what a recording uses of the device is used only while one is on, and the movie on its way is in its file.
/// `soundMayFail`: a tap that could not be stopped runs on.
inline void expectStillness(SimulatedDaemon& daemon, bool soundMayFail) {
    FakePlatform& fakes = daemon.world.fakes;
    EXPECT_EQ(fakes.machine->secondAnswers[FakePlatform::kDaemonPid], 0) << "requests are answered twice";
    bool isRecording = false;
    for (const DescribedSession& session : describedSessions(daemon)) {
        isRecording |= session.isRecording;
        if (!session.path.empty()) {
            EXPECT_TRUE(fakes.fileSystem.isThere(session.path)) << session.path << " is being recorded and is not there";
        }
    }
    if (isRecording) return;
    for (const auto& source : fakes.displayCapture.sources())
        EXPECT_FALSE(source->isRunning()) << "captured, and nobody records";
    EXPECT_EQ(fakes.displayCloneControl.mode(), DisplayCloneControl::kOff) << "mirrored, and nobody records";
    EXPECT_FALSE(fakes.appStateMonitor.hasHandler()) << "the foreground is watched, and nobody records";
    if (const auto microphone = fakes.deviceCapture.lastSession()) {
        EXPECT_EQ(microphone->inputCount(), 0u) << "the microphone is used, and nobody records";
        EXPECT_FALSE(microphone->isRunning()) << "the microphone's session runs, and nobody records";
    }
    if (soundMayFail) return;
    for (const auto& tap : fakes.audioInputQueues.queues())
        EXPECT_FALSE(tap->isRunning()) << "sound is tapped, and nobody records";
}

}  // namespace lumacast
