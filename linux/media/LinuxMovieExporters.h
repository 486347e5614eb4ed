#pragma once
#include <memory>
#include <mutex>
#include <vector>

#include "linux/media/CompletionLane.h"
#include "linux/media/MovieFile.h"
#include "platform/MovieExporter.h"

namespace lumacast {

class LinuxMovieExport;

/// Opens movies by libavformat and copies ranges of them into files of our own box writer. Callable from any lane. To
/// be destroyed after its exporters; that cancels exports that still run, and waits for them.
class LinuxMovieExporters final : public MovieExporters {
public:
    LinuxMovieExporters();
    /// With files from elsewhere.
    explicit LinuxMovieExporters(std::shared_ptr<media::MovieFiles> files);
    LinuxMovieExporters(const LinuxMovieExporters&) = delete;
    LinuxMovieExporters& operator=(const LinuxMovieExporters&) = delete;
    ~LinuxMovieExporters() override;

    std::shared_ptr<MovieAsset> openMovie(const URL& url) override;
    std::shared_ptr<MovieExporter> makeExporter(std::shared_ptr<MovieAsset> movie, ExportPreset preset,
                                                const URL& outputURL) override;

    /// Runs an export on a thread of its own, or reports the refusal on the lane: EAGAIN where the system has no thread.
    /// For the exporters.
    void run(const std::shared_ptr<LinuxMovieExport>& job, std::optional<Error> refusal);

private:
    const std::shared_ptr<media::MovieFiles> files_;
    media::CompletionLane lane_;
    std::mutex mutex_;
    std::vector<std::shared_ptr<LinuxMovieExport>> running_;  ///< whose threads have not been joined
};

}  // namespace lumacast
