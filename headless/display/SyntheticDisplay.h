#pragma once
#include <memory>
#include <set>

#include "headless/Show.h"
#include "linux/display/CloneSelection.h"
#include "linux/display/LaneKeeper.h"
#include "platform/Clock.h"
#include "platform/DisplayCapture.h"
#include "platform/Scheduler.h"

namespace lumacast::headless {

/// A display that shows a show on everything: on the screen and in every window there is (SyntheticWindows). Makes
/// sources and chooses what they show. Outlives its sources' last start; its end joins their lanes and must not come on
/// one.
class SyntheticDisplay final : public DisplayCapture, public DisplayCloneControl {
public:
    /// Clock and scheduler are borrowed.
    SyntheticDisplay(const Show& show, Clock& clock, Scheduler& scheduler)
        : show_(show), clock_(clock), scheduler_(scheduler) {}

    std::shared_ptr<DisplayCaptureSource> makeSource(Size captureSize, MediaTime minimumInterval) override;
    void setMirroringMode(int mode) override { selection_->setMode(mode); }
    void setContexts(const std::set<ContextID>& contexts) override { selection_->setContexts(contexts); }

private:
    const Show show_;
    Clock& clock_;
    Scheduler& scheduler_;
    const std::shared_ptr<x11::CloneSelection> selection_ = std::make_shared<x11::CloneSelection>();
    const std::shared_ptr<x11::LaneKeeper> keeper_ = std::make_shared<x11::LaneKeeper>();
};

}  // namespace lumacast::headless
