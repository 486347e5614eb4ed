#pragma once
// What a frame lane captures now.

#include <cstdint>
#include <memory>
#include <vector>

#include "linux/display/Canvas.h"
#include "linux/display/CaptureTarget.h"
#include "linux/display/CloneSelection.h"
#include "linux/display/ScreenMirror.h"

namespace lumacast::x11 {

/// The windows of a selection that exist, each captured, or the screen; and the picture to show of them: the only
/// window's own, or a canvas with all of them, or the screen's. Belongs to the frame lane. Waits for the server.
class CaptureScene final {
public:
    /// The connection must outlive the scene. Pictures are taken this many nanoseconds apart.
    CaptureScene(X11Connection& connection, std::int64_t interval) : connection_(connection), interval_(interval) {}

    /// Captures what is wanted from now on; what is captured already stays as it is. False when nothing that is wanted
    /// exists; then there is nothing to show. `now` is the steady clock's, in nanoseconds.
    bool follow(const CloneSelection::Wanted& wanted, std::int64_t now);
    /// Takes note of an event. The picture may have to be refreshed then.
    void handle(const xcb_generic_event_t& event, std::int64_t now);
    /// The captured windows that were destroyed. They are to be taken out of what is wanted, and follow() is due.
    std::vector<ContextID> gone() const;
    bool anyGone() const;
    /// Those of the wanted windows that can't be captured: they don't exist, or have no pixels.
    std::vector<ContextID> missing(const CloneSelection::Wanted& wanted) const;

    /// The screen is wanted, but it is locked or dark.
    bool screenIsBlank() const { return mirror_ && mirror_->blank(); }

    /// What to read; none when there is nothing to show. Stays until the next change here.
    PictureSource* picture() const { return picture_; }

private:
    using Targets = std::vector<std::unique_ptr<CaptureTarget>>;
    void capture(Targets& into, xcb_window_t window);
    bool followScreen(std::int64_t now);
    void choosePicture();

    X11Connection& connection_;
    const std::int64_t interval_;
    std::unique_ptr<ScreenMirror> mirror_;
    Targets targets_;
    std::unique_ptr<Canvas> canvas_;  ///< of several windows; it borrows them
    PictureSource* picture_ = nullptr;
};

}  // namespace lumacast::x11
