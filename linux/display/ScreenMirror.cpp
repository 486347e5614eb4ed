#include "linux/display/ScreenMirror.h"

#include <algorithm>
#include <utility>

namespace lumacast::x11 {

std::unique_ptr<ScreenMirror> ScreenMirror::open(X11Connection& connection, std::int64_t interval) {
    auto screen = CaptureTarget::open(connection, connection.screen().root, CaptureTarget::Kind::Screen);
    if (!screen) return nullptr;
    return std::unique_ptr<ScreenMirror>(new ScreenMirror(connection, std::move(screen), interval));
}

ScreenMirror::ScreenMirror(X11Connection& connection, std::unique_ptr<CaptureTarget> screen, std::int64_t interval)
    : screen_(std::move(screen)), pointer_(connection), blank_(connection), interval_(interval) {}

void ScreenMirror::handle(const xcb_generic_event_t& event, std::int64_t now) {
    screen_->handle(event, now);
    pointer_.handle(event);
    blank_.handle(event);
}

std::int64_t ScreenMirror::nextLook() const {
    return std::min(nextPointerLook_, blank_.nextLook());
}

void ScreenMirror::look(std::int64_t now) {
    if (now >= blank_.nextLook()) blank_.look(now);
    if (now < nextPointerLook_) return;
    if (!std::exchange(pictureCameAlong_, false)) pointer_.look();
    if (std::exchange(moved_, false) || pointer_.changed()) pointerMoved_ = now;
    const bool rests = now - pointerMoved_ >= kRest;
    nextPointerLook_ = now + (rests ? std::max(interval_, kRestInterval) : interval_);
}

// The pointer that goes with this picture is the one of now.
void ScreenMirror::takeDamage(DamageRegion& into) {
    if (screen_->damaged()) {
        screen_->takeDamage(into);
        pictureCameAlong_ = true;
    }
    pointer_.look();
    moved_ |= pointer_.changed();
    pointer_.take(into);
}

}  // namespace lumacast::x11
