#pragma once
// The thread of one capture source: what every one is given, and what it can be told.

#include <cstdint>
#include <memory>
#include <utility>

#include "linux/display/CaptureControl.h"
#include "linux/display/CloneSelection.h"
#include "platform/DisplayCapture.h"
#include "platform/Scheduler.h"

namespace lumacast::x11 {

/// What a lane captures, and for whom. Of the screen frames are always portrait: the shorter side is their width.
struct CaptureLaneSetup {
    std::int32_t width = 0, height = 0;
    MediaTime minimumInterval;
    std::shared_ptr<CaptureControl> control;
    std::shared_ptr<CloneSelection> selection;
    std::weak_ptr<DisplayCaptureSource> source;
    Scheduler* scheduler = nullptr;  ///< borrowed; for failures, which go to the main queue

    /// Width and height of the frames of the screen, or of windows.
    std::pair<std::int32_t, std::int32_t> frameSize(bool ofScreen) const {
        return ofScreen && width > height ? std::pair(height, width) : std::pair(width, height);
    }
};

/// The thread of one capture source, which captures while the source's control says so and sleeps otherwise.
class CaptureLane {
public:
    virtual ~CaptureLane() = default;
    /// The thread's body: returns after quit().
    virtual void run() = 0;
    virtual bool finished() const = 0;
    /// Callable from any thread, returns at once: there is a new order.
    virtual void wake() = 0;
    /// Callable from any thread, returns at once; ends whatever the lane waits for too.
    virtual void quit() = 0;
};

}  // namespace lumacast::x11
