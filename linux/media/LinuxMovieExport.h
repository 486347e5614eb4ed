#pragma once
#include <atomic>
#include <chrono>
#include <memory>
#include <optional>
#include <system_error>
#include <thread>
#include <utility>

#include "linux/media/AvHandles.h"
#include "linux/media/CompletionLane.h"
#include "linux/media/MovieExport.h"

namespace lumacast {

/// One export, and its thread where it has one of its own.
class LinuxMovieExport final : public std::enable_shared_from_this<LinuxMovieExport> {
public:
    LinuxMovieExport(media::ExportPlan plan, MovieExporter::Completion completion, media::CompletionLane& lane)
        : plan_(std::move(plan)), completion_(std::move(completion)), lane_(lane) {}
    LinuxMovieExport(const LinuxMovieExport&) = delete;
    LinuxMovieExport& operator=(const LinuxMovieExport&) = delete;
    /// Waits for the thread.
    ~LinuxMovieExport() {
        if (thread_.joinable()) thread_.join();
    }

    bool isEncoding() const { return plan_.preset != ExportPreset::PassThrough; }
    /// On a thread of its own, on which it is told. Once. False, and nobody is told, when the system has no thread.
    [[nodiscard]] bool start(std::shared_ptr<media::MovieFiles> files) {
        try {
            thread_ = std::thread([this, files = std::move(files)] {
                const media::ExportResult result = media::exportMovie(plan_, *files, state_);
                tell(result.status, result.error);
                ended_.store(true, std::memory_order_release);
            });
        } catch (const std::system_error&) {
            return false;
        }
        return true;
    }
    /// Instead of start: on the caller's thread, and told on the lane, as the caller's may be too slow for that.
    void run(media::MovieFiles& files) {
        media::ExportResult result = media::exportMovie(plan_, files, state_);
        tellLater(result.status, std::move(result.error));
    }
    /// Instead of start: told on the lane that it has ended so.
    void tellLater(ExportStatus status, std::optional<Error> error) {
        lane_.post([self = shared_from_this(), status, error = std::move(error)] { self->tell(status, error); });
    }
    void cancel() { state_.cancel(); }
    /// Cancels it, and nobody is told how it ends.
    void forget() {
        isForgotten_ = true;
        cancel();
    }
    /// Waits until then for its file to be finished or removed, and takes the file's name away if it is neither.
    void removeUnfinished(std::chrono::steady_clock::time_point deadline) {
        state_.removeUnfinished(plan_.destination, deadline);
    }
    double progress() const { return state_.progress(); }
    /// Whether the thread has nothing left to do but end.
    bool hasEnded() const { return ended_.load(std::memory_order_acquire); }

private:
    void tell(ExportStatus status, const std::optional<Error>& error) {
        const auto completion = std::exchange(completion_, nullptr);
        if (completion && !isForgotten_) completion(status, error);
    }

    const media::ExportPlan plan_;
    MovieExporter::Completion completion_;  ///< the thread's once started, else the lane's
    media::CompletionLane& lane_;
    media::ExportState state_;
    std::atomic<bool> ended_ = false, isForgotten_ = false;
    std::thread thread_;
};

}  // namespace lumacast
