#include "extensions/hls-clips/Publisher.h"

#include <cstdio>
#include <utility>

#include "extensions/hls-clips/WatchPage.h"

namespace lumacast::extensions {

namespace {

constexpr int kAttempts = 3;
constexpr std::string_view kSegmentType = "video/mp4", kPlaylistType = "audio/mpegurl",
                           kPageType = "text/html; charset=utf-8";

}  // namespace

Publisher::Publisher(Options options,
                     const std::function<std::unique_ptr<Destination>(std::function<bool()>)>& makeDestination)
    : options_(std::move(options)), playlist_(options_.targetSeconds, options_.keep) {
    destination_ = makeDestination([this] {
        const std::lock_guard lock(mutex_);
        return isGivenUp_;
    });
    thread_ = std::thread([this] { run(); });
}

Publisher::~Publisher() {
    {
        const std::lock_guard lock(mutex_);
        isEnding_ = isGivenUp_ = true;
        changed_.notify_all();
    }
    thread_.join();
}

void Publisher::submit(Segment segment) {
    const std::lock_guard lock(mutex_);
    waiting_.push_back(std::move(segment));
    if (waiting_.size() > kMostWaiting) {
        waiting_.pop_front();
        waiting_.front().isDiscontinuous = true;
        ++state_.lost;
    }
    changed_.notify_all();
}

bool Publisher::finish(std::chrono::milliseconds limit) {
    std::unique_lock lock(mutex_);
    isEnding_ = true;
    changed_.notify_all();
    const bool isDone = changed_.wait_for(lock, limit, [this] { return isDone_; });
    if (!isDone) isGivenUp_ = true;
    changed_.notify_all();
    return isDone && state_.lost == 0;
}

Publisher::State Publisher::state() const {
    const std::lock_guard lock(mutex_);
    return state_;
}

void Publisher::run() {
    for (;;) {
        Segment segment;
        {
            std::unique_lock lock(mutex_);
            changed_.wait(lock, [this] { return isEnding_ || !waiting_.empty(); });
            if (isGivenUp_ || waiting_.empty()) break;
            segment = std::move(waiting_.front());
            waiting_.pop_front();
        }
        publish(std::move(segment));
    }
    playlist_.end();
    if (!playlist_.entries().empty()) putPlaylist(attempts());
    const std::lock_guard lock(mutex_);
    isDone_ = true;
    changed_.notify_all();
}

void Publisher::publish(Segment segment) {
    const std::string name = options_.streamName + "-" + std::to_string(++segments_) + ".m4s";
    const int tries = attempts();
    const bool isThere = putInit(segment.init, tries) && put(name, segment.media, kSegmentType, tries);
    {
        const std::lock_guard lock(mutex_);
        state_.isStalled = !isThere;
        ++(isThere ? state_.published : state_.lost);
    }
    if (!isThere) {
        isGap_ = true;
        return;
    }
    const bool isDiscontinuous = std::exchange(isGap_, false) || segment.isDiscontinuous;
    auto gone = playlist_.add({name, initName_, segment.ticks, isDiscontinuous});
    putPlaylist(tries);
    if (!hasPage_) hasPage_ = put(kPageName, Data(watchPage().begin(), watchPage().end()), kPageType, 1);
    removeExpired(std::move(gone));
}

bool Publisher::putInit(const Data& init, int attempts) {
    if (init == init_) return true;
    const std::string name = options_.streamName + "-init-" + std::to_string(inits_ + 1) + ".mp4";
    if (!put(name, init, kSegmentType, attempts)) return false;
    ++inits_;
    init_ = init;
    initName_ = name;
    return true;
}

void Publisher::putPlaylist(int attempts) {
    const std::string text = playlist_.text();
    put(kPlaylistName, Data(text.begin(), text.end()), kPlaylistType, attempts);
}

/// Players that have read an older playlist still fetch what it names: segments stay for as many more as it had.
void Publisher::removeExpired(std::vector<PlaylistEntry> gone) {
    for (PlaylistEntry& entry : gone) expired_.push_back(std::move(entry));
    for (; expired_.size() > options_.keep; expired_.pop_front()) destination_->remove(expired_.front().name);
}

bool Publisher::put(const std::string& name, const Data& contents, std::string_view type, int attempts) {
    for (int attempt = 1;; ++attempt) {
        const std::string error = destination_->put(name, contents, type);
        if (error.empty()) return true;
        std::fprintf(stderr, "hls-clips: %s: %s (attempt %d of %d)\n", name.c_str(), error.c_str(), attempt, attempts);
        std::unique_lock lock(mutex_);
        if (attempt >= attempts) return false;
        if (changed_.wait_for(lock, options_.betweenAttempts * attempt, [this] { return isGivenUp_; })) return false;
    }
}

int Publisher::attempts() const {
    const std::lock_guard lock(mutex_);
    return state_.isStalled ? 1 : kAttempts;
}

}  // namespace lumacast::extensions
