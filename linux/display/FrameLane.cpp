#include "linux/display/FrameLane.h"

#include <pthread.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <ctime>

#include "linux/display/CaptureStatus.h"

namespace lumacast::x11 {
namespace {

// A picture that was overtaken while it was read is read again this often, so that it shows one moment.
constexpr int kReadings = 3;
// A source that stands longer gives the window and its planes back.
constexpr std::int64_t kReleaseAfter = 10'000'000'000;

std::int64_t steadyNow() {
    return std::chrono::duration_cast<std::chrono::nanoseconds>(std::chrono::steady_clock::now().time_since_epoch())
        .count();
}

}  // namespace

FrameLane::FrameLane(std::string display, CaptureLaneSetup setup)
    : display_(std::move(display)), setup_(std::move(setup)), pacer_(setup_.minimumInterval), outlet_(setup_) {
    setup_.selection->watch(wake_);
}

void FrameLane::quit() {
    setup_.control->quit();
    interrupt_.fire();
    wake_->signal();
}

void FrameLane::run() {
    pthread_setname_np(pthread_self(), "lc-frames");
    while (true) {
        // Only queued events: what the descriptor holds is announced by the poll.
        if (connection_) drainEvents(true);
        const Order order = setup_.control->order();
        if (order.quit) break;
        if (order.running) {
            stoppedSince_ = 0;
            work(order);
        } else if (stoppedSince_ == 0) {
            stoppedSince_ = steadyNow();
        }
        if (connection_) xcb_flush(connection_->get());
        sleep(nextDeadline(order));
    }
    release();
    finished_.store(true, std::memory_order_release);
}

// The last picture stays: a later start in the same recording begins with it.
void FrameLane::release() {
    shown_ = nullptr;
    scene_.reset();
    maker_.reset();
    connection_.reset();
    last_.source = 0;
}

std::int64_t FrameLane::nextDeadline(const Order& order) const {
    if (!order.running) return connection_ ? stoppedSince_ + kReleaseAfter : FramePacer::kNever;
    if (!shown_) return FramePacer::kNever;
    if (scene_->anyGone()) return 0;
    std::int64_t deadline = last_.picture ? pacer_.nextRepeat() : FramePacer::kNever;
    deadline = std::min(deadline, shown_->nextLook());
    if (shown_->readable() && shown_->repaintDeadline() != 0) deadline = std::min(deadline, shown_->repaintDeadline());
    return pictureIsDue() ? std::min(deadline, pacer_.nextChange()) : deadline;
}

bool FrameLane::pictureIsDue() const {
    if (shown_->needsRefresh()) return true;
    if (!shown_->readable()) return false;
    if (shown_->damaged()) return true;
    // When an application is late with its painting, that has to be seen to, news or not.
    if (shown_->repaintDeadline() != 0) return steadyNow() >= shown_->repaintDeadline();
    return pictureWanted_ || (maker_->follows(*shown_, maker_->turn()) && maker_->somethingNew());
}

void FrameLane::sleep(std::int64_t deadline) {
    const std::int64_t now = steadyNow();
    if (stoppedSince_ != 0 && connection_ && now >= stoppedSince_ + kReleaseAfter) return release();
    timespec limit{};
    if (deadline > now && deadline != FramePacer::kNever) {
        limit.tv_sec = (deadline - now) / 1'000'000'000;
        limit.tv_nsec = (deadline - now) % 1'000'000'000;
    }
    std::array<pollfd, 2> polled{{{wake_->descriptor(), POLLIN, 0}, {-1, POLLIN, 0}}};
    if (connection_) polled[1].fd = connection_->descriptor();
    ::ppoll(polled.data(), polled.size(), deadline == FramePacer::kNever ? nullptr : &limit, nullptr);
    if (polled[0].revents != 0) wake_->clear();
    if (polled[1].revents != 0) drainEvents(false);
    // Between recordings nobody is to be told; the next start connects anew.
    if (connection_ && connection_->broken() && stoppedSince_ != 0) {
        forgetWindows();
        release();
    }
}

// The display has gone, and its windows with it; not so when it is this lane that is to end and whose connection was
// cut for that: other lanes go on with the selection.
void FrameLane::forgetWindows() {
    if (!setup_.control->order().quit) setup_.selection->forgetAll();
}

bool FrameLane::drainEvents(bool onlyQueued) {
    bool any = false;
    while (true) {
        xcb_connection_t* const x = connection_->get();
        const Owned<xcb_generic_event_t> event(onlyQueued ? xcb_poll_for_queued_event(x) : xcb_poll_for_event(x));
        if (!event) return any;
        any = true;
        scene_->handle(*event, steadyNow());
    }
}

void FrameLane::work(const Order& order) {
    if (order.run != run_ && !beginRun(order)) return;
    if (connection_->broken()) return displayIsLost(order);
    if (selectionVersion_ != setup_.selection->version() && !followSelection(order)) return;
    if (scene_->anyGone() && !followSelection(order)) return;
    if (!shown_) return;
    if (steadyNow() >= shown_->nextLook()) shown_->look(steadyNow());
    if (screenIsTaken(order)) return;
    if (pictureIsDue() && steadyNow() >= pacer_.nextChange()) takePicture(order);
    if (last_.picture && steadyNow() >= pacer_.nextRepeat())
        repeatPicture(order, order.clock->now(), CaptureControl::Stamp::Fresh);
}

bool FrameLane::beginRun(const Order& order) {
    if (!connection_ || connection_->broken()) {
        release();
        if (!connect(order)) return false;
    }
    run_ = order.run;
    if (last_.picture && last_.clock == order.clock)
        repeatPicture(order, last_.stamp, CaptureControl::Stamp::Kept);
    else
        last_ = {};
    if (!last_.picture) maker_->startOver();
    pacer_.restart();
    pictureWanted_ = true;
    return followSelection(order);
}

bool FrameLane::connect(const Order& order) {
    connection_ = X11Connection::open(display_, interrupt_);
    if (!connection_) return fail(order, CaptureStatus::kNoDisplay), false;
    if (!connection_->canCapture()) return fail(order, CaptureStatus::kNotSupported), false;
    scene_ = std::make_unique<CaptureScene>(*connection_, pacer_.interval());
    makeMaker();
    return true;
}

// Frames of the screen and of windows may have different sizes.
void FrameLane::makeMaker() {
    const auto [width, height] = setup_.frameSize(mirrors_);
    if (maker_ && maker_->makes(width, height)) return;
    maker_ = std::make_unique<PictureMaker>(*connection_, width, height);
    last_.source = 0;
    pictureWanted_ = true;
}

bool FrameLane::followSelection(const Order& order) {
    for (const ContextID context : scene_->gone()) setup_.selection->forget(context);
    const auto wanted = setup_.selection->wanted();
    selectionVersion_ = wanted.version;
    const std::uint32_t before = shown_ ? shown_->id() : 0;
    mirrors_ = wanted.mode == DisplayCloneControl::kMirrorDisplay;
    const bool any = scene_->follow(wanted, steadyNow());
    shown_ = scene_->picture();
    if (connection_->broken()) return displayIsLost(order), false;
    if (wanted.mode == DisplayCloneControl::kCloneContexts)
        for (const ContextID context : scene_->missing(wanted)) setup_.selection->forget(context);
    if (!any) return fail(order, CaptureStatus::kWindowGone), false;
    if (shown_ && shown_->id() != before) pictureWanted_ = true;
    if (shown_) makeMaker();
    drainEvents(true);
    return !screenIsTaken(order);
}

// A screen that is locked or dark belongs to somebody else.
bool FrameLane::screenIsTaken(const Order& order) {
    if (!scene_->screenIsBlank()) return false;
    end(order, [](auto& delegate, auto& source) { delegate.screenCaptureControllerWasPreempted(source); });
    return true;
}

// The recording's first picture decides: a movie has one orientation.
Turn FrameLane::turnOf(const Order& order) {
    if (!mirrors_) return Turn::None;
    if (turnedFor_ != order.clock) {
        turnedFor_ = order.clock;
        turn_ = shown_->width() > shown_->height() ? Turn::Counterclockwise : Turn::None;
    }
    return turn_;
}

// Whether the last picture is what was read of the source as it is laid out now, pixel by pixel.
bool FrameLane::lastIsAsRead() const {
    return last_.picture && last_.source == shown_->id() && last_.layout == shown_->layout() && maker_->isDirect(*last_.picture->plane());
}

// Whether the picture can be read now; what has changed in it is noted.
bool FrameLane::lookAtPicture(const Order& order) {
    if (shown_->needsRefresh()) {
        const bool wasShown = lastIsAsRead();
        shown_->refresh();
        drainEvents(true);
        // Of another size it has nothing for what the window has gained.
        const bool fits = wasShown && last_.picture->width() == shown_->width() && last_.picture->height() == shown_->height();
        shown_->restore(fits ? &last_.picture->plane()->memory() : nullptr);
    }
    if (!shown_->readable()) return false;
    const Turn turn = turnOf(order);
    if (!maker_->follows(*shown_, turn)) maker_->follow(*shown_, turn);
    DamageRegion damage;
    if (shown_->damaged()) shown_->takeDamage(damage);
    maker_->add(damage);
    if (shown_->repaintDeadline() == 0) return true;
    const std::int64_t now = steadyNow();
    if (now >= shown_->repaintDeadline()) shown_->repaintIsLate(now);
    return shown_->repaintDeadline() == 0;
}

void FrameLane::takePicture(const Order& order) {
    const MediaTime stamp = order.clock->now();
    std::optional<std::size_t> plane;
    for (int reading = 0; reading < kReadings; ++reading) {
        const bool hadNews = shown_->damaged() || shown_->needsRefresh();
        if (!lookAtPicture(order)) return;
        if (!maker_->somethingNew() && !pictureWanted_) return;
        if (!plane) plane = maker_->acquire();
        if (!plane) return dropPicture(hadNews);
        if (!maker_->update(*plane, *shown_)) return pacer_.taken(steadyNow());
        drainEvents(true);
        if (!shown_->overtaken() && !shown_->needsRefresh()) break;
    }
    if (shown_->spoilt()) {
        pictureWanted_ = true;
        return pacer_.taken(steadyNow());
    }
    // What a locked screen shows is nobody's business; the next look ends the run.
    if (scene_->screenIsBlank()) return;
    Delivered taken{maker_->picture(*plane, ++pictures_), stamp, order.clock, transformFlagsOf(maker_->turn()),
                    shown_->id(), shown_->layout()};
    if (!deliver(order, std::move(taken), CaptureControl::Stamp::Fresh)) return;
    maker_->delivered();
    maker_->tidy(steadyNow());
    pictureWanted_ = false;
}

// Every plane is in use. What changed is shown with the next picture: it stays wanted.
void FrameLane::dropPicture(bool hadNews) {
    if (hadNews) setup_.control->countDropped(1);
    pacer_.taken(steadyNow());
    pictureWanted_ = true;
}

void FrameLane::repeatPicture(const Order& order, MediaTime stamp, CaptureControl::Stamp kind) {
    Delivered again = last_;
    again.picture = std::make_shared<Picture>(last_.picture->plane(), DamageRegion{}, ++pictures_);
    again.stamp = stamp;
    again.clock = order.clock;
    deliver(order, std::move(again), kind);
}

// False when the order has changed meanwhile.
bool FrameLane::deliver(const Order& order, Delivered what, CaptureControl::Stamp kind) {
    const std::int64_t began = steadyNow();
    pacer_.taken(began);
    const auto outcome = outlet_.deliver(order, what.picture, what.stamp, kind, what.transformFlags);
    if (outcome != FrameOutlet::Outcome::Delivered) return outcome == FrameOutlet::Outcome::ToNobody;
    last_ = std::move(what);

    drainEvents(false);
    const std::int64_t took = steadyNow() - began;
    if (shown_ && shown_->damaged() && took > pacer_.interval())
        setup_.control->countDropped(static_cast<std::uint64_t>(took / pacer_.interval()));
    return true;
}

void FrameLane::fail(const Order& order, std::int32_t status) {
    end(order, failure(status));
}

void FrameLane::displayIsLost(const Order& order) {
    forgetWindows();
    if (!mirrors_) return fail(order, CaptureStatus::kDisplayLost);
    end(order, [](auto& delegate, auto& source) { delegate.screenCaptureControllerMediaServicesWereReset(source); });
}

// The run is over, and its delegate is told why.
void FrameLane::end(const Order& order, Telling telling) {
    release();
    outlet_.end(order, std::move(telling));
}

}  // namespace lumacast::x11
