#pragma once
// The display capture roles on an X11 server.

#include <memory>
#include <string>

#include "linux/display/CloneSelection.h"
#include "linux/display/LaneKeeper.h"
#include "platform/Clock.h"
#include "platform/DisplayCapture.h"
#include "platform/Scheduler.h"

namespace lumacast {

/// Makes sources and chooses what they show. Outlives its sources' last start; its end joins their lanes and must not
/// come on one.
class X11DisplayCapture final : public DisplayCapture, public DisplayCloneControl {
public:
    /// `display` as in $DISPLAY; it need not exist yet. Clock and scheduler are borrowed.
    X11DisplayCapture(std::string display, Clock& clock, Scheduler& scheduler);

    std::shared_ptr<DisplayCaptureSource> makeSource(Size captureSize, MediaTime minimumInterval) override;
    void setMirroringMode(int mode) override { selection_->setMode(mode); }
    void setContexts(const std::set<ContextID>& contexts) override { selection_->setContexts(contexts); }

private:
    const std::string display_;
    Clock& clock_;
    Scheduler& scheduler_;
    const std::shared_ptr<x11::CloneSelection> selection_ = std::make_shared<x11::CloneSelection>();
    const std::shared_ptr<x11::LaneKeeper> keeper_ = std::make_shared<x11::LaneKeeper>();
};

}  // namespace lumacast
