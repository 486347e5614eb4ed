#include "extensions/live-push/Sender.h"

#include <algorithm>
#include <cstdio>
#include <utility>

namespace lumacast::extensions {

namespace {

/// About four seconds of a stream of the usual bit rate, twice that at most.
std::size_t mostBytesOf(const PushSettings& settings) {
    return static_cast<std::size_t>(settings.bitRate / 8 * 6);
}

}  // namespace

Sender::Sender(PushSettings settings, Timing timing, std::function<void(const Report&)> report,
               std::function<void()> wantsKeyFrame)
    : settings_(std::move(settings)),
      timing_(timing),
      report_(std::move(report)),
      wantsKeyFrame_(std::move(wantsKeyFrame)),
      queue_(mostBytesOf(settings_)),
      delay_(timing_.firstDelay),
      thread_([this] { run(); }) {}

Sender::~Sender() {
    {
        const std::lock_guard lock(mutex_);
        isEnding_ = isGivenUp_ = true;
        changed_.notify_all();
    }
    thread_.join();
}

void Sender::setTracks(StreamTracks tracks) {
    const std::lock_guard lock(mutex_);
    tracks_ = std::move(tracks);
}

void Sender::send(OutgoingPacket packet) {
    bool needsKeyFrame = false;
    {
        const std::lock_guard lock(mutex_);
        if (isEnding_) return;
        leftOut_ += queue_.push(std::move(packet));
        needsKeyFrame = queue_.needsKeyFrame();
        changed_.notify_all();
    }
    if (needsKeyFrame) wantsKeyFrame_();
}

void Sender::countLeftOut(std::uint64_t pictures) {
    const std::lock_guard lock(mutex_);
    leftOut_ += pictures;
}

void Sender::finish(std::chrono::milliseconds limit) {
    std::unique_lock lock(mutex_);
    isEnding_ = true;
    changed_.notify_all();
    if (!changed_.wait_for(lock, limit, [this] { return isDone_; })) isGivenUp_ = true;
    changed_.notify_all();
}

bool Sender::isGivenUp() const {
    const std::lock_guard lock(mutex_);
    return isGivenUp_;
}

void Sender::run() {
    lastLive_ = lastReport_ = Clock::now();
    tell(SenderState::Connecting);
    for (;;) {
        {
            std::unique_lock lock(mutex_);
            changed_.wait(lock, [this] { return isEnding_ || (tracks_ && !queue_.empty()); });
            if (isGivenUp_ || queue_.empty()) break;
        }
        std::unique_ptr<MediaOutput> output;
        if (connect(output)) sendUntilFailure(*output);
        output = nullptr;  // the end of the stream is sent here
        if (!waitToTryAgain()) break;
    }
    if (now_.state != SenderState::GivenUp) tell(SenderState::Ended);
    const std::lock_guard lock(mutex_);
    isDone_ = true;
    changed_.notify_all();
}

bool Sender::connect(std::unique_ptr<MediaOutput>& output) {
    output = std::make_unique<MediaOutput>(timing_.patience, [this] { return isGivenUp(); });
    now_.lastFailure = output->open(settings_.url, settings_.formatName(), *tracks_);
    if (!now_.lastFailure.empty()) {
        std::fprintf(stderr, "live-push: not connected: %s\n", now_.lastFailure.c_str());
        return false;
    }
    delay_ = timing_.firstDelay;
    bool needsKeyFrame = false;
    {
        const std::lock_guard lock(mutex_);
        leftOut_ += queue_.keepFromLatestKeyFrame();
        needsKeyFrame = queue_.needsKeyFrame();
    }
    if (needsKeyFrame) wantsKeyFrame_();
    tell(SenderState::Live);
    return true;
}

void Sender::sendUntilFailure(MediaOutput& output) {
    for (;;) {
        OutgoingPacket next;
        {
            std::unique_lock lock(mutex_);
            changed_.wait_for(lock, timing_.betweenReports, [this] { return isEnding_ || !queue_.empty(); });
            if (isGivenUp_ || (isEnding_ && queue_.empty())) return;
            if (!queue_.empty()) next = queue_.pop();
        }
        if (next.packet) {
            now_.lastFailure = output.write(*next.packet, next.isVideo);
            if (!now_.lastFailure.empty()) {
                std::fprintf(stderr, "live-push: the connection is lost: %s\n", now_.lastFailure.c_str());
                return;
            }
            bytesSinceReport_ += static_cast<std::uint64_t>(next.packet->size);
            if (next.isVideo) ++now_.pictures;
        }
        lastLive_ = Clock::now();
        tellIfDue();
    }
}

/// False when there is nothing to try again for.
bool Sender::waitToTryAgain() {
    {
        std::unique_lock lock(mutex_);
        if (isGivenUp_ || (isEnding_ && queue_.empty())) return false;
    }
    if (Clock::now() - lastLive_ >= settings_.giveUpAfter) {
        tell(SenderState::GivenUp);
        return false;
    }
    if (now_.state == SenderState::Live) {
        ++now_.reconnects;
        tell(SenderState::Reconnecting);
    }
    tellIfDue();
    std::unique_lock lock(mutex_);
    changed_.wait_for(lock, delay_, [this] { return isGivenUp_; });
    delay_ = std::min(delay_ * 2, timing_.longestDelay);
    return !isGivenUp_;
}

void Sender::tell(SenderState state) {
    const auto now = Clock::now();
    const double seconds = std::max(0.001, std::chrono::duration<double>(now - lastReport_).count());
    lastReport_ = now;
    now_.state = state;
    now_.bitRate = static_cast<std::int64_t>(static_cast<double>(std::exchange(bytesSinceReport_, 0)) * 8 / seconds);
    {
        const std::lock_guard lock(mutex_);
        now_.leftOut = leftOut_;
    }
    report_(now_);
}

void Sender::tellIfDue() {
    if (Clock::now() - lastReport_ >= timing_.betweenReports) tell(now_.state);
}

}  // namespace lumacast::extensions
