#include "linux/media/MovieRecording.h"

#include <pthread.h>

#include <algorithm>
#include <cerrno>
#include <system_error>
#include <utility>

namespace lumacast::media {

MovieRecording::MovieRecording(std::shared_ptr<MovieFiles> files, std::string path,
                               std::shared_ptr<CaptureClock> clock, std::shared_ptr<EncoderChoice> choice,
                               CompletionLane& lane)
    : clock_(std::move(clock)), choice_(std::move(choice)), lane_(lane),
      disk_(std::move(files), std::move(path), [this](int error) { fail(systemError(error)); }) {}

MovieRecording::~MovieRecording() {
    abandon();
    if (thread_.joinable()) thread_.join();
}

// --- Called by the owner's lanes -------------------------------------------------------------------------------------

std::optional<std::size_t> MovieRecording::addTrack(TrackPlan plan) {
    const std::lock_guard lock(mutex_);
    const auto isVideo = [](const Track& track) { return track.plan.isVideo(); };
    const bool isSecondPicture = plan.isVideo() && std::any_of(tracks_.begin(), tracks_.end(), isVideo);
    if (status_ != ContainerStatus::Unknown || isSecondPicture) return std::nullopt;
    tracks_.push_back({std::move(plan), 0, std::nullopt});
    return tracks_.size() - 1;
}

void MovieRecording::setTransform(std::size_t track, const AffineTransform& transform) {
    const std::lock_guard lock(mutex_);
    if (status_ == ContainerStatus::Unknown) tracks_[track].plan.transform = transform;
}

bool MovieRecording::startWriting() {
    const std::lock_guard lock(mutex_);
    if (status_ != ContainerStatus::Unknown || tracks_.empty() || abandoned_) return false;
    status_ = ContainerStatus::Writing;
    try {
        thread_ = std::thread([this] { run(); });
    } catch (const std::system_error&) {
        failLocked(systemError(EAGAIN));
        return false;
    }
    return true;
}

void MovieRecording::startSession(MediaTime time) {
    const std::lock_guard lock(mutex_);
    if (status_ == ContainerStatus::Writing && !sessionStart_) sessionStart_ = nanosecondsOf(time);
}

void MovieRecording::endSession(MediaTime time) {
    const std::lock_guard lock(mutex_);
    if (status_ == ContainerStatus::Writing && sessionStart_ && !finishing_) sessionEnd_ = nanosecondsOf(time);
}

bool MovieRecording::hasRoom(std::size_t track) const {
    const std::lock_guard lock(mutex_);
    return tracks_[track].waiting < tracks_[track].depth();
}

bool MovieRecording::append(std::size_t number, const SampleRef& sample) {
    if (!sample) return false;
    const auto stamp = nanosecondsOf(sample->presentationTime());
    const std::lock_guard lock(mutex_);
    if (status_ != ContainerStatus::Writing || finishing_ || !sessionStart_ || !stamp) return false;
    Track& track = tracks_[number];
    const bool isVideo = sample->format().type == MediaType::Video;
    if (isVideo != track.plan.isVideo() || track.waiting >= track.depth()) return false;

    const bool isRepeat = track.lastNanoseconds && *stamp <= *track.lastNanoseconds;
    const bool isEarly = isVideo && *stamp < *sessionStart_;  // sound is cut where the session begins
    const bool isLate = sessionEnd_ && *stamp > *sessionEnd_;
    if (isRepeat || isEarly || isLate) return true;
    track.lastNanoseconds = stamp;
    track.waiting += 1;
    if (isVideo) picturesTaken_.fetch_add(1, std::memory_order_relaxed);
    items_.push_back({number, sample, *stamp - *sessionStart_});
    changed_.notify_all();
    return true;
}

void MovieRecording::finish(std::function<void()> completion) {
    const std::lock_guard lock(mutex_);
    finishLocked();
    if (ended_.load(std::memory_order_relaxed)) return lane_.post(std::move(completion));
    completions_.push_back(std::move(completion));
    changed_.notify_all();
}

void MovieRecording::finishLocked() {
    if (finishing_) return;
    finishing_ = true;
    if (clock_) clockAtFinish_ = nanosecondsOf(clock_->now());
    if (status_ == ContainerStatus::Unknown) failLocked(systemError(ENODATA));
}

void MovieRecording::abandon() {
    const std::lock_guard lock(mutex_);
    abandoned_ = true;
    if (!thread_.joinable()) endWithoutThread();
    changed_.notify_all();
}

ContainerStatus MovieRecording::status() const {
    const std::lock_guard lock(mutex_);
    return status_;
}

std::optional<Error> MovieRecording::error() const {
    const std::lock_guard lock(mutex_);
    return error_;
}

std::optional<ClosedMovie> MovieRecording::requestFinish() {
    const std::lock_guard lock(mutex_);
    if (status_ != ContainerStatus::Writing || finishing_) return std::nullopt;
    finishLocked();
    changed_.notify_all();
    ClosedMovie closed;
    constexpr double kNanosecondsPerSecond = 1e9;
    if (const auto end = movieEnd().lastPicture) closed.seconds = static_cast<double>(*end) / kNanosecondsPerSecond;
    for (const Track& track : tracks_)
        if (const auto* video = std::get_if<VideoTrackSettings>(&track.plan.settings)) {
            closed.width = video->width;
            closed.height = video->height;
        }
    closed.pictures = picturesTaken();
    closed.bytes = bytesWritten();
    return closed;
}

bool MovieRecording::waitUntilFinished(std::chrono::steady_clock::time_point deadline) {
    std::unique_lock lock(mutex_);
    return changed_.wait_until(lock, deadline, [this] { return status_ != ContainerStatus::Writing; });
}

std::uint64_t MovieRecording::requestSecuring() {
    const std::lock_guard lock(mutex_);
    secureAfter_ = itemsTaken_.load(std::memory_order_relaxed) + items_.size();
    changed_.notify_all();
    return ++securingsWanted_;
}

bool MovieRecording::waitUntilSecured(std::uint64_t request, std::chrono::steady_clock::time_point deadline) {
    std::unique_lock lock(mutex_);
    return changed_.wait_until(lock, deadline, [&] {
        return securingsDone_ >= request || status_ != ContainerStatus::Writing;
    });
}

// --- Called with the lock held ---------------------------------------------------------------------------------------

void MovieRecording::failLocked(Error error) {
    if (status_ != ContainerStatus::Unknown && status_ != ContainerStatus::Writing) return;
    status_ = ContainerStatus::Failed;
    error_ = std::move(error);
    if (!thread_.joinable()) endWithoutThread();
    changed_.notify_all();
}

/// Where the encoder thread was never started, and never will be.
void MovieRecording::endWithoutThread() {
    disk_.close(DiskWriter::Pending::Drop);
    ended_.store(true, std::memory_order_release);
}

void MovieRecording::fail(Error error) {
    const std::lock_guard lock(mutex_);
    failLocked(std::move(error));
}

/// The end of the session where one was set, else the time of the recording's clock.
MoviePipeline::End MovieRecording::movieEnd() const {
    if (!sessionStart_) return {};
    if (sessionEnd_) return {*sessionEnd_ - *sessionStart_, *sessionEnd_ - *sessionStart_};
    if (clockAtFinish_) return {*clockAtFinish_ - *sessionStart_, std::nullopt};
    return {};
}

std::optional<MovieRecording::Item> MovieRecording::takeItem() {
    if (items_.empty()) return std::nullopt;
    Item item = std::move(items_.front());
    items_.pop_front();
    tracks_[item.track].waiting -= 1;
    itemsTaken_.fetch_add(1, std::memory_order_relaxed);
    return item;
}

/// Whether all that was appended before the newest request has been taken.
bool MovieRecording::securesNow(bool hasItem) const {
    return securingsDone_ != securingsWanted_ &&
           (!hasItem || itemsTaken_.load(std::memory_order_relaxed) >= secureAfter_);
}

// --- The encoder thread ----------------------------------------------------------------------------------------------

void MovieRecording::run() {
    pthread_setname_np(pthread_self(), "lc-encoder");  // the encoder's own threads inherit it
    std::unique_lock lock(mutex_);
    runPipeline(lock);
    // Finished, failed or abandoned: no sample is taken any more, and whoever asks after this is told on the lane.
    disk_.close(DiskWriter::Pending::Write);
    items_.clear();
    for (Track& track : tracks_) track.waiting = 0;
    runCompletions(lock);
    ended_.store(true, std::memory_order_release);
}

/// From the start of writing until the movie is finished, has failed or nobody wants it any more.
void MovieRecording::runPipeline(std::unique_lock<std::mutex>& lock) {
    std::vector<TrackPlan> plans;
    for (const Track& track : tracks_) plans.push_back(track.plan);
    lock.unlock();
    auto opened = MoviePipeline::open(plans, *choice_, disk_);
    lock.lock();
    if (auto* const error = std::get_if<Error>(&opened)) return failLocked(*error);
    const auto pipeline = std::move(std::get<0>(opened));

    while (status_ == ContainerStatus::Writing) {
        const bool flushes = waitForWork(lock, pipeline->flushTime());
        std::optional<Item> item = takeItem();
        if (!item && finishing_) return finishPipeline(lock, pipeline.get());
        const bool isLast = !item && abandoned_;
        const bool secures = securesNow(item.has_value());
        const std::uint64_t securing = securingsWanted_;
        lock.unlock();
        std::optional<Error> error;
        if (item) error = pipeline->add(item->track, std::move(item->sample), item->nanoseconds);
        if (!error && (flushes || isLast || secures)) error = pipeline->flush();
        if (!error && secures) {
            if (const int diskError = disk_.drain(); diskError != 0) error = systemError(diskError);
        }
        lock.lock();
        if (error) return failLocked(*error);
        if (secures) {
            securingsDone_ = securing;
            changed_.notify_all();
        }
        if (isLast) {
            status_ = ContainerStatus::Cancelled;
            changed_.notify_all();
            return;
        }
    }
}

/// Waits for a sample, for the end, or for the time at which pending samples are due on the disk; whether they are.
bool MovieRecording::waitForWork(std::unique_lock<std::mutex>& lock, std::optional<MoviePipeline::SteadyTime> until) {
    const auto woken = [this] {
        return !items_.empty() || finishing_ || abandoned_ || status_ != ContainerStatus::Writing || securesNow(false);
    };
    if (until) {
        changed_.wait_until(lock, *until, woken);
    } else {
        changed_.wait(lock, woken);
    }
    return until && std::chrono::steady_clock::now() >= *until;
}

void MovieRecording::finishPipeline(std::unique_lock<std::mutex>& lock, MoviePipeline* pipeline) {
    const auto end = movieEnd();
    lock.unlock();
    auto error = pipeline->finish(end);
    const int diskError = disk_.drain();
    lock.lock();
    if (diskError != 0) error = systemError(diskError);
    if (error) return failLocked(*error);
    if (status_ != ContainerStatus::Writing) return;
    status_ = ContainerStatus::Completed;
    changed_.notify_all();
}

void MovieRecording::runCompletions(std::unique_lock<std::mutex>& lock) {
    while (!completions_.empty()) {
        auto completions = std::exchange(completions_, {});
        lock.unlock();
        for (const auto& completion : completions) {
            if (completion) completion();
        }
        completions.clear();  // without the lock: one of them may hold the last reference to the writer
        lock.lock();
    }
}

}  // namespace lumacast::media
