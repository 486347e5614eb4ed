#include "linux/display/CaptureScene.h"

#include <algorithm>
#include <utility>

namespace lumacast::x11 {

void CaptureScene::capture(Targets& into, xcb_window_t window) {
    const auto known = std::find_if(targets_.begin(), targets_.end(), [&](const auto& target) {
        return target && target->window() == window && !target->gone();
    });
    auto target = known != targets_.end() ? std::move(*known)
                                          : CaptureTarget::open(connection_, window, CaptureTarget::Kind::Window);
    if (target) into.push_back(std::move(target));
}

bool CaptureScene::follow(const CloneSelection::Wanted& wanted, std::int64_t now) {
    const bool screen = wanted.mode == DisplayCloneControl::kMirrorDisplay;
    // It selects the root's events, and so does a canvas: only one of them at a time.
    if (!screen) mirror_.reset();
    Targets next;
    if (wanted.mode == DisplayCloneControl::kCloneContexts)
        for (const ContextID context : wanted.contexts) {
            const xcb_window_t window = number(context);
            if (window != 0 && !connection_.isRoot(window)) capture(next, window);
        }
    std::swap(targets_, next);
    choosePicture();
    if (screen) return followScreen(now);
    // Off: nothing to show, for now.
    return !targets_.empty() || wanted.mode != DisplayCloneControl::kCloneContexts;
}

bool CaptureScene::followScreen(std::int64_t now) {
    if (!mirror_) mirror_ = ScreenMirror::open(connection_, interval_);
    if (!mirror_) return false;
    mirror_->lookWhetherBlank(now);
    picture_ = mirror_.get();
    return true;
}

void CaptureScene::choosePicture() {
    std::vector<CaptureTarget*> shown;
    for (const auto& target : targets_) {
        target->allowScreen(targets_.size() == 1);
        shown.push_back(target.get());
    }
    if (shown.size() > 1 && !canvas_) canvas_ = std::make_unique<Canvas>(connection_);
    // One that goes, too: it leaves the events of windows that are captured alone.
    if (canvas_) canvas_->show(std::move(shown));
    if (targets_.size() < 2) canvas_.reset();
    picture_ = canvas_ ? static_cast<PictureSource*>(canvas_.get()) : targets_.empty() ? nullptr : targets_[0].get();
}

void CaptureScene::handle(const xcb_generic_event_t& event, std::int64_t now) {
    for (const auto& target : targets_) target->handle(event, now);
    if (canvas_) canvas_->handle(event);
    if (mirror_) mirror_->handle(event, now);
}

bool CaptureScene::anyGone() const {
    return std::any_of(targets_.begin(), targets_.end(), [](const auto& target) { return target->gone(); });
}

std::vector<ContextID> CaptureScene::gone() const {
    std::vector<ContextID> gone;
    for (const auto& target : targets_)
        if (target->gone()) gone.push_back(ContextID{target->window()});
    return gone;
}

std::vector<ContextID> CaptureScene::missing(const CloneSelection::Wanted& wanted) const {
    std::vector<ContextID> missing;
    for (const ContextID context : wanted.contexts)
        if (std::none_of(targets_.begin(), targets_.end(),
                         [&](const auto& target) { return target->window() == number(context); }))
            missing.push_back(context);
    return missing;
}

}  // namespace lumacast::x11
