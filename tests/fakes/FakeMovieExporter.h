#pragma once
// Copies of movies in memory.

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

private:
    Scheduler& scheduler_;
    FakeFileSystem& files_;
    FaultPlan& faults_;
};

}  // namespace lumacast
