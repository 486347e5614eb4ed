#pragma once
// Copies of movies in memory.

#include <functional>
#include <mutex>
#include <utility>
#include <vector>

#include "platform/MovieExporter.h"
#include "platform/Scheduler.h"
#include "tests/fakes/FakeFileSystem.h"
#include "tests/fakes/FaultPlan.h"

namespace lumacast {

/// Opens and exports the movies of the FakeFileSystem. Exports run on the scheduler's default global queue. A range
/// must lie within the movie. Failing calls: "MovieExporters.openMovie" (a movie that can't be read),
/// "MovieExporter.export".
class FakeMovieExporters final : public MovieExporters {
public:
    FakeMovieExporters(Scheduler& scheduler, FakeFileSystem& files, FaultPlan& faults)
        : scheduler_(scheduler), files_(files), faults_(faults) {}

    std::shared_ptr<MovieAsset> openMovie(const URL& url) override;
    std::shared_ptr<MovieExporter> makeExporter(std::shared_ptr<MovieAsset> movie, ExportPreset preset,
                                                const URL& outputURL) override;

    /// Called with each movie before it is opened, on the lane that opens it. Set before the lanes run.
    void setWhenOpened(std::function<void(const URL&)> opened) { whenOpened_ = std::move(opened); }
    /// Of every exporter that was made, in order.
    std::vector<ExportPreset> presets() const {
        const std::lock_guard lock(mutex_);
        return presets_;
    }

    /// What the last export that was given a mix is to mix.
    std::optional<AudioMix> lastMix() const {
        const std::lock_guard lock(mutex_);
        return lastMix_;
    }
    /// For the exporters.
    void noteMix(const AudioMix& mix) {
        const std::lock_guard lock(mutex_);
        lastMix_ = mix;
    }

private:
    std::optional<AudioMix> lastMix_;
    std::function<void(const URL&)> whenOpened_;
    mutable std::mutex mutex_;
    std::vector<ExportPreset> presets_;
    Scheduler& scheduler_;
    FakeFileSystem& files_;
    FaultPlan& faults_;
};

}  // namespace lumacast
