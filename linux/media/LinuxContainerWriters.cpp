#include "linux/media/LinuxContainerWriters.h"

#include <algorithm>
#include <iterator>
#include <utility>

#include "linux/media/LinuxContainerWriter.h"

namespace lumacast {

namespace {

/// How often a movie that is being closed is looked at.
constexpr std::chrono::milliseconds kClosingLook{100};

std::string withSingleSlashes(const std::string& path) {
    std::string result;
    std::unique_copy(path.begin(), path.end(), std::back_inserter(result),
                     [](char a, char b) { return a == '/' && b == '/'; });
    return result;
}

}  // namespace

LinuxContainerWriters::LinuxContainerWriters(const Clock& clock)
    : LinuxContainerWriters(clock, std::make_shared<media::PosixMovieFiles>()) {}

LinuxContainerWriters::LinuxContainerWriters(const Clock& clock, std::shared_ptr<media::MovieFiles> files)
    : clock_(clock), files_(std::move(files)), choice_(std::make_shared<media::EncoderChoice>()) {
    // The library talks to the standard error output by itself, above all about hardware that is not there.
    av_log_set_level(AV_LOG_QUIET);
}

LinuxContainerWriters::~LinuxContainerWriters() {
    for (const auto& open : recordings_) open.recording->abandon();
}

std::variant<std::unique_ptr<ContainerWriter>, Error> LinuxContainerWriters::make(const URL& outputURL,
                                                                                  ContainerType) {
    forgetEnded();
    auto recording =
        std::make_shared<media::MovieRecording>(files_, outputURL.path(), clock_.captureClock(), choice_, lane_);
    {
        const std::lock_guard lock(mutex_);
        recordings_.push_back({withSingleSlashes(outputURL.path()), recording});
    }
    const std::optional<int> created = recording->waitForCreation(kCreationLimit);
    if (created && *created != 0) {
        recording->abandon();
        return media::systemError(*created);
    }
    return std::make_unique<LinuxContainerWriter>(std::move(recording), outputURL);
}

std::optional<std::uint64_t> LinuxContainerWriters::bytesBeingWritten(const std::string& path) {
    const std::lock_guard lock(mutex_);
    // The newest writer of a path is the one whose file is there.
    for (auto each = recordings_.rbegin(); each != recordings_.rend(); ++each)
        if (each->path == path && !each->recording->hasEnded()) return each->recording->bytesWritten();
    return std::nullopt;
}

LinuxContainerWriters::Recordings LinuxContainerWriters::openMovies() {
    const std::lock_guard lock(mutex_);
    return recordings_;
}

std::vector<media::ClosedMovie> LinuxContainerWriters::closeOpenMovies() {
    using Clock = std::chrono::steady_clock;
    const Recordings open = openMovies();
    std::vector<media::ClosedMovie> closed;
    for (const auto& each : open) {  // all at once, then wait for each
        if (auto movie = each.recording->requestFinish()) {
            movie->path = each.path;
            closed.push_back(std::move(*movie));
        }
    }
    const auto deadline = Clock::now() + kClosingLimit;
    const auto isOver = [&](const Open& each) {
        return each.recording->waitUntilFinished(std::min(Clock::now() + kClosingLook, deadline));
    };
    const auto progressOfAll = [&] {
        std::uint64_t sum = 0;
        for (const auto& each : open) sum += each.recording->progress();
        return sum;
    };
    std::uint64_t progress = progressOfAll();
    auto stalled = Clock::now() + kClosingStall;
    while (!std::all_of(open.begin(), open.end(), isOver)) {
        const auto now = Clock::now();
        const std::uint64_t before = std::exchange(progress, progressOfAll());
        if (progress != before) stalled = now + kClosingStall;
        if (now >= std::min(stalled, deadline)) break;
    }
    return closed;
}

bool LinuxContainerWriters::secureOpenMovies(std::chrono::milliseconds limit) {
    const auto deadline = std::chrono::steady_clock::now() + limit;
    const Recordings open = openMovies();
    std::vector<std::uint64_t> requests;
    for (const auto& each : open) requests.push_back(each.recording->requestSecuring());
    bool all = true;
    for (std::size_t i = 0; i < open.size(); ++i) all &= open[i].recording->waitUntilSecured(requests[i], deadline);
    return all;
}

/// Lets go of recordings whose threads only have to be joined, which takes no time.
void LinuxContainerWriters::forgetEnded() {
    Recordings ended;
    const std::lock_guard lock(mutex_);
    const auto isOpen = [](const Open& each) { return !each.recording->hasEnded(); };
    const auto first = std::stable_partition(recordings_.begin(), recordings_.end(), isOpen);
    ended.assign(std::make_move_iterator(first), std::make_move_iterator(recordings_.end()));
    recordings_.erase(first, recordings_.end());
}

}  // namespace lumacast
