#pragma once
#include <array>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "linux/media/CompletionLane.h"
#include "linux/media/MoviePipeline.h"
#include "platform/CaptureClock.h"
#include "platform/ContainerWriter.h"

namespace lumacast::media {

/// What can be said of a movie that ends with the process.
struct ClosedMovie {
    std::string path;
    double seconds = 0;  ///< as long as its recording
    int width = 0, height = 0;
    std::uint64_t pictures = 0;  ///< that were taken
    std::uint64_t bytes = 0;     ///< in the file when it was told to end
};

/// One movie being written: its state, the bounded queues of its tracks, its encoder thread and its file thread. Every
/// operation may come from any lane and returns at once; none waits for the encoder or the disk, but where it says so.
/// Once the movie is over, finished or failed, the file is closed and the threads end, whoever keeps the object.
class MovieRecording final {
public:
    /// Pictures that wait for the encoder. One more may be held while it is converted: a pool must have more than
    /// kPlanesHeld planes for the source to go on.
    static constexpr std::size_t kPictureQueueDepth = 3;
    static constexpr std::size_t kPlanesHeld = kPictureQueueDepth + 1;
    /// Sound buffers that wait for the encoder: about five seconds of a tap.
    static constexpr std::size_t kSoundQueueDepth = 256;

    /// Begins creating the file. The clock may be null: the last picture then lasts as long as it says itself. `lane`
    /// tells those who finish what has no encoder thread (any more); it must outlive every call of finish.
    MovieRecording(std::shared_ptr<MovieFiles> files, std::string path, std::shared_ptr<CaptureClock> clock,
                   std::shared_ptr<EncoderChoice> choice, CompletionLane& lane);
    MovieRecording(const MovieRecording&) = delete;
    MovieRecording& operator=(const MovieRecording&) = delete;
    /// Waits for the threads: not to be the last holder on a lane that must not wait, unless hasEnded().
    ~MovieRecording();

    /// Waits for the file's creation, at most `limit`: the error's number, 0 for success, none when the disk is silent.
    std::optional<int> waitForCreation(std::chrono::milliseconds limit) { return disk_.waitForCreation(limit); }

    /// Adds a track; its number, or none once writing has started, and for a second picture track.
    std::optional<std::size_t> addTrack(TrackPlan plan);
    void setTransform(std::size_t track, const AffineTransform& transform);
    /// Where the system has no thread the movie fails with EAGAIN.
    bool startWriting();
    void startSession(MediaTime time);
    void endSession(MediaTime time);
    bool hasRoom(std::size_t track) const;
    bool append(std::size_t track, const SampleRef& sample);
    /// Ends the recording at the end of its session, or now. `completion` runs once, on the encoder thread; on the lane
    /// where there is none.
    void finish(std::function<void()> completion);
    /// Nobody will call any more: what was asked for is finished, else the file is closed as it is; then the threads
    /// end.
    void abandon();

    ContainerStatus status() const;
    std::optional<Error> error() const;
    std::uint64_t bytesWritten() const { return disk_.bytesWritten(); }
    std::uint64_t picturesTaken() const { return picturesTaken_.load(std::memory_order_relaxed); }

    /// Whether both threads have nothing left to do but end.
    bool hasEnded() const { return ended_.load(std::memory_order_acquire) && disk_.hasEnded(); }
    /// As finish, for the end of the process: only where something is being written, and nobody is told. Answers the
    /// movie (its path is left to the caller) if it was being recorded; none when it was at its end already.
    std::optional<ClosedMovie> requestFinish();
    /// Waits until nothing is being written any more, or until `deadline`; whether nothing is.
    bool waitUntilFinished(std::chrono::steady_clock::time_point deadline);
    /// Goes on as long as the encoder and the disk do their work.
    std::uint64_t progress() const { return itemsTaken_.load(std::memory_order_relaxed) + disk_.answers(); }

    /// Asks that everything appended until now be brought onto the disk for good; the recording goes on. Answers what
    /// waitUntilSecured is to be asked with.
    std::uint64_t requestSecuring();
    /// Waits until that is so, the movie is over, or until `deadline`; false for the last.
    bool waitUntilSecured(std::uint64_t request, std::chrono::steady_clock::time_point deadline);

private:
    struct Track {
        TrackPlan plan;
        std::size_t waiting = 0;
        std::optional<std::int64_t> lastNanoseconds;  ///< the stamp of the last sample that was appended
        std::size_t depth() const { return plan.isVideo() ? kPictureQueueDepth : kSoundQueueDepth; }
    };
    struct Item {
        std::size_t track = 0;
        SampleRef sample;
        std::int64_t nanoseconds = 0;  ///< after the movie's zero
    };

    void run();
    void runPipeline(std::unique_lock<std::mutex>& lock);
    bool waitForWork(std::unique_lock<std::mutex>& lock, std::optional<MoviePipeline::SteadyTime> until);
    std::optional<Item> takeItem();
    void finishPipeline(std::unique_lock<std::mutex>& lock, MoviePipeline* pipeline);
    void runCompletions(std::unique_lock<std::mutex>& lock);
    void fail(Error error);
    void failLocked(Error error);
    void endWithoutThread();
    MoviePipeline::End movieEnd() const;
    void finishLocked();
    bool securesNow(bool hasItem) const;

    const std::shared_ptr<CaptureClock> clock_;
    const std::shared_ptr<EncoderChoice> choice_;
    CompletionLane& lane_;

    mutable std::mutex mutex_;
    std::condition_variable changed_;
    ContainerStatus status_ = ContainerStatus::Unknown;
    std::optional<Error> error_;
    std::vector<Track> tracks_;
    std::deque<Item> items_;
    std::optional<std::int64_t> sessionStart_, sessionEnd_;  ///< nanoseconds of the samples' clock
    std::optional<std::int64_t> clockAtFinish_;
    std::vector<std::function<void()>> completions_;
    bool finishing_ = false;  ///< finish was asked for; no samples are taken
    bool abandoned_ = false;
    std::atomic<bool> ended_ = false;  ///< no encoder thread, and none will come; set with the lock held
    std::atomic<std::uint64_t> picturesTaken_ = 0;
    std::atomic<std::uint64_t> itemsTaken_ = 0;  ///< by the encoder thread
    std::uint64_t securingsWanted_ = 0, securingsDone_ = 0;
    std::uint64_t secureAfter_ = 0;  ///< items taken: what was appended before the newest request

    std::thread thread_;
    DiskWriter disk_;  ///< last: its thread uses the rest as soon as it is made, and until it has gone
};

}  // namespace lumacast::media
