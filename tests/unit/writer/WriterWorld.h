#pragma once
// A movie writer in a simulation, and samples to give it.

#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <string>
#include <vector>

#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/FakePlane.h"
#include "writer/LCMovieWriter.h"

namespace lumacast {

/// A fresh world per test. The test's own thread drives the simulation: a synchronous call returns when it is done,
/// what was submitted runs in settle().
class WriterWorld : public ::testing::Test {
protected:
    static constexpr std::int32_t kTimescale = 600;

    WriterWorld() {
        fakes_.log.setVerbose(true);
        tempStore_._srSetupTempDirectory();
        fakes_.logSink.clear();
    }
    ~WriterWorld() override { world_.scheduler.endWorld(); }

    std::shared_ptr<LCMovieWriter> makeWriter(Size size = {640, 360}) {
        return std::make_shared<LCMovieWriter>(fakes_.platform(), tempStore_, size, path_);
    }
    /// A writer that was set up, with its container writer and tracks.
    std::shared_ptr<LCMovieWriter> makeReadyWriter(Size size = {640, 360}) {
        auto writer = makeWriter(size);
        writer->setupAssetWriter();
        fakes_.logSink.clear();
        return writer;
    }
    /// The world's platform with another maker of movies, or another exporter.
    Platform platformWith(ContainerWriters& writers, MovieExporters& exporters) {
        const Platform& p = fakes_.platform();
        return {p.log,           p.scheduler,      p.clock,           p.ipc,
                p.bundles,       p.renderServer,   p.appStateMonitor, p.displayCapture,
                p.displayCloneControl, p.audioInputQueues, p.deviceCapture, writers,
                exporters,       p.photoLibrary,   p.fileSystem,
                p.preferences,   p.deviceInfo,     p.telemetry,       p.keepAlive,
                p.admin,
                p.storagePurge,  p.userAlerts,     p.systemSounds,    p.screenReader,
                p.storeLookup,   p.networkReachability, p.appExtensions, p.keyedArchive};
    }
    void settle() { world_.scheduler.runUntilIdle(); }

    static SampleRef picture(std::int64_t value) { return picture(MediaTime::make(value, kTimescale)); }
    static SampleRef picture(MediaTime time) {
        auto plane = std::make_shared<FakePlane>(2, 2, 1, std::vector<PixelRect>{});
        return SampleBuffer::makeVideo(PixelBuffer(std::move(plane)), time, MediaTime::make(10, kTimescale));
    }
    static SampleRef sound(std::int64_t value, std::int64_t duration = 20) {
        AudioFormat format;
        format.sampleRate = 44100;
        format.formatID = kAudioFormatLinearPCM;
        format.channelsPerFrame = 1;
        return SampleBuffer::makeAudio(format, Data(8), 4,
                                       {MediaTime::make(duration, kTimescale), MediaTime::make(value, kTimescale), {}});
    }

    FakeRecording& recording() { return *fakes_.containerWriters.lastRecording(); }
    /// The ticks of the samples that a track holds; 0 the picture, 1 the application's sound, 2 the microphone.
    std::vector<std::int64_t> ticks(std::size_t track) {
        std::vector<std::int64_t> result;
        const FakeMovie movie = recording().movie();
        for (const SampleRef& sample : movie.tracks.at(track).samples)
            result.push_back(sample->presentationTime().value);
        return result;
    }
    using Ticks = std::vector<std::int64_t>;

    std::size_t logged(std::string_view text) { return fakes_.logSink.count(text); }

    SimWorld world_{1};
    FakePlatform& fakes_ = world_.fakes;
    TempStore tempStore_{fakes_.platform()};
    const std::string path_ = tempStore_.pathFor("Player.mp4");
};

}  // namespace lumacast
