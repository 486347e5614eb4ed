#pragma once
#include <chrono>
#include <memory>
#include <mutex>
#include <vector>

#include "linux/media/CompletionLane.h"
#include "linux/media/EncodingPriority.h"
#include "linux/media/MovieFile.h"
#include "platform/MovieExporter.h"

namespace lumacast {

class LinuxMovieExport;
namespace media {
class EncodingQueue;
}

/// Opens movies by libavformat, and copies or encodes ranges of them into files of our own box writer. Callable from
/// any lane. Copies run on threads of their own, encoding exports one after the other on one of low priority. To
/// be destroyed after its exporters; that cancels exports that still run, and waits for them.
class LinuxMovieExporters final : public MovieExporters {
public:
    LinuxMovieExporters();
    /// With files from elsewhere.
    explicit LinuxMovieExporters(std::shared_ptr<media::MovieFiles> files,
                                 media::EncodingPriority priority = media::EncodingPriority::Low);
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

    /// At the end of the process: exports that run are cancelled, and nobody hears how any ends. Doesn't wait.
    void forgetAll();
    /// After that: waits for them so long at most, and takes the names of the files away that are not finished by then.
    void removeUnfinished(std::chrono::milliseconds patience);

private:
    const std::shared_ptr<media::MovieFiles> files_;
    media::CompletionLane lane_;
    std::mutex mutex_;
    std::vector<std::shared_ptr<LinuxMovieExport>> running_;  ///< whose threads have not been joined
    std::vector<std::shared_ptr<LinuxMovieExport>> ending_;   ///< with the process
    bool isEnding_ = false;
    std::unique_ptr<media::EncodingQueue> encodings_;          ///< last: it is told on the lane
};

}  // namespace lumacast
