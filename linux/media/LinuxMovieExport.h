#pragma once
#include <atomic>
#include <memory>
#include <optional>
#include <system_error>
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

    /// Once. False, and nobody is told, when the system has no thread.
    [[nodiscard]] bool start(std::shared_ptr<media::MovieFiles> files) {
        try {
            thread_ = std::thread([this, files = std::move(files)] {
                const media::ExportResult result = media::exportMovie(plan_, *files, cancelled_);
                tell(result.status, result.error);
                ended_.store(true, std::memory_order_release);
            });
        } catch (const std::system_error&) {
            return false;
        }
        return true;
    }
    /// Instead of start, on the lane that tells it.
    void refuse(const Error& reason) { tell(ExportStatus::Failed, reason); }
    void cancel() { cancelled_.store(true, std::memory_order_relaxed); }
    /// Whether the thread has nothing left to do but end.
    bool hasEnded() const { return ended_.load(std::memory_order_acquire); }

private:
    void tell(ExportStatus status, const std::optional<Error>& error) {
        if (const auto completion = std::exchange(completion_, nullptr)) completion(status, error);
    }

    const media::ExportPlan plan_;
    MovieExporter::Completion completion_;  ///< the thread's once started, else the lane's
    std::atomic<bool> cancelled_ = false, ended_ = false;
    std::thread thread_;
};

}  // namespace lumacast
