#pragma once
// One recording's movie file.

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "base/Guarded.h"
#include "broadcast/LCBroadcastConfiguration.h"
#include "platform/Platform.h"
#include "support/TempStore.h"
#include "writer/media/SampleQueue.h"

namespace lumacast {

/// Turns the screen frames and the two sound streams of one recording into one MPEG-4 file: a picture track and two
/// sound tracks. Single use: one file per writer. Held by shared_ptr; its own work keeps it alive.
///
/// Lanes: appends and the two notifications are synchronous on the writer's queue; start, finish and trim asynchronous
/// on it. The set-up of startWritingHandler and its handler run on the temporary store's background queue; owners
/// append only after that handler has been called.
class LCMovieWriter : public std::enable_shared_from_this<LCMovieWriter> {
public:
    using Handler = std::function<void()>;
    using URLHandler = std::function<void(std::optional<URL>)>;

    /// `initWithWindowSize:outputPath:` — nothing is written to disk yet.
    LCMovieWriter(const Platform& platform, TempStore& tempStore, Size windowSize, std::string outputPath);
    virtual ~LCMovieWriter() = default;

    void setBroadcastConfig(std::optional<LCBroadcastConfiguration> config) { broadcastConfig_ = std::move(config); }
    /// Stored for the owner; the writer itself does not read it.
    void setSystemRecording(bool systemRecording) { systemRecording_ = systemRecording; }
    bool systemRecording() const { return systemRecording_; }

    /// The store's claim on the output path, see TempStore::claimPath: a start that comes late then leaves the file of
    /// a later writer alone. Set before the start; released with the writer.
    void setPathClaim(std::uint64_t claim) {
        pathClaim_ = claim;
        pathClaimHold_ = tempStore_.holdClaim(outputPath_, claim);
    }

    Size windowSize() const { return windowSize_; }
    const std::string& outputPath() const { return outputPath_; }
    URL outputURL() const { return URL::file(outputPath_); }
    SerialQueue& movieWriterQueue() { return *movieWriterQueue_; }
    bool didProcessFirstSample() const { return didProcessFirstSample_; }
    bool isFinishingWriting() const { return isFinishingWriting_; }
    /// The container writer; null before set-up and when it failed. Any lane.
    std::shared_ptr<ContainerWriter> assetWriter() const { return tracks().assetWriter; }

    /// `startWritingHandler:` — removes a stale file at the output path, sets up, and calls the handler whatever came
    /// of it.
    void startWritingHandler(Handler handler);
    /// `setupAssetWriter` — the set-up alone, synchronously; no stale file is removed.
    void setupAssetWriter();

    /// `appendVideoSampleBuffer:withWindowTransform:` — always true: a frame the writer can't use is dropped and
    /// logged, and a failure shows when the movie is finished.
    virtual bool appendVideoSampleBuffer(const SampleRef& sample, const AffineTransform& windowTransform);
    /// `appendAudio1SampleBuffer:` — the application's sound.
    void appendAudio1SampleBuffer(const SampleRef& sample);
    /// `appendAudio2SampleBuffer:` — the microphone.
    void appendAudio2SampleBuffer(const SampleRef& sample);
    /// `notifyRecordingMayBeStopped` — a stop that follows ends the movie at the last picture appended so far.
    void notifyRecordingMayBeStopped();
    /// `notifyRecordingResumed` — takes that back.
    void notifyRecordingResumed();

    /// `finishWritingWithHandler:` — the movie's URL, or none when no picture was written. The handler of a second
    /// finish is deliberately never called.
    void finishWritingWithHandler(URLHandler handler);

    /// `trimMovieWithURL:startClipDuration:endClipDuration:outputFileURL:handler:` — copies a finished movie without
    /// its first and last seconds, both rounded to whole ones, over `outputFileURL`. The handler is deliberately not
    /// called when that fails.
    void trimMovieWithURL(const URL& url, double startClipDuration, double endClipDuration, const URL& outputFileURL,
                          std::function<void(URL)> handler);

private:
    /// What set-up makes; published whole, behind a leaf lock, as set-up may run beside a finish.
    struct Tracks {
        std::shared_ptr<ContainerWriter> assetWriter;
        std::shared_ptr<TrackInput> videoInput, audioInput1, audioInput2;
    };

    Tracks tracks() const { return tracks_.get(); }
    void dispatchedStartWritingHandler(Handler handler);
    void dispatchedSetupAssetWriter();
    void dispatchedAppendVideoSampleBuffer(const SampleRef& sample, const AffineTransform& windowTransform);
    void startWithFirstSample(const Tracks& tracks, const SampleRef& sample, const AffineTransform& windowTransform);
    void drainVideo(const Tracks& tracks, const SampleRef& sample);
    void dispatchedAppendAudio1SampleBuffer(const SampleRef& sample);
    void dispatchedAppendAudio2SampleBuffer(const SampleRef& sample);
    template <class Discarded, class Appending>
    void appendAudio(const SampleRef& sample, const Tracks& tracks, TrackInput* input, SampleQueue& queue,
                     MediaTime& last, Discarded discarded, Appending appending);
    void dispatchedFinishWritingWithHandler(URLHandler handler);
    void dispatchedTrimMovieWithURL(const URL& url, double startClipDuration, double endClipDuration,
                                    const URL& outputFileURL, std::function<void(URL)> handler);
    void resetSampleQueues();

    const Platform platform_;
    Log& log_;
    TempStore& tempStore_;
    const Size windowSize_;
    const std::string outputPath_;
    std::optional<LCBroadcastConfiguration> broadcastConfig_;
    bool systemRecording_ = false;
    std::optional<std::uint64_t> pathClaim_;
    std::shared_ptr<void> pathClaimHold_;

    Guarded<Tracks> tracks_;
    std::atomic<bool> didProcessFirstSample_{false};
    std::atomic<bool> isFinishingWriting_{false};

    /// Guards the queues' resets and the times between set-up and finish; appends come only after set-up.
    std::mutex samplesMutex_;
    MediaTime trimVideoPresentationTime_ = kInvalidMediaTime;
    MediaTime lastVideoPresentationTime_ = kInvalidMediaTime;
    MediaTime lastAudio1PresentationTime_ = kInvalidMediaTime;
    MediaTime lastAudio2PresentationTime_ = kInvalidMediaTime;
    SampleQueue audioBufferQueue1_, audioBufferQueue2_, videoBufferQueue_;

    std::shared_ptr<SerialQueue> movieWriterQueue_;
};

}  // namespace lumacast
