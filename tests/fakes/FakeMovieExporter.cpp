#include "tests/fakes/FakeMovieExporter.h"

#include <atomic>
#include <cerrno>
#include <mutex>
#include <utility>

#include "tests/fakes/FakeError.h"

namespace lumacast {

namespace {

constexpr std::uint64_t kBytesOfSample = 1000;

class FakeMovieAsset final : public MovieAsset {
public:
    explicit FakeMovieAsset(std::shared_ptr<const FakeMovie> movie) : movie_(std::move(movie)) {}
    MediaTime duration() const override { return movie_ ? movie_->duration() : kZeroMediaTime; }
    std::vector<std::int32_t> audioTracks() const override {
        std::vector<std::int32_t> tracks;
        for (std::size_t i = 0; movie_ && i < movie_->tracks.size(); ++i)
            if (movie_->tracks[i].type == MediaType::Audio) tracks.push_back(static_cast<std::int32_t>(i) + 1);
        return tracks;
    }
    const std::shared_ptr<const FakeMovie>& movie() const { return movie_; }

private:
    const std::shared_ptr<const FakeMovie> movie_;
};

/// The picture with another stamp.
SampleRef restamped(const SampleRef& sample, MediaTime stamp) {
    std::vector<SampleTiming> timing(sample->timing().begin(), sample->timing().end());
    timing.front().presentation = stamp;
    return sample->copyWithTiming(std::move(timing));
}

/// The samples from `start` up to `end`. A picture that is shown at the start is shown from there on.
FakeTrack cut(const FakeTrack& track, MediaTime start, MediaTime end) {
    FakeTrack result{track.type, track.settings, {}};
    SampleRef shownAtStart;
    for (const SampleRef& sample : track.samples) {
        if (compare(sample->presentationTime(), start) <= 0) shownAtStart = sample;
        if (compare(sample->presentationTime(), start) > 0 && compare(sample->presentationTime(), end) < 0)
            result.samples.push_back(sample);
    }
    if (shownAtStart && track.type == MediaType::Video)
        result.samples.insert(result.samples.begin(), restamped(shownAtStart, start));
    return result;
}

/// One export: shared by the exporter and its task.
struct Export {
    FakeFileSystem& files;
    FaultPlan& faults;
    std::shared_ptr<const FakeMovie> movie;
    URL outputURL;
    ExportPreset preset = ExportPreset::PassThrough;
    std::optional<MediaTimeRange> range;
    std::optional<AudioMix> mix;
    std::atomic<bool> begun{false}, cancelled{false};
    std::atomic<double> progress{0};

    /// Whether the track with this number, from 0 on, is in the new movie: of a mix only the first of the mixed ones,
    /// for all of them.
    bool keeps(std::size_t index) const {
        if (preset == ExportPreset::PassThrough || !mix || movie->tracks[index].type != MediaType::Audio) return true;
        for (std::size_t i = 0; i <= index; ++i)
            for (const AudioMixInputParameters& input : mix->inputParameters)
                if (movie->tracks[i].type == MediaType::Audio && input.trackID == static_cast<std::int32_t>(i) + 1)
                    return i == index;
        return false;
    }

    std::optional<Error> run() {
        if (faults.fails("MovieExporter.export")) return fakeSystemError(EIO);
        if (!movie || compare(movie->duration(), kZeroMediaTime) <= 0) return fakeSystemError(ENODATA);
        const MediaTimeRange part = range.value_or(MediaTimeRange{kZeroMediaTime, movie->duration()});
        const MediaTime partEnd = add(part.start, part.duration);
        if (!partEnd.isValid() || compare(part.start, kZeroMediaTime) < 0 ||
            compare(part.duration, kZeroMediaTime) <= 0 || compare(partEnd, movie->duration()) > 0)
            return fakeSystemError(EINVAL);
        auto created = files.create(outputURL.path());
        if (const Error* error = std::get_if<Error>(&created)) return *error;
        const std::shared_ptr<FakeFile> file = std::get<0>(std::move(created));
        auto copy = std::make_shared<FakeMovie>();
        copy->start = add(movie->start, part.start);
        copy->end = add(movie->start, partEnd);
        copy->finished = true;
        std::uint64_t samples = 0;
        for (std::size_t i = 0; i < movie->tracks.size(); ++i) {
            if (!keeps(i)) continue;
            copy->tracks.push_back(cut(movie->tracks[i], copy->start, copy->end));
            samples += copy->tracks.back().samples.size();
        }
        if (!files.append(*file, samples * kBytesOfSample)) {
            (void)files.remove(outputURL.path());
            return fakeSystemError(ENOSPC);
        }
        files.setMovie(*file, std::move(copy));
        return std::nullopt;
    }
};

class FakeMovieExporter final : public MovieExporter {
public:
    FakeMovieExporter(FakeMovieExporters& owner, Scheduler& scheduler, std::shared_ptr<Export> job)
        : owner_(owner), scheduler_(scheduler), export_(std::move(job)) {}
    ~FakeMovieExporter() override { export_->cancelled = true; }

    URL outputURL() const override { return export_->outputURL; }
    void setTimeRange(MediaTimeRange range) override { export_->range = range; }
    void setAudioMix(AudioMix mix) override {
        owner_.noteMix(mix);
        export_->mix = std::move(mix);
    }
    void cancel() override {
        if (export_->begun) export_->cancelled = true;
    }
    double progress() const override { return export_->progress; }
    void exportAsynchronously(Completion completion) override {
        const bool isSecond = export_->begun.exchange(true);
        scheduler_.globalQueue(QueuePriority::Default).async([job = export_, isSecond,
                                                              completion = std::move(completion)] {
            if (isSecond) return completion(ExportStatus::Failed, fakeSystemError(EALREADY));
            if (job->cancelled) return completion(ExportStatus::Cancelled, fakeSystemError(ECANCELED));
            const std::optional<Error> error = job->run();
            if (!error) job->progress = 1;
            completion(error ? ExportStatus::Failed : ExportStatus::Completed, error);
        });
    }

private:
    FakeMovieExporters& owner_;
    Scheduler& scheduler_;
    const std::shared_ptr<Export> export_;
};

}  // namespace

std::shared_ptr<MovieAsset> FakeMovieExporters::openMovie(const URL& url) {
    if (whenOpened_) whenOpened_(url);
    if (faults_.fails("MovieExporters.openMovie")) return std::make_shared<FakeMovieAsset>(nullptr);
    return std::make_shared<FakeMovieAsset>(files_.movie(url.path()));
}

std::shared_ptr<MovieExporter> FakeMovieExporters::makeExporter(std::shared_ptr<MovieAsset> movie,
                                                                ExportPreset preset, const URL& outputURL) {
    const auto* fake = dynamic_cast<const FakeMovieAsset*>(movie.get());
    auto job = std::shared_ptr<Export>(
        new Export{files_, faults_, fake ? fake->movie() : nullptr, outputURL, preset, {}, {}, {}, {}, {}});
    {
        const std::lock_guard lock(mutex_);
        presets_.push_back(preset);
    }
    return std::make_shared<FakeMovieExporter>(*this, scheduler_, std::move(job));
}

}  // namespace lumacast
