#pragma once
#include <memory>
#include <mutex>
#include <vector>

#include "linux/media/CompletionLane.h"
#include "linux/media/IdlePriority.h"
#include "linux/media/MovieFile.h"
#include "platform/MovieExporter.h"

namespace lumacast {

class LinuxMovieExport;
namespace media {
class EncodingQueue;
}

/// Opens movies by libavformat, and copies or encodes ranges of them into files of our own box writer. Callable from
/// any lane. Copies run on threads of their own, encoding exports one after the other on one that is idle otherwise. To
/// be destroyed after its exporters; that cancels exports that still run, and waits for them.
class LinuxMovieExporters final : public MovieExporters {
public:
    LinuxMovieExporters();
    /// With files from elsewhere.
    explicit LinuxMovieExporters(std::shared_ptr<media::MovieFiles> files,
                                 media::EncodingPriority priority = media::EncodingPriority::Idle);
    LinuxMovieExporters(const LinuxMovieExporters&) = delete;
    LinuxMovieExporters& operator=(const LinuxMovieExporters&) = delete;
    ~LinuxMovieExporters() override;

    std::shared_ptr<MovieAsset> openMovie(const URL& url) override;
    std::shared_ptr<MovieExporter> makeExporter(std::shared_ptr<MovieAsset> movie, ExportPreset preset,
                                                const URL& outputURL) override;

    /// For the exporters. Runs an export on a thread of its own or in the queue, or reports the refusal on the lane:
    /// EAGAIN where the system has no thread.
    void run(const std::shared_ptr<LinuxMovieExport>& job, std::optional<Error> refusal);
    void cancel(const std::shared_ptr<LinuxMovieExport>& job);
    media::CompletionLane& lane() { return lane_; }

private:
    const std::shared_ptr<media::MovieFiles> files_;
    media::CompletionLane lane_;
    std::mutex mutex_;
    std::vector<std::shared_ptr<LinuxMovieExport>> running_;  ///< whose threads have not been joined
    std::unique_ptr<media::EncodingQueue> encodings_;          ///< last: it is told on the lane
};

}  // namespace lumacast
