#include "linux/media/LinuxMovieExporters.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <utility>

#include "linux/ipc/Fd.h"
#include "linux/media/EncodingQueue.h"
#include "linux/media/LinuxMovieExport.h"
#include "linux/media/MovieSource.h"
#include "linux/calls/FileCalls.h"

namespace lumacast {

namespace {

/// What the library may take at a time, whatever a movie's header says: a picture of the largest size that can be
/// recorded, and room.
constexpr std::size_t kMostLibraryMemory = std::size_t{512} << 20;

/// A regular file, for reading; without waiting for anybody, as the opening of a pipe would.
std::shared_ptr<const Fd> openRegular(const std::string& path) {
    Fd file(calls::openAt(AT_FDCWD, path, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    struct stat status = {};
    if (!file || ::fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode)) return nullptr;
    return std::make_shared<const Fd>(std::move(file));
}

/// The movie that stood at its path when it was opened, whatever becomes of the path: it is read through its descriptor.
class LinuxMovieAsset final : public MovieAsset {
public:
    explicit LinuxMovieAsset(const URL& url) : file_(openRegular(url.path())) {
        if (!file_) return;
        path_ = "/proc/self/fd/" + std::to_string(file_->get());
        auto opened = media::MovieSource::open(path_);
        if (auto* const source = std::get_if<0>(&opened)) read(**source);
    }
    MediaTime duration() const override { return MediaTime::make(nanoseconds_, 1'000'000'000); }
    std::vector<std::int32_t> audioTracks() const override { return audioTracks_; }
    /// Empty when it could not be opened; good for as long as `held()` is.
    const std::string& path() const { return path_; }
    std::shared_ptr<const void> held() const { return file_; }

private:
    void read(const media::MovieSource& source) {
        nanoseconds_ = source.duration();
        for (const auto& track : source.tracks()) {
            if (!track.isVideo) audioTracks_.push_back(track.id);
        }
    }

    const std::shared_ptr<const Fd> file_;
    std::string path_;
    std::int64_t nanoseconds_ = 0;
    std::vector<std::int32_t> audioTracks_;
};

}  // namespace

/// The role's face of an export.
class LinuxMovieExporter final : public MovieExporter {
public:
    LinuxMovieExporter(std::shared_ptr<MovieAsset> movie, ExportPreset preset, URL outputURL,
                       LinuxMovieExporters& exporters)
        : movie_(std::move(movie)), outputURL_(std::move(outputURL)), exporters_(exporters) {
        plan_.preset = preset;
        plan_.destination = outputURL_.path();
    }
    ~LinuxMovieExporter() override { cancel(); }

    URL outputURL() const override { return outputURL_; }
    void setTimeRange(MediaTimeRange range) override { plan_.range = range; }
    void setAudioMix(AudioMix mix) override { plan_.mix = std::move(mix); }
    void cancel() override {
        if (const auto running = job()) exporters_.cancel(running);
    }
    double progress() const override {
        const auto running = job();
        return running ? running->progress() : 0;
    }
    void exportAsynchronously(Completion completion) override {
        const auto* const movie = dynamic_cast<const LinuxMovieAsset*>(movie_.get());
        std::optional<Error> refusal;
        if (movie) {
            plan_.source = movie->path();
            plan_.sourceHeld = movie->held();
        }
        if (!movie) refusal = media::systemError(EINVAL);
        const auto made = std::make_shared<LinuxMovieExport>(plan_, std::move(completion), exporters_.lane());
        {
            const std::lock_guard lock(mutex_);
            if (job_) refusal = media::systemError(EALREADY);
            else job_ = made;
        }
        exporters_.run(made, std::move(refusal));
    }

private:
    std::shared_ptr<LinuxMovieExport> job() const {
        const std::lock_guard lock(mutex_);
        return job_;
    }

    const std::shared_ptr<MovieAsset> movie_;
    const URL outputURL_;
    LinuxMovieExporters& exporters_;
    media::ExportPlan plan_;
    mutable std::mutex mutex_;
    std::shared_ptr<LinuxMovieExport> job_;  ///< the first one
};

LinuxMovieExporters::LinuxMovieExporters() : LinuxMovieExporters(std::make_shared<media::PosixMovieFiles>()) {}

LinuxMovieExporters::LinuxMovieExporters(std::shared_ptr<media::MovieFiles> files, media::EncodingPriority priority)
    : files_(std::move(files)) {
    encodings_ = std::make_unique<media::EncodingQueue>(files_, priority);
    av_log_set_level(AV_LOG_QUIET);  // the library talks to the standard error output by itself
    av_max_alloc(kMostLibraryMemory);
}

LinuxMovieExporters::~LinuxMovieExporters() {
    for (const auto& job : running_) job->cancel();
}

std::shared_ptr<MovieAsset> LinuxMovieExporters::openMovie(const URL& url) {
    return std::make_shared<LinuxMovieAsset>(url);
}

std::shared_ptr<MovieExporter> LinuxMovieExporters::makeExporter(std::shared_ptr<MovieAsset> movie, ExportPreset preset,
                                                                 const URL& outputURL) {
    return std::make_shared<LinuxMovieExporter>(std::move(movie), preset, outputURL, *this);
}

void LinuxMovieExporters::run(const std::shared_ptr<LinuxMovieExport>& job, std::optional<Error> refusal) {
    const std::lock_guard lock(mutex_);
    if (isEnding_) return job->forget();
    // Joining a thread that has ended takes no time.
    std::erase_if(running_, [](const auto& other) { return other->hasEnded(); });
    if (!refusal && job->isEncoding()) return encodings_->add(job);
    if (!refusal) {
        running_.push_back(job);
        if (job->start(files_)) return;
        running_.pop_back();
        refusal = media::systemError(EAGAIN);
    }
    job->tellLater(ExportStatus::Failed, std::move(refusal));
}

void LinuxMovieExporters::forgetAll() {
    const std::lock_guard lock(mutex_);
    isEnding_ = true;
    ending_ = running_;
    if (auto encoding = encodings_->forgetAll()) ending_.push_back(std::move(encoding));
    for (const auto& job : ending_) job->forget();
}

void LinuxMovieExporters::removeUnfinished(std::chrono::milliseconds patience) {
    std::vector<std::shared_ptr<LinuxMovieExport>> ending;
    {
        const std::lock_guard lock(mutex_);
        ending = ending_;
    }
    const auto deadline = std::chrono::steady_clock::now() + patience;
    for (const auto& job : ending) job->removeUnfinished(deadline);
}

/// One that waits for its turn ends at once; one that runs sees it soon.
void LinuxMovieExporters::cancel(const std::shared_ptr<LinuxMovieExport>& job) {
    job->cancel();
    if (encodings_->remove(job)) job->tellLater(ExportStatus::Cancelled, media::systemError(ECANCELED));
}

}  // namespace lumacast
