#include "linux/media/LinuxMovieExporters.h"

#include <algorithm>
#include <utility>

#include "linux/media/LinuxMovieExport.h"
#include "linux/media/MovieSource.h"

namespace lumacast {

namespace {

class LinuxMovieAsset final : public MovieAsset {
public:
    explicit LinuxMovieAsset(const URL& url) : path_(url.path()) {
        auto opened = media::MovieSource::open(path_);
        if (auto* const source = std::get_if<0>(&opened)) nanoseconds_ = (*source)->duration();
    }
    MediaTime duration() const override { return MediaTime::make(nanoseconds_, 1'000'000'000); }
    std::vector<std::int32_t> audioTracks() const override { return {}; }
    const std::string& path() const { return path_; }

private:
    const std::string path_;
    std::int64_t nanoseconds_ = 0;
};

}  // namespace

/// The role's face of an export.
class LinuxMovieExporter final : public MovieExporter {
public:
    LinuxMovieExporter(std::shared_ptr<MovieAsset> movie, URL outputURL, LinuxMovieExporters& exporters)
        : movie_(std::move(movie)), outputURL_(std::move(outputURL)), exporters_(exporters) {}
    ~LinuxMovieExporter() override {
        if (job_) job_->cancel();
    }

    URL outputURL() const override { return outputURL_; }
    void setTimeRange(MediaTimeRange range) override { range_ = range; }
    void setAudioMix(AudioMix) override {}
    void cancel() override {
        if (job_) job_->cancel();
    }
    double progress() const override { return 0; }
    void exportAsynchronously(Completion completion) override {
        const auto* const movie = dynamic_cast<const LinuxMovieAsset*>(movie_.get());
        std::optional<Error> refusal;
        if (job_) refusal = media::systemError(EALREADY);
        if (!movie) refusal = media::systemError(EINVAL);
        const auto job = std::make_shared<LinuxMovieExport>(
            media::ExportPlan{movie ? movie->path() : "", outputURL_.path(), range_}, std::move(completion));
        if (!job_) job_ = job;
        exporters_.run(job, std::move(refusal));
    }

private:
    const std::shared_ptr<MovieAsset> movie_;
    const URL outputURL_;
    LinuxMovieExporters& exporters_;
    std::optional<MediaTimeRange> range_;
    std::shared_ptr<LinuxMovieExport> job_;
};

LinuxMovieExporters::LinuxMovieExporters() : LinuxMovieExporters(std::make_shared<media::PosixMovieFiles>()) {}

LinuxMovieExporters::LinuxMovieExporters(std::shared_ptr<media::MovieFiles> files) : files_(std::move(files)) {
    av_log_set_level(AV_LOG_QUIET);  // the library talks to the standard error output by itself
}

LinuxMovieExporters::~LinuxMovieExporters() {
    for (const auto& job : running_) job->cancel();
}

std::shared_ptr<MovieAsset> LinuxMovieExporters::openMovie(const URL& url) {
    return std::make_shared<LinuxMovieAsset>(url);
}

std::shared_ptr<MovieExporter> LinuxMovieExporters::makeExporter(std::shared_ptr<MovieAsset> movie, ExportPreset,
                                                                 const URL& outputURL) {
    return std::make_shared<LinuxMovieExporter>(std::move(movie), outputURL, *this);
}

void LinuxMovieExporters::run(const std::shared_ptr<LinuxMovieExport>& job, std::optional<Error> refusal) {
    const std::lock_guard lock(mutex_);
    // Joining a thread that has ended takes no time.
    std::erase_if(running_, [](const auto& other) { return other->hasEnded(); });
    if (!refusal) {
        running_.push_back(job);
        if (job->start(files_)) return;
        running_.pop_back();
        refusal = media::systemError(EAGAIN);
    }
    lane_.post([job, refusal = std::move(*refusal)] { job->refuse(refusal); });
}

}  // namespace lumacast
