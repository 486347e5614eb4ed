#include "headless/display/SyntheticLane.h"

#include <poll.h>
#include <pthread.h>

#include <algorithm>
#include <ctime>
#include <utility>

#include "headless/display/SyntheticWindows.h"
#include "linux/display/CaptureStatus.h"
#include "linux/system/LinuxClock.h"

namespace lumacast::headless {

namespace {

constexpr std::int64_t kNever = x11::FramePacer::kNever;
/// What a late lane makes up for.
constexpr std::int64_t kMostLate = Show::kPicturesPerSecond;

}  // namespace

SyntheticLane::SyntheticLane(const Show& show, x11::CaptureLaneSetup setup)
    : show_(show), setup_(std::move(setup)), pacer_(setup_.minimumInterval), outlet_(setup_) {
    setup_.selection->watch(wake_);
}

void SyntheticLane::quit() {
    setup_.control->quit();
    wake_->signal();
}

void SyntheticLane::run() {
    pthread_setname_np(pthread_self(), "lc-frames");
    while (true) {
        const Order order = setup_.control->order();
        if (order.quit) break;
        sleep(order.running ? work(order) : kNever);
    }
    finished_.store(true, std::memory_order_release);
}

void SyntheticLane::sleep(std::int64_t deadline) {
    const std::int64_t left = std::max<std::int64_t>(0, deadline - LinuxClock::currentHostTime().nanoseconds);
    const timespec limit{left / 1'000'000'000, left % 1'000'000'000};
    pollfd polled{wake_->descriptor(), POLLIN, 0};
    ::ppoll(&polled, 1, deadline == kNever ? nullptr : &limit, nullptr);
    if (polled.revents != 0) wake_->clear();
}

/// Answers when there is more to do.
std::int64_t SyntheticLane::work(const Order& order) {
    if (order.run != run_ && !beginRun(order)) return kNever;
    if (wanted_.version != setup_.selection->version() && !followSelection(order)) return kNever;
    if (std::any_of(owners_.begin(), owners_.end(), [](const auto& owner) { return owner.hasEnded(); }) &&
        !followSelection(order))
        return kNever;
    return colours_.empty() ? kNever : takePictures(order);
}

bool SyntheticLane::beginRun(const Order& order) {
    run_ = order.run;
    isFirst_ = true;
    if (last_.picture && last_.clock == order.clock) {
        Delivered again = last_;
        again.picture = std::make_shared<SyntheticPicture>(last_.picture->memory(), SyntheticPicture::Differs::Nowhere,
                                                           ++pictures_);
        deliver(order, std::move(again), Stamp::Kept);
    } else {
        last_ = {};
    }
    pacer_.restart();
    next_ = show_.pictureAt(LinuxClock::currentHostTime());
    return followSelection(order);
}

bool SyntheticLane::followSelection(const Order& order) {
    wanted_ = setup_.selection->wanted();
    owners_.clear();
    colours_.clear();
    if (wanted_.mode == DisplayCloneControl::kMirrorDisplay) colours_.push_back(kScreenColour);
    if (wanted_.mode == DisplayCloneControl::kCloneContexts) {
        for (const ContextID window : wanted_.contexts) {
            const auto owner = ownerOf(window);
            auto process = owner ? HeldProcess::hold(*owner) : std::nullopt;
            if (!process) {
                setup_.selection->forget(window);
                continue;
            }
            owners_.push_back(std::move(*process));
            colours_.push_back(colourOf(window));
        }
        if (colours_.empty()) return outlet_.end(order, x11::failure(CaptureStatus::kWindowGone)), false;
    }
    makePainter();
    return true;
}

/// Frames of the screen are portrait, of windows as they were asked for.
void SyntheticLane::makePainter() {
    const bool isScreen = wanted_.mode == DisplayCloneControl::kMirrorDisplay;
    const auto turn = isScreen ? x11::Turn::Counterclockwise : x11::Turn::None;
    if (painter_ && turn == turn_) return;
    const auto [width, height] = setup_.frameSize(isScreen);
    turn_ = turn;
    planes_ = std::make_unique<PlaneStore>(width, height);
    painter_.emplace(width, height, turn);
}

std::int64_t SyntheticLane::takePictures(const Order& order) {
    const std::int64_t current = show_.pictureAt(LinuxClock::currentHostTime());
    if (current - next_ > kMostLate) {
        setup_.control->countDropped(static_cast<std::uint64_t>(current - next_ - kMostLate));
        next_ = current - kMostLate;
    }
    for (; next_ <= current; ++next_) {
        const std::int64_t begin = show_.beginOf(next_).nanoseconds;
        if (begin < pacer_.nextChange()) continue;
        if (!takePicture(order, next_)) break;
        pacer_.taken(begin);
    }
    return show_.beginOf(next_).nanoseconds;
}

/// The moment at which the picture began, but of the first one of a run, which was there before the run.
MediaTime SyntheticLane::stampOf(const Order& order, std::int64_t picture) const {
    const auto begin = isFirst_ ? std::nullopt : order.clock->at(show_.beginOf(picture));
    const bool isLater = begin && last_.picture && compare(*begin, last_.stamp) > 0;
    return isLater ? *begin : order.clock->now();
}

/// False when the order has changed meanwhile.
bool SyntheticLane::takePicture(const Order& order, std::int64_t picture) {
    const MediaTime stamp = stampOf(order, picture);
    auto memory = planes_->acquire();
    if (!memory) {
        setup_.control->countDropped(1);
        return true;
    }
    painter_->paint(*memory, picture, colours_);
    auto shown =
        std::make_shared<SyntheticPicture>(std::move(memory), SyntheticPicture::Differs::Everywhere, ++pictures_);
    if (!deliver(order, {std::move(shown), stamp, order.clock, transformFlagsOf(turn_)}, Stamp::Fresh)) return false;
    isFirst_ = false;
    return true;
}

bool SyntheticLane::deliver(const Order& order, Delivered what, Stamp kind) {
    const auto outcome = outlet_.deliver(order, what.picture, what.stamp, kind, what.transformFlags);
    if (outcome != x11::FrameOutlet::Outcome::Delivered) return outcome == x11::FrameOutlet::Outcome::ToNobody;
    last_ = std::move(what);
    return true;
}

}  // namespace lumacast::headless
