#include "writer/LCMovieWriter.h"

#include "writer/MovieSettings.h"

namespace lumacast {

namespace {

/// A time counts as set exactly when it is unequal to the invalid time.
bool isSet(const MediaTime& time) { return compare(time, kInvalidMediaTime) != 0; }

/// Deliberately compares raw ticks: all samples of one track carry the same timescale, and an equal one is a duplicate.
bool isNotLater(const SampleRef& sample, const MediaTime& last) {
    return isSet(last) && sample->presentationTime().value <= last.value;
}

}  // namespace

LCMovieWriter::LCMovieWriter(const Platform& platform, TempStore& tempStore, Size windowSize, std::string outputPath)
    : platform_(platform),
      log_(platform.log),
      tempStore_(tempStore),
      windowSize_(windowSize),
      outputPath_(std::move(outputPath)),
      movieWriterQueue_(platform.scheduler.serialQueue("com.orvane.Lumacast.LCMovieWriterQueue")) {}

void LCMovieWriter::startWritingHandler(Handler handler) {
    movieWriterQueue_->async([self = shared_from_this(), handler = std::move(handler)]() mutable {
        self->dispatchedStartWritingHandler(std::move(handler));
    });
}

void LCMovieWriter::dispatchedStartWritingHandler(Handler handler) {
    log_.line("LCMovieWriter: startWritingHandler");
    auto setUp = [self = shared_from_this(), handler = std::move(handler)](std::optional<Error>) {
        self->dispatchedSetupAssetWriter();
        handler();
    };
    if (pathClaim_)
        tempStore_.removeFileOfClaim(outputURL(), *pathClaim_, std::move(setUp));
    else
        tempStore_._srRemoveFile(outputURL(), std::move(setUp));
}

void LCMovieWriter::setupAssetWriter() {
    movieWriterQueue_->sync([this] { dispatchedSetupAssetWriter(); });
}

void LCMovieWriter::dispatchedSetupAssetWriter() {
    log_.line("LCMovieWriter: setupAssetWriter");
    resetSampleQueues();
    {
        const std::lock_guard lock(samplesMutex_);
        lastVideoPresentationTime_ = lastAudio1PresentationTime_ = lastAudio2PresentationTime_ = kInvalidMediaTime;
    }
    auto made = platform_.containerWriters.make(outputURL(), ContainerType::Mpeg4);
    if (const Error* error = std::get_if<Error>(&made)) {
        log_.error("LCMovieWriter: setupAssetWriter error: %i", error->code());
        return;
    }
    Tracks tracks;
    tracks.assetWriter = std::move(std::get<std::unique_ptr<ContainerWriter>>(made));
    tracks.videoInput = tracks.assetWriter->addVideoInput(videoSettings(platform_, windowSize_, broadcastConfig_));
    tracks.audioInput1 = tracks.assetWriter->addAudioInput(audioSettings());
    tracks.audioInput2 = tracks.assetWriter->addAudioInput(audioSettings());
    for (const auto& input : {tracks.videoInput, tracks.audioInput1, tracks.audioInput2})
        if (input) input->setExpectsMediaInRealTime(true);
    tracks_.set(std::move(tracks));
}

void LCMovieWriter::resetSampleQueues() {
    const std::lock_guard lock(samplesMutex_);
    videoBufferQueue_.reset();
    audioBufferQueue1_.reset();
    audioBufferQueue2_.reset();
}

bool LCMovieWriter::appendVideoSampleBuffer(const SampleRef& sample, const AffineTransform& windowTransform) {
    const auto append = [&] { dispatchedAppendVideoSampleBuffer(sample, windowTransform); };
    movieWriterQueue_->sync(std::cref(append));  // a reference takes no memory
    return true;
}

void LCMovieWriter::dispatchedAppendVideoSampleBuffer(const SampleRef& sample, const AffineTransform& windowTransform) {
    const Tracks current = tracks();
    if (!current.assetWriter || !sample) return;
    // Deliberately, the start path is taken until the first sample was processed, even when the writer writes already:
    // its second start then fails.
    if (current.assetWriter->status() == ContainerStatus::Writing && didProcessFirstSample_)
        drainVideo(current, sample);
    else
        startWithFirstSample(current, sample, windowTransform);
}

void LCMovieWriter::startWithFirstSample(const Tracks& tracks, const SampleRef& sample,
                                         const AffineTransform& windowTransform) {
    if (tracks.videoInput) tracks.videoInput->setTransform(windowTransform);
    if (!tracks.assetWriter->startWriting() || tracks.assetWriter->status() != ContainerStatus::Writing) {
        log_.line("ERROR starting asset writer");
        return;
    }
    const MediaTime time = sample->presentationTime();
    if (!time.isValid()) return;
    tracks.assetWriter->startSession(time);
    // The first frame passes by the queue and the ordering test and deliberately does not become the last time.
    if (!tracks.videoInput || !tracks.videoInput->isReadyForMoreMediaData()) return;
    tracks.videoInput->append(sample);
    didProcessFirstSample_ = true;
}

void LCMovieWriter::drainVideo(const Tracks& tracks, const SampleRef& sample) {
    if (videoBufferQueue_.enqueue(sample) != 0) {
        log_.line("ERROR Enqueing the Sample Video Buffer");
        return;
    }
    while (tracks.videoInput->isReadyForMoreMediaData() && !videoBufferQueue_.isEmpty()) {
        const SampleRef oldest = videoBufferQueue_.dequeueAndRetain();
        if (isNotLater(oldest, lastVideoPresentationTime_)) {
            // The rest deliberately stays queued for the next call.
            log_.line("discarding video sample buffer due to timestamp earlier than previous");
            return;
        }
        log_.sample("appending video sample");
        lastVideoPresentationTime_ = oldest->presentationTime();
        tracks.videoInput->append(oldest);
    }
}

void LCMovieWriter::appendAudio1SampleBuffer(const SampleRef& sample) {
    movieWriterQueue_->sync([&] { dispatchedAppendAudio1SampleBuffer(sample); });
}

void LCMovieWriter::appendAudio2SampleBuffer(const SampleRef& sample) {
    movieWriterQueue_->sync([&] { dispatchedAppendAudio2SampleBuffer(sample); });
}

void LCMovieWriter::dispatchedAppendAudio1SampleBuffer(const SampleRef& sample) {
    const Tracks current = tracks();
    appendAudio(
        sample, current, current.audioInput1.get(), audioBufferQueue1_, lastAudio1PresentationTime_,
        [this] { log_.line("discarding audio 1 sample buffer due to timestamp earlier than previous"); },
        [this](const SampleRef& next) {
            log_.sample("appending audio 1 sample with timestamp:%lld duration:%lld", next->presentationTime().value,
                        next->duration().value);
        });
}

void LCMovieWriter::dispatchedAppendAudio2SampleBuffer(const SampleRef& sample) {
    const Tracks current = tracks();
    appendAudio(
        sample, current, current.audioInput2.get(), audioBufferQueue2_, lastAudio2PresentationTime_,
        [this] { log_.line("discarding audio 2 sample buffer due to timestamp earlier than previous"); },
        [this](const SampleRef& next) {
            log_.sample("appending audio 2 sample with timestamp:%lld duration:%lld", next->presentationTime().value,
                        next->duration().value);
        });
}

template <class Discarded, class Appending>
void LCMovieWriter::appendAudio(const SampleRef& sample, const Tracks& tracks, TrackInput* input, SampleQueue& queue,
                                MediaTime& last, Discarded discarded, Appending appending) {
    // Sound never starts the writer: what comes before the first picture is deliberately dropped.
    if (!tracks.assetWriter || !sample || tracks.assetWriter->status() != ContainerStatus::Writing ||
        !didProcessFirstSample_ || !input)
        return;
    if (queue.enqueue(sample) != 0) {
        log_.line("ERROR Enqueing the Sample Audio Buffer");
        return;
    }
    while (input->isReadyForMoreMediaData() && !queue.isEmpty()) {
        const SampleRef oldest = queue.dequeueAndRetain();
        if (isNotLater(oldest, last)) {
            discarded();
            return;
        }
        appending(oldest);
        last = oldest->presentationTime();
        input->append(oldest);
    }
}

void LCMovieWriter::notifyRecordingMayBeStopped() {
    movieWriterQueue_->sync([this] {
        const std::lock_guard lock(samplesMutex_);  // set-up may still be running
        trimVideoPresentationTime_ = lastVideoPresentationTime_;
    });
}

void LCMovieWriter::notifyRecordingResumed() {
    movieWriterQueue_->sync([this] { trimVideoPresentationTime_ = kInvalidMediaTime; });
}

void LCMovieWriter::finishWritingWithHandler(URLHandler handler) {
    movieWriterQueue_->async([self = shared_from_this(), handler = std::move(handler)]() mutable {
        self->dispatchedFinishWritingWithHandler(std::move(handler));
    });
}

void LCMovieWriter::dispatchedFinishWritingWithHandler(URLHandler handler) {
    if (isFinishingWriting_.exchange(true)) return;  // deliberately without calling the handler
    resetSampleQueues();
    const auto writer = assetWriter();
    const auto status = writer ? writer->status() : ContainerStatus::Unknown;
    log_.line("LCMovieWriter: finishWritingWithHandler: status = %i", status);
    if (!didProcessFirstSample_) {
        log_.line("LCMovieWriter: finishWritingWithHandler: first sample buffer was not processed or appended");
        handler(std::nullopt);
        return;
    }
    if (status != ContainerStatus::Writing) {
        if (writer) {
            log_.line("not writing, returning video url set on assetwriter (most likely nil)");
            const auto error = writer->error();
            log_.line("asset writer error = %i", error ? error->code() : std::int64_t{0});
            handler(writer->outputURL());
        } else {
            handler(std::nullopt);
        }
        didProcessFirstSample_ = false;
        return;
    }
    if (isSet(trimVideoPresentationTime_)) {
        writer->endSession(trimVideoPresentationTime_);
        trimVideoPresentationTime_ = kInvalidMediaTime;
    }
    writer->finishWriting([self = shared_from_this(), writer, handler = std::move(handler)] {
        handler(writer->outputURL());
        self->didProcessFirstSample_ = false;
    });
}

void LCMovieWriter::trimMovieWithURL(const URL& url, double startClipDuration, double endClipDuration,
                                     const URL& outputFileURL, std::function<void(URL)> handler) {
    movieWriterQueue_->async([self = shared_from_this(), url, startClipDuration, endClipDuration, outputFileURL,
                              handler = std::move(handler)] {
        self->dispatchedTrimMovieWithURL(url, startClipDuration, endClipDuration, outputFileURL, handler);
    });
}

void LCMovieWriter::dispatchedTrimMovieWithURL(const URL& url, double startClipDuration, double endClipDuration,
                                               const URL& outputFileURL, std::function<void(URL)> handler) {
    tempStore_._srRemoveFile(outputFileURL, [self = shared_from_this(), url, startClipDuration, endClipDuration,
                                             outputFileURL, handler = std::move(handler)](std::optional<Error>) {
        const auto movie = self->platform_.movieExporters.openMovie(url);
        const auto exporter =
            self->platform_.movieExporters.makeExporter(movie, ExportPreset::PassThrough, outputFileURL);
        // Deliberately whole seconds, both.
        const MediaTime start = MediaTime::fromSeconds(startClipDuration, 1);
        const MediaTime end = subtract(movie->duration(), MediaTime::fromSeconds(endClipDuration, 1));
        exporter->setTimeRange({start, subtract(end, start)});
        exporter->exportAsynchronously([self, exporter, handler](ExportStatus status, std::optional<Error> error) {
            if (status == ExportStatus::Failed) {
                self->log_.line("LCMovieWriter: Export Trim Video Failed, due to error: %i",
                                error ? error->code() : std::int64_t{0});
            } else if (status == ExportStatus::Cancelled) {
                self->log_.line("LCMovieWriter: Export Trim Video Cancelled");
            } else {
                self->log_.line("LCMovieWriter: Export Trim succeeded");
                handler(exporter->outputURL());
            }
        });
    });
}

}  // namespace lumacast
