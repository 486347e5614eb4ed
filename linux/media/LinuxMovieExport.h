#pragma once
#include <atomic>
#include <memory>
#include <thread>
#include <utility>

#include "linux/media/PassThroughExport.h"

namespace lumacast {

/// One running export and its thread.
class LinuxMovieExport final {
public:
    LinuxMovieExport(media::ExportPlan plan, MovieExporter::Completion completion)
        : plan_(std::move(plan)), completion_(std::move(completion)) {}
    LinuxMovieExport(const LinuxMovieExport&) = delete;
    LinuxMovieExport& operator=(const LinuxMovieExport&) = delete;
    /// Waits for the thread.
    ~LinuxMovieExport() {
        if (thread_.joinable()) thread_.join();
    }

    /// Once. `refusal` is reported instead of exporting anything.
    void start(std::shared_ptr<media::MovieFiles> files, std::optional<Error> refusal) {
        thread_ = std::thread([this, files = std::move(files), refusal = std::move(refusal)] {
            const media::ExportResult result = refusal ? media::ExportResult{ExportStatus::Failed, refusal}
                                                       : media::exportMovie(plan_, *files, cancelled_);
            if (const auto completion = std::exchange(completion_, nullptr)) completion(result.status, result.error);
            ended_.store(true, std::memory_order_release);
        });
    }
    void cancel() { cancelled_.store(true, std::memory_order_relaxed); }
    /// Whether the thread has nothing left to do but end.
    bool hasEnded() const { return ended_.load(std::memory_order_acquire); }

private:
    const media::ExportPlan plan_;
    MovieExporter::Completion completion_;  ///< the thread's, once started
    std::atomic<bool> cancelled_ = false, ended_ = false;
    std::thread thread_;
};

}  // namespace lumacast
