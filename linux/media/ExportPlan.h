#pragma once
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <variant>

#include "platform/MovieExporter.h"

namespace lumacast::media {

/// What is exported from where to where.
struct ExportPlan {
    std::string source;
    std::shared_ptr<const void> sourceHeld;  ///< what keeps `source` the file that was opened
    std::string destination;
    std::optional<MediaTimeRange> range;  ///< none: all of it
    ExportPreset preset = ExportPreset::PassThrough;
    std::optional<AudioMix> mix;  ///< for HighestQuality; none: every sound track as it is
};

struct ExportResult {
    ExportStatus status = ExportStatus::Failed;
    std::optional<Error> error;
};

class MovieFile;

/// What its owner and a running export tell each other; on any thread.
class ExportState final {
public:
    void cancel() { cancelled_.store(true, std::memory_order_relaxed); }
    bool isCancelled() const { return cancelled_.load(std::memory_order_relaxed); }
    double progress() const { return progress_.load(std::memory_order_relaxed); }
    /// 0 to 1; what is less than before is left out. Called on the export's thread alone.
    void advance(double progress) {
        if (progress > this->progress() && progress <= 1) progress_.store(progress, std::memory_order_relaxed);
    }

    /// What is being written, from its creation until it is finished or removed. Called on the export's thread.
    void beginFile(MovieFile& file);
    void endFile();
    /// Waits until then for the file's end, and takes its name away if that hasn't come.
    void removeUnfinished(const std::string& path, std::chrono::steady_clock::time_point deadline);

private:
    std::atomic<bool> cancelled_ = false;
    std::atomic<double> progress_ = 0;
    std::mutex mutex_;  // guards the file
    std::condition_variable changed_;
    MovieFile* file_ = nullptr;
};

/// A range in nanoseconds of the movie.
struct ExportSpan {
    std::int64_t start = 0;
    std::int64_t end = 0;
};

/// What is to be exported of a movie of so many nanoseconds: EINVAL for a range that is empty or not inside it.
std::variant<ExportSpan, Error> spanOf(const ExportPlan& plan, std::int64_t movieDuration);

}  // namespace lumacast::media
